#include "TcpAlarmServer.h"

#include "AlarmServer.h"
#include "SimLogging.h"
#include "TcpFrame.h"

#include <PluginAlarmSearchCommon.h>

#include <QJsonObject>
#include <QScopedValueRollback>
#include <QSemaphore>
#include <QTcpSocket>
#include <QtEndian>

#include <sys/resource.h>

namespace AlarmServerSim {

namespace {

const QString kStatusBadRequest = QStringLiteral("80000001");

// What the socket reads ahead of the requests taken; the kernel holds the rest.
constexpr qint64 kReadAhead = 64 * 1024;
constexpr int kFirstAcceptDelayMs = 50;
constexpr int kLongestAcceptDelayMs = 1000;

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
        m_socket->setReadBufferSize(kReadAhead);
        connect(m_socket, &QTcpSocket::readyRead, this, &TcpConnection::readRequests);
        connect(m_socket, &QTcpSocket::bytesWritten, this, &TcpConnection::readRequests);
        connect(m_socket, &QTcpSocket::disconnected, this, &TcpConnection::deleteWhenIdle);
    }

private:
    struct PendingReply
    {
        bool done = false;
        QJsonObject payload; // empty: the request gets no reply
    };

    // While requests run or replies wait unsent beyond the bounds, nothing more is taken.
    bool congested() const
    {
        return m_pending.size() >= TcpAlarmServer::MaxRequestsInProgress ||
               m_socket->bytesToWrite() > TcpAlarmServer::MaxUnsentBytes;
    }

    // Takes requests as long as the connection is not congested; what is left stays in the
    // socket, whose buffer holds at most kReadAhead bytes.
    void readRequests()
    {
        // A request answered at once finishes inside this loop, which goes on with the next.
        if (m_reading)
            return;
        const QScopedValueRollback<bool> reading(m_reading, true);
        for (;;) {
            while (!m_waiting.isEmpty() && !congested())
                start(m_waiting.takeFirst());
            if (!m_waiting.isEmpty() || congested() || m_socket->bytesAvailable() == 0)
                return;
            m_buffer += m_socket->readAll();
            QString error;
            if (!firstFrameFits(&error) || !takeFrames(m_buffer, m_waiting, &error)) {
                qCWarning(lcSim, "dropping a client: %s", qPrintable(error));
                m_waiting.clear();
                m_socket->abort();
                return;
            }
        }
    }

    // Whether the frame at the start of the buffer is no longer than a request may be.
    bool firstFrameFits(QString* error) const
    {
        if (m_buffer.size() < qsizetype(sizeof(quint32)))
            return true;
        const auto length = qFromBigEndian<quint32>(m_buffer.constData());
        if (length <= TcpAlarmServer::MaxRequestPayload)
            return true;
        *error = QStringLiteral("request of %1 bytes exceeds the limit").arg(length);
        return false;
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
            if (method != PluginAlarmSearchCommon::METHOD_MUTE_ALARM)
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
        if (m_socket->state() == QAbstractSocket::ConnectedState)
            readRequests();
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
    QList<QJsonObject> m_waiting; // requests read but not started, oldest first
    bool m_reading = false;
    QList<PendingReply> m_pending; // oldest request first
    qint64 m_firstSequence = 0;    // sequence number of m_pending's first entry
};

} // namespace

TcpAlarmServer::TcpAlarmServer(AlarmServer& server, QObject* parent)
    : QTcpServer(parent), m_server(server)
{
    // Every pool thread started now and kept: each blocks until all have started.
    m_pool.setExpiryTimeout(-1);
    const int threads = m_pool.maxThreadCount();
    QSemaphore started;
    QSemaphore proceed;
    for (int i = 0; i < threads; ++i)
        m_pool.start([&] {
            started.release();
            proceed.acquire();
        });
    started.acquire(threads);
    proceed.release(threads);
    m_pool.waitForDone();

    m_acceptRetry.setSingleShot(true);
    connect(&m_acceptRetry, &QTimer::timeout, this, &QTcpServer::resumeAccepting);
    connect(this, &QTcpServer::acceptError, this, &TcpAlarmServer::backOffAccepting);
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
    m_acceptDelayMs = 0;
    auto* socket = new QTcpSocket;
    if (!socket->setSocketDescriptor(socketDescriptor)) {
        delete socket;
        return;
    }
    if (m_connections >= connectionLimit()) {
        qCWarning(lcSim, "refusing a client: %d connections open", m_connections);
        socket->abort();
        delete socket;
        return;
    }
    ++m_connections;
    auto* connection = new TcpConnection(m_server, m_pool, socket, this);
    connect(connection, &QObject::destroyed, this, [this] { --m_connections; });
}

int TcpAlarmServer::connectionLimit() const
{
    rlimit files{};
    if (::getrlimit(RLIMIT_NOFILE, &files) != 0 || files.rlim_cur == RLIM_INFINITY)
        return m_maxConnections;
    return int(qBound<rlim_t>(0, files.rlim_cur - qMin<rlim_t>(files.rlim_cur, ReservedDescriptors),
                              rlim_t(m_maxConnections)));
}

// QTcpServer stops accepting on an error other than a passing one (such as running out of file
// descriptors); it tries again after a delay that doubles while the error persists.
void TcpAlarmServer::backOffAccepting(QAbstractSocket::SocketError error)
{
    m_acceptDelayMs = qBound(kFirstAcceptDelayMs, m_acceptDelayMs * 2, kLongestAcceptDelayMs);
    qCWarning(lcSim, "cannot accept a client (error %d), trying again in %d ms", int(error),
              m_acceptDelayMs);
    pauseAccepting();
    m_acceptRetry.start(m_acceptDelayMs);
}

} // namespace AlarmServerSim

#include "TcpAlarmServer.moc"
