#include "EventSocket.h"

#include "ApiServer.h"
#include "UserTokens.h"

#include <ClientSession.h>
#include <PlainJson.h>

#include <PluginAlarmSearchCommon.h>

#include <QJsonDocument>
#include <QJsonObject>
#include <QPointer>
#include <QTimer>
#include <QWebSocket>

// What the publishing threads share with the socket: how many messages wait in the event queue
// of the socket's thread, and the socket itself, read only on that thread.
struct EventSocket::Outbox
{
    std::atomic<int> queued{0};
    std::atomic<bool> overflowed{false};
    QPointer<EventSocket> target;
};

EventSocket::EventSocket(QWebSocket* socket, const UserTokens& users, SessionOf sessionOf,
                         const QString& subscriptionKey, QObject* parent)
    : QObject(parent), m_socket(socket), m_users(users), m_sessionOf(std::move(sessionOf)),
      m_key(subscriptionKey), m_outbox(std::make_shared<Outbox>())
{
    m_outbox->target = this;
    m_socket->setParent(this);
    m_socket->setMaxAllowedIncomingMessageSize(4096);
    m_socket->setMaxAllowedIncomingFrameSize(4096);
    connect(m_socket, &QWebSocket::textMessageReceived, this, &EventSocket::readHello);
    connect(m_socket, &QWebSocket::disconnected, this, &QObject::deleteLater);
    QTimer::singleShot(kHelloTimeoutMs, this, [this] {
        if (!m_session)
            refuse(HelloTimeout,
                   QStringLiteral("no hello within %1 s").arg(kHelloTimeoutMs / 1000));
    });
}

EventSocket::~EventSocket()
{
    if (m_session)
        m_session->unsubscribe(m_key);
}

void EventSocket::refuse(Close code, const QString& reason)
{
    disconnect(m_socket, &QWebSocket::textMessageReceived, this, nullptr);
    m_socket->close(QWebSocketProtocol::CloseCode(code), reason);
    // A peer that does not answer the close is cut off.
    QTimer::singleShot(2000, m_socket, &QWebSocket::abort);
}

void EventSocket::readHello(const QString& message)
{
    if (m_session)
        return; // later messages mean nothing
    const QJsonObject hello = QJsonDocument::fromJson(message.toUtf8()).object();
    if (hello.value(QLatin1String("type")).toString() != QLatin1String("hello"))
        return refuse(BadHello, QStringLiteral("the first message must be {\"type\": \"hello\"}"));
    QString user = UserTokens::kLocalUser;
    if (!m_users.isEmpty()) {
        user = m_users.userOf(hello.value(QLatin1String("token")).toString());
        if (user.isEmpty())
            return refuse(Unauthorized, QStringLiteral("unknown token"));
    }

    std::shared_ptr<Outbox> outbox = m_outbox;
    QObject* receiver = parent(); // outlives every listener call, unlike this object
    m_session = &m_sessionOf(user);
    m_session->subscribe(
        m_key, PluginAlarmSearchCommon::EVENT_ALARM_UPDATED,
        [outbox, receiver](const PluginObjBase_EventSignalInfo& info) {
            if (outbox->overflowed)
                return;
            if (outbox->queued.fetch_add(1) >= kMaxQueued) {
                outbox->overflowed = true;
                QMetaObject::invokeMethod(
                    receiver,
                    [outbox] {
                        if (outbox->target)
                            outbox->target->dropAsTooSlow();
                    },
                    Qt::QueuedConnection);
                return;
            }
            const QByteArray text =
                QJsonDocument(PlainJson::event(info)).toJson(QJsonDocument::Compact);
            // Runs on the socket's thread, if the socket is still there.
            QMetaObject::invokeMethod(
                receiver,
                [outbox, text] {
                    --outbox->queued;
                    if (outbox->target)
                        outbox->target->deliver(text);
                },
                Qt::QueuedConnection);
        });
    m_socket->sendTextMessage(QString::fromUtf8(
        QJsonDocument(QJsonObject{{QStringLiteral("type"), QStringLiteral("subscribed")},
                                  {QStringLiteral("user"), user},
                                  {QStringLiteral("subscriptionKey"), m_key}})
            .toJson(QJsonDocument::Compact)));
    emit subscribed(user, m_key);
}

void EventSocket::deliver(const QByteArray& message)
{
    if (!m_session)
        return; // dropped already
    if (m_socket->bytesToWrite() > kMaxUnsentBytes)
        return dropAsTooSlow();
    m_socket->sendTextMessage(QString::fromUtf8(message));
}

void EventSocket::dropAsTooSlow()
{
    m_outbox->overflowed = true;
    if (!m_session)
        return; // dropped already
    qCInfo(lcServe).noquote() << "WS" << m_key << "dropped: too slow to read its events";
    m_session->unsubscribe(m_key);
    m_session = nullptr;
    refuse(TooSlow, QStringLiteral("too slow to read its events"));
}
