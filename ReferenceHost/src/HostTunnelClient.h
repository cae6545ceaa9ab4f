#pragma once

#include <IOrvoTunnelClient.h>

#include <functional>

// A tunnel client of the reference host. Replies arrive on worker threads, never on the thread
// that inserted the request; destroying the client waits for the requests it accepted, so no
// reply callback runs after it is gone.
class HostTunnelClient : public IOrvoTunnelClient
{
public:
    // The operator behind a client handle, sent with each command so that the server records
    // who made a change; empty for a handle the host does not know.
    using OperatorLookup = std::function<QString(void* clientID)>;

    // Waits until every accepted request has been carried out and answered; false on timeout.
    virtual bool waitForIdle(int timeoutMs) = 0;
    // Why requests fail for want of a connection ("connection to 127.0.0.1:47800 lost"); empty
    // while requests can reach the server.
    virtual QString connectionError() const { return QString(); }

    // Set before the plug-in is started.
    void setOperatorLookup(OperatorLookup lookup) { m_operatorOf = std::move(lookup); }

protected:
    QString operatorOf(void* clientID) const
    {
        return m_operatorOf ? m_operatorOf(clientID) : QString();
    }

private:
    OperatorLookup m_operatorOf;
};
