#include "RemoteConnection.h"

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QDateTime>
#include <QEventLoop>
#include <QJsonDocument>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QNetworkRequest>
#include <QTimer>
#include <QWebSocket>

namespace {

constexpr int kMaxDelivered = 1024;
constexpr qint64 kMaxReplyBytes = 512 * 1024 * 1024;

PluginObjBase_EventSignalInfo eventInfo(const QJsonObject& event, const QString& key)
{
    const QVariant data = event.value(QLatin1String("data")).toVariant();
    return PluginObjBase_EventSignalInfo(
        event.value(QLatin1String("pluginId")).toString(), key,
        QDateTime::fromString(event.value(QLatin1String("time")).toString(), Qt::ISODateWithMs)
            .toMSecsSinceEpoch(),
        event.value(QLatin1String("event")).toString(), &data);
}

QString relayPathOf(const QJsonObject& event)
{
    return event.value(QLatin1String("data"))
        .toObject()
        .value(PluginAlarmSearchCommon::ARG_RELAY_PATH)
        .toString();
}

} // namespace

RemoteConnection::RemoteConnection(const QUrl& server, const QString& token)
    : m_server(server), m_token(token)
{
}

RemoteConnection::Reply RemoteConnection::request(const QByteArray& verb, const QString& path,
                                                  const QJsonObject& body, int timeoutMs)
{
    if (!m_network)
        m_network = new QNetworkAccessManager(this);
    QUrl url = m_server;
    url.setPath(path);
    QNetworkRequest request(url);
    request.setHeader(QNetworkRequest::ContentTypeHeader, QByteArrayLiteral("application/json"));
    if (!m_token.isEmpty())
        request.setRawHeader(QByteArrayLiteral("Authorization"),
                             QByteArrayLiteral("Bearer ") + m_token.toUtf8());
    QNetworkReply* reply =
        verb == "GET"
            ? m_network->get(request)
            : m_network->post(request, QJsonDocument(body).toJson(QJsonDocument::Compact));
    QEventLoop loop;
    connect(reply, &QNetworkReply::finished, &loop, &QEventLoop::quit);
    QTimer::singleShot(timeoutMs, reply, &QNetworkReply::abort);
    connect(reply, &QNetworkReply::downloadProgress, reply, [reply](qint64 received, qint64) {
        if (received > kMaxReplyBytes)
            reply->abort();
    });
    loop.exec();

    Reply result;
    result.status = reply->attribute(QNetworkRequest::HttpStatusCodeAttribute).toInt();
    const QByteArray bytes = reply->readAll();
    result.body = QJsonDocument::fromJson(bytes).object();
    if (result.status == 0)
        result.error = QStringLiteral("%1: %2").arg(url.toString(), reply->errorString());
    reply->deleteLater();
    return result;
}

bool RemoteConnection::subscribe(const QString& key, EventHub::Listener listener, int timeoutMs,
                                 QString* errorMessage)
{
    unsubscribe(key);
    QUrl url = m_server;
    url.setScheme(QStringLiteral("ws"));
    url.setPath(QStringLiteral("/api/v1/events"));
    auto* socket = new QWebSocket(QString(), QWebSocketProtocol::VersionLatest, this);
    socket->setMaxAllowedIncomingMessageSize(16 * 1024 * 1024);

    QEventLoop loop;
    QString failure;
    bool confirmed = false;
    QString serverKey;
    QTimer timer;
    timer.setSingleShot(true);
    connect(&timer, &QTimer::timeout, &loop, [&] {
        failure = QStringLiteral("the server did not confirm the subscription in time");
        loop.quit();
    });
    connect(socket, &QWebSocket::connected, &loop, [&] {
        // The token goes in the first message, not into the URL.
        socket->sendTextMessage(QString::fromUtf8(
            QJsonDocument(QJsonObject{{QStringLiteral("type"), QStringLiteral("hello")},
                                      {QStringLiteral("token"), m_token}})
                .toJson(QJsonDocument::Compact)));
    });
    connect(socket, &QWebSocket::textMessageReceived, &loop, [&](const QString& message) {
        const QJsonObject reply = QJsonDocument::fromJson(message.toUtf8()).object();
        confirmed = reply.value(QLatin1String("type")).toString() == QLatin1String("subscribed");
        serverKey = reply.value(QLatin1String("subscriptionKey")).toString();
        loop.quit();
    });
    connect(socket, &QWebSocket::disconnected, &loop, [&] {
        failure = QStringLiteral("the server closed the event connection: %1 %2")
                      .arg(socket->closeCode())
                      .arg(socket->closeReason().isEmpty() ? socket->errorString()
                                                           : socket->closeReason());
        loop.quit();
    });
    timer.start(timeoutMs);
    socket->open(url);
    loop.exec();
    disconnect(socket, nullptr, &loop, nullptr);
    if (!confirmed) {
        if (errorMessage)
            *errorMessage = failure.isEmpty() ? QStringLiteral("unexpected answer to the "
                                                               "subscription")
                                              : failure;
        socket->abort();
        socket->deleteLater();
        return false;
    }
    connect(socket, &QWebSocket::textMessageReceived, this,
            [this, key](const QString& message) { readEvent(key, message); });
    m_subscriptions.insert(key, Subscription{socket, std::move(listener), serverKey});
    return true;
}

void RemoteConnection::unsubscribe(const QString& key)
{
    const Subscription subscription = m_subscriptions.take(key);
    if (!subscription.socket)
        return;
    subscription.socket->close();
    subscription.socket->deleteLater();
}

void RemoteConnection::closeAll()
{
    const QStringList keys = m_subscriptions.keys();
    for (const QString& key : keys)
        unsubscribe(key);
}

void RemoteConnection::readEvent(const QString& key, const QString& message)
{
    const QJsonObject event = QJsonDocument::fromJson(message.toUtf8()).object();
    if (event.value(QLatin1String("type")).toString() != QLatin1String("event"))
        return;
    const auto it = m_subscriptions.constFind(key);
    if (it == m_subscriptions.constEnd())
        return;
    const QString once = key + QLatin1Char('\n') + relayPathOf(event);
    if (m_delivered.remove(once))
        return; // the update's answer brought it already
    if (m_delivered.size() >= kMaxDelivered)
        m_delivered.clear();
    m_delivered.insert(once);
    it->listener(eventInfo(event, it->serverKey));
}

void RemoteConnection::deliverOnce(const QJsonObject& event)
{
    for (auto it = m_subscriptions.constBegin(); it != m_subscriptions.constEnd(); ++it) {
        const QString once = it.key() + QLatin1Char('\n') + relayPathOf(event);
        if (m_delivered.remove(once))
            continue; // its WebSocket copy came first
        if (m_delivered.size() >= kMaxDelivered)
            m_delivered.clear();
        m_delivered.insert(once);
        it->listener(eventInfo(event, it->serverKey));
    }
}
