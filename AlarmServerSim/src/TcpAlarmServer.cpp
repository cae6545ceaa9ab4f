#include "TcpAlarmServer.h"

#include "AlarmServer.h"
#include "TcpFrame.h"

#include <QJsonObject>
#include <QTcpSocket>

namespace AlarmServerSim {

namespace {

const QString kMuteMethod = QStringLiteral("MuteAlarm");
const QString kStatusBadRequest = QStringLiteral("80000001");

// One client connection. Its requests run on the pool; the replies are written in request
// order. It deletes itself once the client is gone and no request of it is still running.
class TcpConnection : public QObject
{
    Q_OBJECT

public:
    TcpConnection(AlarmServer& server, QThreadPool& pool, QTcpSocket* socket, QObject* parent)
        : QObject(parent), m_server(server), m_pool(pool), m_socket(socket)
    {
        m_socket->setParent(this);
        connect(m_socket, &QTcpSocket::readyRead, this, &TcpConnection::readRequests);
        connect(m_socket, &QTcpSocket::disconnected, this, &TcpConnection::deleteWhenIdle);
    }

private:
    struct PendingReply
    {
        bool done = false;
        QJsonObject payload; // empty: the request gets no reply
    };

    void readRequests()
    {
        m_buffer += m_socket->readAll();
        QList<QJsonObject> requests;
        QString error;
        const bool valid = takeFrames(m_buffer, requests, &error);
        for (const QJsonObject& request : requests)
            start(request);
        if (!valid) {
            qWarning("alarm server: dropping a client: %s", qPrintable(error));
            m_socket->abort();
        }
    }

    void start(const QJsonObject& request)
    {
        const qint64 sequence = m_firstSequence + m_pending.size();
        m_pending.append(PendingReply());
        const QJsonValue id = request.value(QLatin1String("id"));
        const QJsonValue method = request.value(QLatin1String("method"));
        const QJsonValue command = request.value(QLatin1String("command"));
        const QString operatorName = request.value(QLatin1String("operator")).toString();
        if (!method.isString() || !command.isString()) {
            finish(sequence, {{QLatin1String("id"), id},
                              {QLatin1String("status"), kStatusBadRequest},
                              {QLatin1String("reply"), QString()}});
            return;
        }
        AlarmServer& server = m_server;
        m_pool.start([this, &server, sequence, id, method = method.toString(),
                      command = command.toString(), operatorName] {
            const CommandReply reply = server.execute(method, command, operatorName);
            QJsonObject payload;
            if (method != kMuteMethod)
                payload = {{QLatin1String("id"), id},
                           {QLatin1String("status"), reply.statusText},
                           {QLatin1String("reply"), reply.replyText}};
            // This connection stays alive while a request of it runs (deleteWhenIdle).
            QMetaObject::invokeMethod(
                this, [this, sequence, payload] { finish(sequence, payload); },
                Qt::QueuedConnection);
        });
    }

    void finish(qint64 sequence, const QJsonObject& payload)
    {
        PendingReply& pending = m_pending[sequence - m_firstSequence];
        pending.done = true;
        pending.payload = payload;
        while (!m_pending.isEmpty() && m_pending.first().done) {
            const QJsonObject next = m_pending.takeFirst().payload;
            ++m_firstSequence;
            if (!next.isEmpty() && m_socket->state() == QAbstractSocket::ConnectedState)
                m_socket->write(encodeFrame(next));
        }
        deleteWhenIdle();
    }

    void deleteWhenIdle()
    {
        if (m_pending.isEmpty() && m_socket->state() == QAbstractSocket::UnconnectedState)
            deleteLater();
    }

    AlarmServer& m_server;
    QThreadPool& m_pool;
    QTcpSocket* m_socket;
    QByteArray m_buffer;
    QList<PendingReply> m_pending; // oldest request first
    qint64 m_firstSequence = 0;    // sequence number of m_pending's first entry
};

} // namespace

TcpAlarmServer::TcpAlarmServer(AlarmServer& server, QObject* parent)
    : QTcpServer(parent), m_server(server)
{
}

TcpAlarmServer::~TcpAlarmServer()
{
    // Running commands refer to the connections, which go with this object.
    m_pool.waitForDone();
}

bool TcpAlarmServer::listenOnLoopback(quint16 port)
{
    return listen(QHostAddress::LocalHost, port);
}

void TcpAlarmServer::incomingConnection(qintptr socketDescriptor)
{
    auto* socket = new QTcpSocket;
    if (!socket->setSocketDescriptor(socketDescriptor)) {
        delete socket;
        return;
    }
    new TcpConnection(m_server, m_pool, socket, this);
}

} // namespace AlarmServerSim

#include "TcpAlarmServer.moc"
