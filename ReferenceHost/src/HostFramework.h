#pragma once

#include <IFrameworkTools.h>

class EventHub;

// The services the host hands a plug-in at start-up: its tunnel client and an event sink that
// forwards every published record to an EventHub.
class HostFramework : public IFrameworkTools
{
public:
    HostFramework(IOrvoTunnelClient* tunnelClient, const EventHub& eventHub);

    IOrvoTunnelClient* GetTunnelClient() override { return m_tunnelClient; }
    HDLR_EVENT_SIGNAL_CB& GetEventSignalFunc() override { return m_eventSignal; }

private:
    IOrvoTunnelClient* m_tunnelClient;
    HDLR_EVENT_SIGNAL_CB m_eventSignal;
};
