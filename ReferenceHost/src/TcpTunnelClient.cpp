#include "TcpTunnelClient.h"

#include "TcpTunnelConnection.h"

TcpTunnelClient::TcpTunnelClient()
    : m_connection(new TcpTunnelConnection(m_pendingWork, m_connected))
{
    m_thread.setObjectName(QStringLiteral("TcpTunnelClient"));
    m_connection->moveToThread(&m_thread);
    m_thread.start();
}

TcpTunnelClient::~TcpTunnelClient()
{
    QMetaObject::invokeMethod(
        m_connection, [this] { m_connection->close(); }, Qt::BlockingQueuedConnection);
    m_thread.quit();
    m_thread.wait();
    delete m_connection;
}

bool TcpTunnelClient::connectToServer(const QString& host, quint16 port, int timeoutMs,
                                      QString* errorMessage)
{
    bool connected = false;
    QMetaObject::invokeMethod(
        m_connection,
        [&] { connected = m_connection->connectTo(host, port, timeoutMs, errorMessage); },
        Qt::BlockingQueuedConnection);
    if (connected)
        m_address = QStringLiteral("%1:%2").arg(host).arg(port);
    return connected;
}

bool TcpTunnelClient::InsertRequest(const QString& /*pluginId*/, void* clientID, int requestKind,
                                    const QString& method, InsertRequestInfo& info)
{
    const bool withReply = requestKind == RequestWithReply;
    if (!withReply && requestKind != RequestNoReply)
        return false;
    if ((withReply && !info.replyCallback) || !m_connected)
        return false;

    TcpTunnelConnection::Request request;
    request.id = m_nextId++;
    request.method = method;
    request.command = info.commandText;
    request.operatorName = operatorOf(clientID);
    request.relayPath = info.relayPath;
    request.timeoutMs = info.timeoutMs;
    if (withReply)
        request.callback = info.replyCallback;
    m_pendingWork.begin();
    QMetaObject::invokeMethod(
        m_connection, [this, request] { m_connection->send(request); }, Qt::QueuedConnection);
    return true;
}

bool TcpTunnelClient::waitForIdle(int timeoutMs)
{
    return m_pendingWork.waitForIdle(timeoutMs);
}

QString TcpTunnelClient::connectionError() const
{
    if (m_connected || m_address.isEmpty())
        return QString();
    return QStringLiteral("connection to %1 lost").arg(m_address);
}
