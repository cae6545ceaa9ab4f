#include "TcpTunnelConnection.h"

#include "PendingWork.h"

#include <TcpFrame.h>

#include <QJsonObject>
#include <QTcpSocket>
#include <QTimer>

TcpTunnelConnection::TcpTunnelConnection(PendingWork& pendingWork, std::atomic<bool>& connected)
    : m_pendingWork(pendingWork), m_connected(connected)
{
}

bool TcpTunnelConnection::connectTo(const QString& host, quint16 port, int timeoutMs,
                                    QString* errorMessage)
{
    m_socket = new QTcpSocket(this);
    m_socket->connectToHost(host, port);
    if (!m_socket->waitForConnected(timeoutMs)) {
        *errorMessage = QStringLiteral("cannot reach the alarm server at %1:%2: %3")
                            .arg(host)
                            .arg(port)
                            .arg(m_socket->errorString());
        delete m_socket;
        m_socket = nullptr;
        return false;
    }
    connect(m_socket, &QTcpSocket::readyRead, this, &TcpTunnelConnection::readFrames);
    connect(m_socket, &QTcpSocket::disconnected, this,
            [this] { failAll(QStringLiteral("connection to the alarm server closed")); });
    connect(m_socket, &QTcpSocket::errorOccurred, this,
            [this] { failAll(m_socket->errorString()); });
    m_connected = true;
    return true;
}

void TcpTunnelConnection::send(const Request& request)
{
    if (!m_connected) {
        // The connection dropped between InsertRequest and now.
        if (request.callback)
            request.callback(false, QStringLiteral("not connected"), request.relayPath, QString(),
                             QString(), true);
        m_pendingWork.end();
        return;
    }
    QJsonObject payload{{QStringLiteral("id"), request.id},
                        {QStringLiteral("method"), request.method},
                        {QStringLiteral("command"), request.command}};
    if (!request.operatorName.isEmpty())
        payload.insert(QStringLiteral("operator"), request.operatorName);
    m_socket->write(AlarmServerSim::encodeFrame(payload));
    if (!request.callback) {
        m_socket->flush();
        m_pendingWork.end();
        return;
    }
    auto* timer = new QTimer(this);
    timer->setSingleShot(true);
    const qint64 id = request.id;
    connect(timer, &QTimer::timeout, this, [this, id] {
        answer(id, false, QStringLiteral("no reply in time"), QString(), QString());
    });
    timer->start(request.timeoutMs);
    m_pending.insert(id, Pending{request.relayPath, request.callback, timer});
}

void TcpTunnelConnection::readFrames()
{
    m_buffer += m_socket->readAll();
    QList<QJsonObject> frames;
    QString error;
    const bool intact = AlarmServerSim::takeFrames(m_buffer, frames, &error);
    for (const QJsonObject& frame : frames) {
        answer(frame.value(QLatin1String("id")).toInteger(), true, QString(),
               frame.value(QLatin1String("status")).toString(),
               frame.value(QLatin1String("reply")).toString());
    }
    if (!intact) {
        failAll(QStringLiteral("bad frame from the alarm server: %1").arg(error));
        m_socket->abort();
    }
}

void TcpTunnelConnection::answer(qint64 id, bool ok, const QString& info, const QString& status,
                                 const QString& reply)
{
    const auto it = m_pending.find(id);
    if (it == m_pending.end())
        return; // late reply to a request that already timed out
    const Pending pending = it.value();
    m_pending.erase(it);
    delete pending.timer;
    pending.callback(ok, info, pending.relayPath, status, reply, true);
    m_pendingWork.end();
}

void TcpTunnelConnection::failAll(const QString& reason)
{
    m_connected = false;
    const QList<qint64> ids = m_pending.keys();
    for (qint64 id : ids)
        answer(id, false, reason, QString(), QString());
}

void TcpTunnelConnection::close()
{
    if (!m_socket)
        return;
    failAll(QStringLiteral("connection to the alarm server closed"));
    m_socket->disconnect(this);
    if (m_socket->bytesToWrite() > 0)
        m_socket->waitForBytesWritten(1000);
    m_socket->disconnectFromHost();
    delete m_socket;
    m_socket = nullptr;
}
