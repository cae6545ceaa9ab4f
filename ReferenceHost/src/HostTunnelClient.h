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
    // Why requests fail for want of a connection ("connection to 127.0.0.1:47800 lost"); empty
    // while requests can reach the server.
    virtual QString connectionError() const { return QString(); }
};
