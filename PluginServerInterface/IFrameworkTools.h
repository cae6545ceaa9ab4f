#pragma once

#include "PluginServerTypes.h"

class IOrvoTunnelClient;

// Services the host offers a plug-in at start-up.
class IFrameworkTools
{
public:
    virtual ~IFrameworkTools() = default;
    virtual IOrvoTunnelClient* GetTunnelClient() = 0;
    virtual HDLR_EVENT_SIGNAL_CB& GetEventSignalFunc() = 0;
};
