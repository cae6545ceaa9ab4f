#pragma once

#include <QHash>
#include <QMutex>
#include <QObject>
#include <QSqlDatabase>
#include <QSqlQuery>
#include <QString>

#include <memory>
#include <unordered_map>

class QThread;

namespace AlarmServerSim {

// SQLite connections to one database, one per thread that uses it (a Qt SQL connection may only
// be used by the thread that created it). A thread's connection is closed when the thread
// finishes. An in-memory database is a named shared-cache database, so that every connection
// sees the same data; the first connection keeps it alive until the pool is destroyed.
class ConnectionPool
{
public:
    ConnectionPool();
    ~ConnectionPool();
    Q_DISABLE_COPY(ConnectionPool)

    // Opens the first connection. path is a file path or ":memory:".
    bool open(const QString& path, QString* errorMessage);
    // The first connection, for setting up the schema on the opening thread.
    QSqlDatabase primary() const;
    // The calling thread's connection, opened on first use; invalid when it cannot be opened.
    QSqlDatabase forCurrentThread(QString* errorMessage);
    // A statement of the calling thread's connection, prepared on its first use and kept until
    // the thread ends, so that frequent commands do not compile their SQL each time. Call
    // finish() on it after use, which ends its read. Null when it cannot be prepared.
    QSqlQuery* preparedQuery(const QString& sql, QString* errorMessage);

private:
    struct ThreadConnection
    {
        QString name;
        // Used by the owning thread only.
        std::unordered_map<QString, std::unique_ptr<QSqlQuery>> statements;
    };

    QSqlDatabase addConnection(QString* errorMessage);
    void dropThreadConnection(QThread* thread);

    QString m_databaseName;
    QString m_connectOptions;
    bool m_isFile = false;
    QString m_namePrefix;
    QString m_primaryName;
    QMutex m_mutex; // guards m_threadConnections and m_nextConnection
    QHash<QThread*, std::shared_ptr<ThreadConnection>> m_threadConnections;
    int m_nextConnection = 0;
    QObject m_context; // receiver of the threads' finished signals; disconnects them when gone
};

} // namespace AlarmServerSim
