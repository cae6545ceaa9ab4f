#include "HostFramework.h"

#include "EventHub.h"

HostFramework::HostFramework(IOrvoTunnelClient* tunnelClient, const EventHub& eventHub)
    : m_tunnelClient(tunnelClient),
      m_eventSignal(
          [&eventHub](const PluginObjBase_EventSignalInfo* info) { eventHub.publish(info); })
{
}
