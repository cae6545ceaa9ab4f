#pragma once

#include "ClientSession.h"

#include <QThread>
#include <QUrl>

#include <atomic>

class RemoteConnection;

// A session with a running `alarmsearch serve`: the plug-in's requests become calls of its
// network API, and subscriptions its event WebSocket, so that a command gives the same output
// as with the plug-in in this process and also sees the changes of other operators. Network
// work runs on a thread of the session's own, on which event listeners are called.
class RemoteSession : public ClientSession
{
public:
    RemoteSession(const QUrl& server, const QString& token, bool keepXml);
    ~RemoteSession() override;

    // Asks the server who the token belongs to.
    bool connectToServer(int timeoutMs, QString* errorMessage);
    QString user() const { return m_user; }

    bool call(const QString& method, const QVariant& args, int timeoutMs,
              QList<PluginAnswer>* answers, QString* errorMessage) override;
    void send(const QString& method, const QVariant& args) override;
    bool waitForIdle(int timeoutMs) override;
    bool subscribe(const QString& subscriptionKey, const QString& eventName,
                   EventHub::Listener listener, QString* errorMessage = nullptr) override;
    void unsubscribe(const QString& subscriptionKey) override;

private:
    bool searchCall(const QString& method, const QVariantMap& args, int timeoutMs,
                    PluginAnswer* answer, QString* errorMessage);

    bool m_keepXml;
    QString m_user;
    int m_timeoutMs = 30000;
    std::atomic<bool> m_sendFailed{false};
    QThread m_thread;
    RemoteConnection* m_connection;
};
