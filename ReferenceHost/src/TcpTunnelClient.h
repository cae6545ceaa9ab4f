#pragma once

#include "HostTunnelClient.h"
#include "PendingWork.h"

#include <QThread>

#include <atomic>

class TcpTunnelConnection;

// Tunnel client that sends commands over one TCP connection to a separately running alarm
// server. The connection has a thread of its own, on which all reply callbacks run; replies
// are matched to requests by id. Once the connection is lost, requests are refused and pending
// ones are answered as failed.
class TcpTunnelClient : public HostTunnelClient
{
public:
    TcpTunnelClient();
    ~TcpTunnelClient() override;

    bool connectToServer(const QString& host, quint16 port, int timeoutMs, QString* errorMessage);

    bool InsertRequest(const QString& pluginId, void* clientID, int requestKind,
                       const QString& method, InsertRequestInfo& info) override;
    bool waitForIdle(int timeoutMs) override;
    QString connectionError() const override;

private:
    PendingWork m_pendingWork;
    std::atomic<bool> m_connected{false};
    QString m_address; // "host:port" once connected
    std::atomic<qint64> m_nextId{1};
    QThread m_thread;
    TcpTunnelConnection* m_connection;
};
