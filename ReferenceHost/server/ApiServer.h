#pragma once

#include "ApiRoutes.h"
#include "UserTokens.h"

#include <QHash>
#include <QHostAddress>
#include <QLoggingCategory>
#include <QMutex>
#include <QObject>
#include <QThreadPool>
#include <QUrl>
#include <QVariant>

#include <atomic>
#include <memory>

class GuardedTcpServer;
class QHttpServer;
class ReferenceHost;

Q_DECLARE_LOGGING_CATEGORY(lcServe)

// The network API of a running host: /api/v1 over Qt HTTP Server, one route per request method
// of the plug-in, and the WebSocket /api/v1/events. Requests are carried out on a pool of
// threads, each in the session of its operator (the token's user, or "local"), so that they run
// side by side; answers go back on the server's thread. Logs one line per request.
class ApiServer : public QObject
{
    Q_OBJECT

public:
    struct Options
    {
        QHostAddress address = QHostAddress::LocalHost;
        quint16 port = 47880;
        QString usersFile;
        QStringList allowedOrigins; // besides the server's own
        int timeoutMs = 30000;      // for an answer of the plug-in
    };

    explicit ApiServer(ReferenceHost& host, QObject* parent = nullptr);
    ~ApiServer() override;

    // Refuses a non-loopback address without a users file, before anything is started.
    static bool checkAddress(const Options& options, QString* errorMessage);
    bool listen(const Options& options, QString* errorMessage);
    QUrl url() const;
    // Stops taking connections, closes the event sockets and waits for the requests in flight.
    void stop();

    struct Call;
    struct Reply;

private:
    void addRoutes();
    void acceptEventSockets();
    bool originAllowed(const QString& origin) const;
    Reply handle(const ApiRoutes::Route& route, const Call& call);
    Reply search(const Call& call, const QString& user, bool unhandledOnly);
    Reply update(const Call& call, const QString& user);
    Reply history(const Call& call, const QString& user, const QString& method);
    Reply mute(const Call& call, const QString& user, bool isMute);
    void recordOutcome(const QString& relayPath, const QJsonObject& event);

    ReferenceHost& m_host;
    Options m_options;
    UserTokens m_users;
    std::unique_ptr<QHttpServer> m_http;
    GuardedTcpServer* m_tcpServer = nullptr; // owned by m_http
    QThreadPool m_pool;
    std::atomic<qint64> m_nextRelay{1};
    qint64 m_nextSocket = 1;
    int m_openEventSockets = 0;
    QString m_outcomeKey;
    QMutex m_outcomeMutex;
    QHash<QString, QJsonObject> m_outcomes; // event of an update in flight, by relay path
};
