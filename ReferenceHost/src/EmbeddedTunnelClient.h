#pragma once

#include "HostTunnelClient.h"

#include <AlarmServer.h>

#include <QThreadPool>

#include <functional>

// Tunnel client that runs each command on a thread pool against an in-process server.
class EmbeddedTunnelClient : public HostTunnelClient
{
public:
    // Carries out one command; called on pool threads, concurrently.
    using CommandExecutor = std::function<AlarmServerSim::CommandReply(
        const QString& method, const QString& command, const QString& operatorName)>;

    explicit EmbeddedTunnelClient(CommandExecutor executor);
    ~EmbeddedTunnelClient() override;

    bool InsertRequest(const QString& pluginId, void* clientID, int requestKind,
                       const QString& method, InsertRequestInfo& info) override;
    bool waitForIdle(int timeoutMs) override;

private:
    CommandExecutor m_execute;
    QThreadPool m_pool;
};
