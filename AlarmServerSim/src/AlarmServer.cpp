#include "AlarmServer.h"

#include "AlarmFilter.h"
#include "CommandXml.h"
#include "ConnectionPool.h"
#include "DemoAlarms.h"
#include "FieldFormats.h"
#include "SimLogging.h"

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>

#include <QDir>
#include <QFileInfo>
#include <QReadWriteLock>
#include <QScopeGuard>
#include <QSqlError>
#include <QSqlQuery>
#include <QStandardPaths>

using namespace PluginAlarmSearchCommon;

Q_LOGGING_CATEGORY(lcSim, "alarmsearch.sim")

namespace AlarmServerSim {

namespace {

const QString kStatusOk = QStringLiteral("0");
const QString kStatusBadCommand = QStringLiteral("80000001");
const QString kStatusUnknownMethod = QStringLiteral("80000002");
const QString kStatusServerError = QStringLiteral("80000003");
const QString kStatusUnknownAlarm = QStringLiteral("80000004");

const QString kResultOk = QStringLiteral("0");
const QString kResultUnknownAlarm = QStringLiteral("1");

// Schema version kept in the database's user_version; 0 means a new database.
constexpr int kSchemaVersion = 1;

const char* const kSchema[] = {
    "CREATE TABLE alarm ("
    " id INTEGER PRIMARY KEY," // the number of the alarm ID
    " event_class TEXT NOT NULL,"
    " sub_event_type TEXT NOT NULL," // filter attribute name, or empty
    " sub_event TEXT NOT NULL,"      // filter attribute value, or empty
    " alarm_name TEXT NOT NULL,"
    " alarm_name_folded TEXT NOT NULL,"
    " device_name TEXT NOT NULL,"
    " device_name_folded TEXT NOT NULL,"
    " state TEXT NOT NULL,"
    " server_time INTEGER NOT NULL," // seconds since the epoch
    " note TEXT NOT NULL DEFAULT '',"
    " mute_until INTEGER)", // seconds since the epoch; NULL when not muted
    "CREATE INDEX alarm_by_time ON alarm (server_time, id)",
    "CREATE TABLE change_log ("
    " id INTEGER PRIMARY KEY,"
    " alarm_id INTEGER NOT NULL REFERENCES alarm (id),"
    " time INTEGER NOT NULL,"
    " state TEXT NOT NULL,"
    " note TEXT NOT NULL,"
    " user TEXT NOT NULL)",
    "CREATE INDEX change_log_by_alarm ON change_log (alarm_id, id)",
};

// Columns that appendAlarmFields reads, in this order.
const QString kAlarmColumns =
    QStringLiteral("id, event_class, sub_event_type, sub_event, alarm_name, device_name, state, "
                   "server_time, note, mute_until");

// Appends the alarm's field elements of the current row (selected with kAlarmColumns).
void appendAlarmFields(QString& out, const QSqlQuery& row, qint64 now)
{
    const QVariant muteUntil = row.value(9);
    const bool muted = !muteUntil.isNull() && muteUntil.toLongLong() > now;
    appendTextElement(out, FIELD_ALARM_ID, formatAlarmId(row.value(0).toLongLong()));
    appendTextElement(out, FIELD_EVENT_CLASS, row.value(1).toString());
    appendTextElement(out, FIELD_SUB_EVENT_TYPE, row.value(2).toString());
    appendTextElement(out, FIELD_SUB_EVENT, row.value(3).toString());
    appendTextElement(out, FIELD_ALARM_NAME, row.value(4).toString());
    appendTextElement(out, FIELD_DEVICE_NAME, row.value(5).toString());
    appendTextElement(out, FIELD_STATE, row.value(6).toString());
    appendTextElement(out, FIELD_SERVER_TIME, formatTime(row.value(7).toLongLong()));
    appendTextElement(out, FIELD_NOTE, row.value(8).toString());
    appendTextElement(out, FIELD_MUTED, muted ? QStringLiteral("true") : QStringLiteral("false"));
    appendTextElement(out, FIELD_MUTE_UNTIL,
                      muted ? formatTime(muteUntil.toLongLong()) : QString());
}

CommandReply ok(const QString& replyText)
{
    return {kStatusOk, replyText};
}

CommandReply badCommand()
{
    return {kStatusBadCommand, QString()};
}

CommandReply serverError(const QSqlQuery& query)
{
    qCWarning(lcSim, "database failure: %s", qPrintable(query.lastError().text()));
    return {kStatusServerError, QString()};
}

} // namespace

struct AlarmServer::Private
{
    using CommandHandler = CommandReply (Private::*)(QSqlDatabase, const XmlElement&,
                                                     const QString& user);

