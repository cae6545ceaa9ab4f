#include "GuardedTcpServer.h"

#include "ApiServer.h"
#include "ConsolePages.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QTcpSocket>
#include <QTimer>

namespace {

constexpr qsizetype kMaxHeadBytes = 16 * 1024;
constexpr int kRefusalLingerMs = 1000;

} // namespace

// Follows one connection's byte stream: request heads are collected and read, bodies skipped
// by their Content-Length. Stops at a WebSocket upgrade (the HTTP server then disconnects every
// reader of the socket anyway).
class RequestGuard : public QObject
{
public:
    RequestGuard(QTcpSocket* socket, qint64 maxBodyBytes)
        : QObject(socket), m_socket(socket), m_maxBodyBytes(maxBodyBytes)
    {
        connect(socket, &QTcpSocket::readyRead, this, &RequestGuard::inspect);
    }

    // Connected after the HTTP server's own reader: what it leaves is not new next time.
    void followHttpServer()
    {
        connect(m_socket, &QTcpSocket::readyRead, this,
                [this] { m_unread = m_socket->bytesAvailable(); });
    }

private:
    void inspect()
    {
        if (!m_socket->isOpen())
            return;
        if (m_refused) {
            m_socket->readAll();
            return;
        }
        const QByteArray fresh = m_socket->peek(m_socket->bytesAvailable()).mid(m_unread);
        qsizetype at = 0;
        while (at < fresh.size() && !m_refused && !m_upgraded) {
            if (m_bodyLeft > 0) {
                const qint64 skip = qMin<qint64>(m_bodyLeft, fresh.size() - at);
                m_bodyLeft -= skip;
                at += skip;
                continue;
            }
            const qsizetype headStart = m_head.size();
            m_head += fresh.mid(at, kMaxHeadBytes + 4 - m_head.size());
            const qsizetype end = m_head.indexOf("\r\n\r\n");
            if (end < 0) {
                if (m_head.size() > kMaxHeadBytes)
                    refuse(431, QStringLiteral("Request Header Fields Too Large"),
                           QStringLiteral("the request head is larger than %1 bytes")
                               .arg(kMaxHeadBytes));
                at = fresh.size();
                continue;
            }
            at += end + 4 - headStart;
            readHead(m_head.left(end));
            m_head.clear();
        }
    }

    void readHead(const QByteArray& head)
    {
        qint64 length = 0;
        const QList<QByteArray> lines = head.split('\n');
        for (qsizetype i = 1; i < lines.size(); ++i) {
            const qsizetype colon = lines[i].indexOf(':');
            if (colon < 0)
                continue;
            const QByteArray name = lines[i].left(colon).trimmed().toLower();
            const QByteArray value = lines[i].mid(colon + 1).trimmed();
            if (name == "content-length") {
                bool ok = false;
                length = value.toLongLong(&ok);
                if (!ok || length < 0)
                    return refuse(400, QStringLiteral("Bad Request"),
                                  QStringLiteral("bad Content-Length"));
            } else if (name == "transfer-encoding") {
                return refuse(411, QStringLiteral("Length Required"),
                              QStringLiteral("send the body with a Content-Length"));
            } else if (name == "upgrade" && value.toLower() == "websocket") {
                m_upgraded = true;
            }
        }
        if (length > m_maxBodyBytes)
            return refuse(413, QStringLiteral("Payload Too Large"),
                          QStringLiteral("larger than %1 bytes").arg(m_maxBodyBytes));
        m_bodyLeft = length;
    }

    void refuse(int status, const QString& reason, const QString& problem)
    {
        m_refused = true;
        // The request line, up to a length fit for a log.
        qsizetype lineEnd = m_head.indexOf('\r');
        if (lineEnd < 0 || lineEnd > 200)
            lineEnd = 200;
        qCInfo(lcServe).noquote() << m_head.left(lineEnd) << status << problem;
        const QByteArray body =
            QJsonDocument(QJsonObject{{QStringLiteral("error"), reason.toLower()},
                                      {QStringLiteral("field"), QStringLiteral("body")},
                                      {QStringLiteral("problem"), problem}})
                .toJson(QJsonDocument::Compact);
        m_socket->readAll();
        m_socket->write(QStringLiteral("HTTP/1.1 %1 %2\r\nContent-Type: application/json\r\n"
                                       "Content-Length: %3\r\nConnection: close\r\n")
                            .arg(status)
                            .arg(reason)
                            .arg(body.size())
                            .toLatin1() +
                        ConsolePages::securityHeaderLines() + "\r\n" + body);
        // Closing while the client still sends would reset the connection and lose the answer:
        // the rest of the request is read and dropped for a while first.
        QTimer::singleShot(kRefusalLingerMs, m_socket, &QTcpSocket::disconnectFromHost);
    }

    QTcpSocket* m_socket;
    qint64 m_maxBodyBytes;
    qint64 m_unread = 0;   // bytes at the buffer's front that were seen before
    qint64 m_bodyLeft = 0; // of the current request's body
    QByteArray m_head;
    bool m_refused = false;
    bool m_upgraded = false;
};

GuardedTcpServer::GuardedTcpServer(qint64 maxBodyBytes, QObject* parent)
    : QTcpServer(parent), m_maxBodyBytes(maxBodyBytes)
{
}

void GuardedTcpServer::followHttpServer()
{
    // newConnection's earlier receiver, the HTTP server, has connected its reader by now.
    connect(this, &QTcpServer::newConnection, this, [this] {
        for (const QPointer<RequestGuard>& guard : std::as_const(m_fresh)) {
            if (guard)
                guard->followHttpServer();
        }
        m_fresh.clear();
    });
}

void GuardedTcpServer::incomingConnection(qintptr socketDescriptor)
{
    auto* socket = new QTcpSocket(this);
    if (!socket->setSocketDescriptor(socketDescriptor)) {
        delete socket;
        return;
    }
    m_fresh.append(new RequestGuard(socket, m_maxBodyBytes));
    addPendingConnection(socket);
}
