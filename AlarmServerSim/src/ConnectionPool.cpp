#include "ConnectionPool.h"

#include <QAtomicInteger>
#include <QSqlError>
#include <QSqlQuery>
#include <QThread>

namespace AlarmServerSim {

namespace {

QAtomicInteger<quint32> g_poolCounter;

const QString kMemoryPath = QStringLiteral(":memory:");

} // namespace

ConnectionPool::ConnectionPool()
    : m_namePrefix(QStringLiteral("alarmsim-%1-").arg(g_poolCounter.fetchAndAddRelaxed(1)))
{
}

ConnectionPool::~ConnectionPool()
{
    QMutexLocker locker(&m_mutex);
    const QList<std::shared_ptr<ThreadConnection>> connections = m_threadConnections.values();
    m_threadConnections.clear();
    locker.unlock();
    for (const std::shared_ptr<ThreadConnection>& connection : connections) {
        connection->statements.clear();
        QSqlDatabase::removeDatabase(connection->name);
    }
    // The primary connection goes last: it keeps an in-memory database alive.
    if (!m_primaryName.isEmpty())
        QSqlDatabase::removeDatabase(m_primaryName);
}

bool ConnectionPool::open(const QString& path, QString* errorMessage)
{
    m_isFile = path != kMemoryPath;
    if (m_isFile) {
        m_databaseName = path;
        m_connectOptions = QStringLiteral("QSQLITE_BUSY_TIMEOUT=5000");
    } else {
        m_databaseName = QStringLiteral("file:%1memory?mode=memory&cache=shared").arg(m_namePrefix);
        m_connectOptions = QStringLiteral("QSQLITE_OPEN_URI;QSQLITE_BUSY_TIMEOUT=5000");
    }
    QSqlDatabase db = addConnection(errorMessage);
    if (!db.isValid())
        return false;
    m_primaryName = db.connectionName();
    return true;
}

QSqlDatabase ConnectionPool::primary() const
{
    return QSqlDatabase::database(m_primaryName, false);
}

QSqlDatabase ConnectionPool::forCurrentThread(QString* errorMessage)
{
    QThread* thread = QThread::currentThread();
    {
        QMutexLocker locker(&m_mutex);
        const auto it = m_threadConnections.constFind(thread);
        if (it != m_threadConnections.constEnd())
            return QSqlDatabase::database((*it)->name, false);
    }
    QSqlDatabase db = addConnection(errorMessage);
    if (!db.isValid())
        return db;
    QMutexLocker locker(&m_mutex);
    m_threadConnections.insert(
        thread, std::make_shared<ThreadConnection>(ThreadConnection{db.connectionName(), {}}));
    // Runs on the finishing thread itself, which owns the connection.
    QObject::connect(
        thread, &QThread::finished, &m_context, [this, thread] { dropThreadConnection(thread); },
        Qt::DirectConnection);
    return db;
}

QSqlQuery* ConnectionPool::preparedQuery(const QString& sql, QString* errorMessage)
{
    const QSqlDatabase db = forCurrentThread(errorMessage);
    std::shared_ptr<ThreadConnection> connection;
    {
        QMutexLocker locker(&m_mutex);
        connection = m_threadConnections.value(QThread::currentThread());
    }
    if (!db.isValid() || !connection)
        return nullptr;
    std::unique_ptr<QSqlQuery>& query = connection->statements[sql];
    if (!query) {
        auto prepared = std::make_unique<QSqlQuery>(db);
        prepared->setForwardOnly(true);
        if (!prepared->prepare(sql)) {
            if (errorMessage)
                *errorMessage = prepared->lastError().text();
            connection->statements.erase(sql);
            return nullptr;
        }
        query = std::move(prepared);
    }
    return query.get();
}

QSqlDatabase ConnectionPool::addConnection(QString* errorMessage)
{
    QString name;
    {
        QMutexLocker locker(&m_mutex);
        name = m_namePrefix + QString::number(m_nextConnection++);
    }
    QSqlDatabase db = QSqlDatabase::addDatabase(QStringLiteral("QSQLITE"), name);
    db.setDatabaseName(m_databaseName);
    db.setConnectOptions(m_connectOptions);
    QString error;
    if (!db.open()) {
        error = db.lastError().text();
    } else if (m_isFile) {
        // Write-ahead logging lets readers run while a command writes.
        QSqlQuery pragma(db);
        if (!pragma.exec(QStringLiteral("PRAGMA journal_mode=WAL")) ||
            !pragma.exec(QStringLiteral("PRAGMA synchronous=NORMAL")))
            error = pragma.lastError().text();
    }
    if (error.isEmpty())
        return db;
    if (errorMessage)
        *errorMessage = error;
    db = QSqlDatabase();
    QSqlDatabase::removeDatabase(name);
    return db;
}

void ConnectionPool::dropThreadConnection(QThread* thread)
{
    QMutexLocker locker(&m_mutex);
    const std::shared_ptr<ThreadConnection> connection = m_threadConnections.take(thread);
    locker.unlock();
    if (connection) {
        connection->statements.clear();
        QSqlDatabase::removeDatabase(connection->name);
    }
}

} // namespace AlarmServerSim
