#pragma once

#include "EventHub.h"

#include <QHash>
#include <QJsonObject>
#include <QObject>
#include <QSet>
#include <QUrl>

class QNetworkAccessManager;
class QWebSocket;

// The network side of a RemoteSession. Lives on the session's thread; its members are called
// there (blocking the caller), and event listeners run there.
class RemoteConnection : public QObject
{
    Q_OBJECT

public:
    struct Reply
    {
        int status = 0; // 0: no HTTP answer (see error)
        QJsonObject body;
        QString error;
    };

    RemoteConnection(const QUrl& server, const QString& token);

    Reply request(const QByteArray& verb, const QString& path, const QJsonObject& body,
                  int timeoutMs);
    // Opens the event WebSocket of a subscription and waits until the server confirms it.
    bool subscribe(const QString& key, EventHub::Listener listener, int timeoutMs,
                   QString* errorMessage);
    void unsubscribe(const QString& key);
    void closeAll();
    // Hands the event an update answer carried to the listeners, unless its WebSocket copy
    // came first (or the other way round: the later copy is dropped).
    void deliverOnce(const QJsonObject& event);

private:
    struct Subscription
    {
        QWebSocket* socket = nullptr;
        EventHub::Listener listener;
        QString serverKey; // the key the server subscribed this socket under
    };

    void readEvent(const QString& key, const QString& message);

    QUrl m_server;
    QString m_token;
    QNetworkAccessManager* m_network = nullptr;
    QHash<QString, Subscription> m_subscriptions;
    QSet<QString> m_delivered; // relay paths of update events already handed on
};
