#pragma once

#include <QByteArray>
#include <QObject>
#include <QString>

#include <atomic>
#include <memory>

class ClientSession;
class QWebSocket;
class UserTokens;

// One WebSocket client of /api/v1/events. Its first message names the operator
// ({"type": "hello", "token": ...}); it then subscribes through the plug-in's SubscribeEventBlock
// under a key of its own and gets each "AlarmUpdated" as a JSON text message. Events are turned
// into JSON on the thread that publishes them and queued to this object's thread; a client
// that falls behind (more than kMaxQueued messages or kMaxUnsentBytes unsent) is dropped, so
// it holds up neither the others nor the reply threads. Unsubscribes when it closes.
class EventSocket : public QObject
{
    Q_OBJECT

public:
    static constexpr int kMaxQueued = 256;
    static constexpr qint64 kMaxUnsentBytes = 1024 * 1024;
    static constexpr int kHelloTimeoutMs = 10000;
    static constexpr int kMaxSockets = 10000; // open at once, per server

    // Close codes.
    enum Close {
        BadHello = 4400,
        Unauthorized = 4401,
        OriginRefused = 4403,
        UnknownPath = 4404,
        HelloTimeout = 4408,
        TooSlow = 4429,
        TooMany = 4503
    };

    // The session of an operator, by name.
    using SessionOf = std::function<ClientSession&(const QString& operatorName)>;

    EventSocket(QWebSocket* socket, const UserTokens& users, SessionOf sessionOf,
                const QString& subscriptionKey, QObject* parent);
    ~EventSocket() override;

    // Refuses the connection with a close code and a reason; the object deletes itself.
    void refuse(Close code, const QString& reason);

signals:
    void subscribed(const QString& user, const QString& subscriptionKey);

private:
    struct Outbox;

    void readHello(const QString& message);
    void deliver(const QByteArray& message);
    void dropAsTooSlow();

    QWebSocket* m_socket;
    const UserTokens& m_users;
    SessionOf m_sessionOf;
    QString m_key;
    ClientSession* m_session = nullptr;
    std::shared_ptr<Outbox> m_outbox;
};
