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
    const QStringList names = m_threadConnections.values();
    m_threadConnections.clear();
    locker.unlock();
    for (const QString& name : names)
        QSqlDatabase::removeDatabase(name);
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
            return QSqlDatabase::database(*it, false);
    }
    QSqlDatabase db = addConnection(errorMessage);
    if (!db.isValid())
        return db;
    QMutexLocker locker(&m_mutex);
    m_threadConnections.insert(thread, db.connectionName());
    // Runs on the finishing thread itself, which owns the connection.
    QObject::connect(
        thread, &QThread::finished, &m_context, [this, thread] { dropThreadConnection(thread); },
        Qt::DirectConnection);
    return db;
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
    const QString name = m_threadConnections.take(thread);
    locker.unlock();
    if (!name.isEmpty())
        QSqlDatabase::removeDatabase(name);
}

} // namespace AlarmServerSim
