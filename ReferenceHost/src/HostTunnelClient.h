#pragma once

#include <IOrvoTunnelClient.h>

// A tunnel client of the reference host. Replies arrive on worker threads, never on the thread
// that inserted the request; destroying the client waits for the requests it accepted, so no
// reply callback runs after it is gone.
class HostTunnelClient : public IOrvoTunnelClient
{
public:
    // Waits until every accepted request has been carried out and answered; false on timeout.
    virtual bool waitForIdle(int timeoutMs) = 0;
};
