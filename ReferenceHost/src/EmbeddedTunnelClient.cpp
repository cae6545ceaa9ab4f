#include "EmbeddedTunnelClient.h"

EmbeddedTunnelClient::EmbeddedTunnelClient(CommandExecutor executor)
    : m_execute(std::move(executor))
{
}

EmbeddedTunnelClient::~EmbeddedTunnelClient()
{
    m_pool.waitForDone();
}

bool EmbeddedTunnelClient::InsertRequest(const QString& /*pluginId*/, void* clientID,
                                         int requestKind, const QString& method,
                                         InsertRequestInfo& info)
{
    const bool withReply = requestKind == RequestWithReply;
    if (!withReply && requestKind != RequestNoReply)
        return false;
    if (withReply && !info.replyCallback)
        return false;

    ReplyCallback callback = withReply ? info.replyCallback : ReplyCallback();
    m_pool.start([this, method, command = info.commandText, relayPath = info.relayPath,
                  operatorName = operatorOf(clientID), callback = std::move(callback)] {
        const AlarmServerSim::CommandReply reply = m_execute(method, command, operatorName);
        if (callback)
            callback(true, QString(), relayPath, reply.statusText, reply.replyText, true);
    });
    return true;
}

bool EmbeddedTunnelClient::waitForIdle(int timeoutMs)
{
    return m_pool.waitForDone(timeoutMs);
}