    bool createAndSeed(const Options& options, QString* errorMessage);

    CommandReply queryAlarmList(QSqlDatabase db, const XmlElement& command, const QString&);
    CommandReply processAlarm(QSqlDatabase db, const XmlElement& command, const QString& user);
    CommandReply getAlarmInfo(QSqlDatabase db, const XmlElement& command, const QString&);
    CommandReply muteAlarm(QSqlDatabase db, const XmlElement& command, const QString&);

    ConnectionPool connections;
    // Commands that read share the database; a command that writes has it alone.
    QReadWriteLock lock;
};

AlarmServer::AlarmServer() : d(std::make_unique<Private>()) {}

AlarmServer::~AlarmServer() = default;

QString AlarmServer::defaultDatabasePath()
{
    return QStandardPaths::writableLocation(QStandardPaths::GenericDataLocation) +
           QLatin1String("/alarmsearch-sim/alarms.sqlite");
}

bool AlarmServer::open(const Options& options, QString* errorMessage)
{
    QString error;
    if (options.databasePath != QLatin1String(":memory:") &&
        !QDir().mkpath(QFileInfo(options.databasePath).absolutePath())) {
        error = QStringLiteral("cannot create the folder of %1").arg(options.databasePath);
    } else if (d->connections.open(options.databasePath, &error)) {
        if (d->createAndSeed(options, &error))
            return true;
    }
    if (errorMessage)
        *errorMessage = error;
    return false;
}

bool AlarmServer::Private::createAndSeed(const Options& options, QString* errorMessage)
{
    QSqlDatabase db = connections.primary();
    QSqlQuery query(db);
    if (!query.exec(QStringLiteral("PRAGMA user_version")) || !query.next()) {
        *errorMessage = query.lastError().text();
        return false;
    }
    if (query.value(0).toInt() == kSchemaVersion)
        return true;
    query.finish();

    db.transaction();
    bool done = true;
    for (const char* statement : kSchema)
        done = done && query.exec(QString::fromLatin1(statement));
    done = done && query.exec(QStringLiteral("PRAGMA user_version = %1").arg(kSchemaVersion));
    if (!done)
        *errorMessage = query.lastError().text();
    const QDateTime end =
        options.seedEnd.isValid() ? options.seedEnd : QDateTime::currentDateTimeUtc();
    done = done && seedDemoAlarms(db, options.seedCount, end, options.seed, errorMessage);
    if (done && db.commit())
        return true;
    if (errorMessage->isEmpty())
        *errorMessage = db.lastError().text();
    db.rollback();
    return false;
}

const QString AlarmServer::kDefaultOperator = QStringLiteral("operator");

CommandReply AlarmServer::execute(const QString& method, const QString& commandText,
                                  const QString& operatorName)
{
    static const QHash<QString, Private::CommandHandler> handlers = {
        {METHOD_QUERY_ALARM_LIST, &Private::queryAlarmList},
        {METHOD_PROCESS_ALARM, &Private::processAlarm},
        {METHOD_GET_ALARM_INFO, &Private::getAlarmInfo},
        {METHOD_MUTE_ALARM, &Private::muteAlarm},
    };
    const Private::CommandHandler handler = handlers.value(method);
    if (!handler)
        return {kStatusUnknownMethod, QString()};
    // Every command's document element is named after its method.
    const std::optional<XmlElement> command = parseXmlDocument(commandText);
    if (!command || command->name != method)
        return badCommand();
    QString error;
    QSqlDatabase db = d->connections.forCurrentThread(&error);
    if (!db.isValid()) {
        qCWarning(lcSim, "cannot open the database: %s", qPrintable(error));
        return {kStatusServerError, QString()};
    }
    const QString user = operatorName.isEmpty() || operatorName.size() > kMaxOperatorName
                             ? kDefaultOperator
                             : operatorName;
    return (d.get()->*handler)(db, *command, user);
}

CommandReply AlarmServer::Private::queryAlarmList(QSqlDatabase db, const XmlElement& command,
                                                  const QString& /*user*/)
{
    const std::optional<AlarmFilter> filter = alarmFilterFromCommand(command);
    if (!filter)
        return badCommand();
    const QString order = filter->descending ? QStringLiteral("DESC") : QStringLiteral("ASC");
    QReadLocker locker(&lock);
    QSqlQuery query(db);
    query.setForwardOnly(true);
    query.prepare(QStringLiteral("SELECT %1 FROM alarm WHERE %2 "
                                 "ORDER BY server_time %3, id %3 LIMIT %4")
                      .arg(kAlarmColumns, filter->where, order)
                      .arg(filter->limit));
    if (!execWith(query, filter->bindings))
        return serverError(query);
    const qint64 now = QDateTime::currentSecsSinceEpoch();
    QString reply = QStringLiteral("<QryAlarmListRes>");
    while (query.next()) {
        reply += QLatin1String("<Alarm>");
        appendAlarmFields(reply, query, now);
        reply += QLatin1String("</Alarm>");
    }
    reply += QLatin1String("</QryAlarmListRes>");
    return ok(reply);
}

CommandReply AlarmServer::Private::processAlarm(QSqlDatabase db, const XmlElement& command,
                                                const QString& user)
{
    QVariant state; // null: keep the alarm's state
    if (const XmlElement* status = command.child(u"Status")) {
        if (status->child(FIELD_STATE)) {
            state = status->childText(FIELD_STATE);
            if (!ALARM_STATES.contains(state.toString()))
                return badCommand();
        }
    }
    const XmlElement* noteElement = command.child(u"Note");
    const QString note = noteElement ? noteElement->text : QString();
    QList<const XmlElement*> alarms;
    if (const XmlElement* list = command.child(u"AlarmList"))
        alarms = list->childrenNamed(u"Alarm");

    QWriteLocker locker(&lock);
    db.transaction();
    QSqlQuery update(db);
    QSqlQuery log(db);
    update.prepare(QStringLiteral("UPDATE alarm SET state = COALESCE(?, state), "
                                  "note = COALESCE(?, note) WHERE id = ?"));
    // The entry takes the alarm's state after the update.
    log.prepare(QStringLiteral("INSERT INTO change_log (alarm_id, time, state, note, user) "
                               "SELECT id, ?, state, ?, ? FROM alarm WHERE id = ?"));
    const qint64 now = QDateTime::currentSecsSinceEpoch();
    QString reply = QStringLiteral("<ProcessAlarmRes>");
    for (const XmlElement* alarm : alarms) {
        const QString id = alarm->attribute(u"ID").trimmed();
        const std::optional<qint64> number = parseAlarmId(id);
        bool found = false;
        if (number) {
            if (!execWith(update, {state, noteElement ? QVariant(note) : QVariant(), *number})) {
                db.rollback();
                return serverError(update);
            }
            found = update.numRowsAffected() > 0;
        }
        if (found) {
            if (!execWith(log, {now, note, user, *number})) {
                db.rollback();
                return serverError(log);
            }
        }
        reply += QLatin1String("<Result>");
        appendTextElement(reply, FIELD_ALARM_ID, id);
        appendTextElement(reply, FIELD_CODE, found ? kResultOk : kResultUnknownAlarm);
        reply += QLatin1String("</Result>");
    }
    reply += QLatin1String("</ProcessAlarmRes>");
    if (!db.commit())
        return serverError(update);
    return ok(reply);
}

CommandReply AlarmServer::Private::getAlarmInfo(QSqlDatabase, const XmlElement& command,
                                                const QString& /*user*/)
{
    CommandReply unknownAlarm{kStatusUnknownAlarm, QString()};
    const std::optional<qint64> number = parseAlarmId(command.childText(FIELD_ALARM_ID));
    if (!number)
        return unknownAlarm;

    // An export asks for every alarm's history: the two statements are prepared once per thread.
    QString error;
    QSqlQuery* alarm = connections.preparedQuery(
        QStringLiteral("SELECT %1 FROM alarm WHERE id = ?").arg(kAlarmColumns), &error);
    QSqlQuery* log = connections.preparedQuery(QStringLiteral("SELECT time, state, note, user "
                                                              "FROM change_log WHERE alarm_id = ? "
                                                              "ORDER BY time, id"),
                                               &error);
    if (!alarm || !log) {
        qCWarning(lcSim, "cannot prepare a statement: %s", qPrintable(error));
        return {kStatusServerError, QString()};
    }
    // Reset both when done, which ends their reads.
    const auto finish = qScopeGuard([&] {
        alarm->finish();
        log->finish();
    });

    QReadLocker locker(&lock);
    if (!execWith(*alarm, {*number}))
        return serverError(*alarm);
    if (!alarm->next())
        return unknownAlarm;
    QString reply = QStringLiteral("<GetAlarmInfoRes><Alarm>");
    appendAlarmFields(reply, *alarm, QDateTime::currentSecsSinceEpoch());

    if (!execWith(*log, {*number}))
        return serverError(*log);
    reply += QLatin1String("<ChangeLogs>");
    while (log->next()) {
        reply += QLatin1String("<Entry>");
        appendTextElement(reply, FIELD_TIME, formatTime(log->value(0).toLongLong()));
        appendTextElement(reply, FIELD_STATE, log->value(1).toString());
        appendTextElement(reply, FIELD_NOTE, log->value(2).toString());
        appendTextElement(reply, FIELD_USER, log->value(3).toString());
        reply += QLatin1String("</Entry>");
    }
    reply += QLatin1String("</ChangeLogs></Alarm></GetAlarmInfoRes>");
    return ok(reply);
}

CommandReply AlarmServer::Private::muteAlarm(QSqlDatabase db, const XmlElement& command,
                                             const QString& /*user*/)
{
    const QString muteText = command.childText(u"Mute");
    if (muteText != QLatin1String("true") && muteText != QLatin1String("false"))
        return badCommand();
    const bool mute = muteText == QLatin1String("true");
    bool intervalOk = false;
    const qint64 interval = command.childText(u"MuteInterval").toLongLong(&intervalOk);
    if (mute && !intervalOk)
        return badCommand();
    QList<const XmlElement*> ids;
    if (const XmlElement* list = command.child(u"EventTimecardIDList"))
        ids = list->childrenNamed(u"ID");

    QWriteLocker locker(&lock);
    db.transaction();
    QSqlQuery update(db);
    update.prepare(QStringLiteral("UPDATE alarm SET mute_until = ? WHERE id = ?"));
    const QVariant until =
        mute ? QVariant(QDateTime::currentSecsSinceEpoch() + interval) : QVariant();
    for (const XmlElement* id : ids) {
        const std::optional<qint64> number = parseAlarmId(id->text.trimmed());
        if (!number)
            continue;
        if (!execWith(update, {until, *number})) {
            db.rollback();
            return serverError(update);
        }
    }
    if (!db.commit())
        return serverError(update);
    return ok(QStringLiteral("<MuteAlarmRes/>"));
}

} // namespace AlarmServerSim
