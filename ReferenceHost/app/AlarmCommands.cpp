#include "Cli.h"
#include "Commands.h"

#include <AnswerFormat.h>
#include <HostTunnelClient.h>

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QCoreApplication>
#include <QMutex>

using namespace PluginAlarmSearchCommon;

namespace {

const QCommandLineOption kIdOption(QStringLiteral("id"),
                                   QStringLiteral("Alarm identifier; repeatable."),
                                   QStringLiteral("alarm-id"));

// The server's per-alarm result code for an alarm it does not know.
const QString kUnknownAlarmResult = QStringLiteral("1");

QString unknownAlarmsMessage(const QStringList& ids)
{
    return QStringLiteral("unknown alarm%1: %2")
        .arg(ids.size() == 1 ? QString() : QStringLiteral("s"), ids.join(QLatin1String(", ")));
}

// Asks the server for each alarm's history: the alarms it has none for are unknown. False on a
// failure other than an unknown alarm (a lost connection, no answer in time).
bool findUnknownAlarms(Cli& cli, const QStringList& ids, QStringList* unknown, int* exitCode)
{
    for (const QString& id : ids) {
        QList<PluginAnswer> answers;
        if (!cli.call(METHOD_GET_ALARM_HISTORY, QVariantMap{{ARG_ALARM_ID, id}}, &answers,
                      exitCode))
            return false;
        if (answers.constLast().resultCode == QLatin1String("0"))
            continue;
        const QString lost = cli.connectionError();
        if (!lost.isEmpty()) {
            *exitCode = cli.fail(lost);
            return false;
        }
        unknown->append(id);
    }
    return true;
}

int sendMute(Cli& cli, const QStringList& arguments, bool isMute)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(
        isMute ? QStringLiteral("Mutes alarms for a number of seconds. The server sends no "
                                "answer to this request.")
               : QStringLiteral("Unmutes alarms. The server sends no answer to this request."));
    parser.addPositionalArgument(QStringLiteral("alarm-id"), QStringLiteral("Alarms to change."),
                                 QStringLiteral("[alarm-id...]"));
    parser.addOption(kIdOption);
    if (isMute)
        parser.addOption({QStringLiteral("seconds"),
                          QStringLiteral("How long the alarms stay muted (default 300)."),
                          QStringLiteral("n"), QStringLiteral("300")});
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    const QStringList ids = Cli::alarmIds(parser);
    if (ids.isEmpty())
        return cli.usageError(QStringLiteral("name at least one alarm"));
    int seconds = 0;
    if (isMute) {
        bool ok = false;
        seconds = parser.value(QStringLiteral("seconds")).toInt(&ok);
        if (!ok || seconds <= 0)
            return cli.usageError(QStringLiteral("--seconds needs a positive number"));
    }
    if (!cli.openHost(&exitCode))
        return exitCode;
    // The server passes over unknown alarms without a word; check them first, and change nothing
    // unless all are known.
    QStringList unknown;
    if (!findUnknownAlarms(cli, ids, &unknown, &exitCode))
        return exitCode;
    if (!unknown.isEmpty())
        return cli.fail(
            unknownAlarmsMessage(unknown) +
            (isMute ? QStringLiteral("; nothing muted") : QStringLiteral("; nothing unmuted")));
    cli.session().send(METHOD_MUTE_ALARM, QVariantMap{{ARG_ALARM_ID_LIST, ids},
                                                      {ARG_IS_MUTE, isMute},
                                                      {ARG_MUTE_TIME_SECOND, seconds}});
    if (!cli.session().waitForIdle(cli.timeoutMs()))
        return cli.fail(QStringLiteral("the mute request was not delivered in time"));
    cli.printNote(
        isMute
            ? QStringLiteral("muted %1 alarm(s) for %2 s (the server sends no answer)")
                  .arg(ids.size())
                  .arg(seconds)
            : QStringLiteral("unmuted %1 alarm(s) (the server sends no answer)").arg(ids.size()));
    return Cli::ExitOk;
}

} // namespace

namespace Commands {

int update(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Sets the state and note of alarms. Prints the AlarmUpdated event with the outcome for "
        "each alarm, then the answer."));
    parser.addPositionalArgument(QStringLiteral("alarm-id"), QStringLiteral("Alarms to change."),
                                 QStringLiteral("[alarm-id...]"));
    parser.addOptions({
        kIdOption,
        {QStringLiteral("state"),
         QStringLiteral("New state: %1.").arg(QueryArguments::stateChoices()),
         QStringLiteral("state")},
        {QStringLiteral("note"), QStringLiteral("Note stored with the change."),
         QStringLiteral("text")},
    });
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    const QStringList ids = Cli::alarmIds(parser);
    if (ids.isEmpty())
        return cli.usageError(QStringLiteral("name at least one alarm"));
    if (!parser.isSet(QStringLiteral("state")))
        return cli.usageError(QStringLiteral("--state is required"));
    QString state;
    QString error;
    if (!QueryArguments::canonicalState(parser.value(QStringLiteral("state")), &state, &error))
        return cli.usageError(error);
    if (!cli.openHost(&exitCode))
        return exitCode;

    // The per-alarm outcome arrives as an event, published before the answer.
    QMutex mutex;
    QVariantList outcomes;
    const QString key =
        QStringLiteral("alarmsearch-update-%1").arg(QCoreApplication::applicationPid());
    cli.session().subscribe(
        key, EVENT_ALARM_UPDATED, [&](const PluginObjBase_EventSignalInfo& info) {
            cli.printOut(AnswerFormat::jsonLine(AnswerFormat::eventObject(info), cli.pretty()));
            QMutexLocker locker(&mutex);
            outcomes += info.eventData.toMap().value(ARG_ALARM_UPDATED_RESULTS).toList();
        });
    QList<PluginAnswer> answers;
    const bool answered =
        cli.call(METHOD_UPDATE_ALARM,
                 QVariantMap{{ARG_ALARM_ID_LIST, ids},
                             {ARG_ALARM_STATUS, state},
                             {ARG_ALARM_COMMENT, parser.value(QStringLiteral("note"))}},
                 &answers, &exitCode);
    cli.session().unsubscribe(key);
    if (!answered)
        return exitCode;
    for (const PluginAnswer& answer : std::as_const(answers))
        cli.printAnswer(METHOD_UPDATE_ALARM, answer);
    if (answers.constLast().resultCode != QLatin1String("0"))
        return cli.fail(cli.answerError(METHOD_UPDATE_ALARM, answers.constLast()));

    QMutexLocker locker(&mutex);
    QStringList unknown;
    QStringList failed;
    for (const QVariant& outcome : std::as_const(outcomes)) {
        const QVariantMap fields = outcome.toMap();
        const QString code = fields.value(ARG_UPDATE_RESULT).toString();
        const QString id = fields.value(ARG_ALARM_ID).toString();
        if (code == kUnknownAlarmResult)
            unknown.append(id);
        else if (code != QLatin1String("0"))
            failed.append(QStringLiteral("%1 (result code %2)").arg(id, code));
    }
    if (!failed.isEmpty())
        return cli.fail(QStringLiteral("not updated: %1%2")
                            .arg(failed.join(QLatin1String(", ")),
                                 unknown.isEmpty()
                                     ? QString()
                                     : QStringLiteral("; ") + unknownAlarmsMessage(unknown)));
    if (!unknown.isEmpty())
        return cli.fail(unknownAlarmsMessage(unknown));
    return Cli::ExitOk;
}

int history(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(
        QStringLiteral("Shows the change history of an alarm, oldest change first."));
    parser.addPositionalArgument(QStringLiteral("alarm-id"), QStringLiteral("The alarm."));
    parser.addOption(
        {QStringLiteral("export"), QStringLiteral("Ask with GetAlarmHistoryForExport instead of "
                                                  "GetAlarmHistory.")});
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (parser.positionalArguments().size() != 1)
        return cli.usageError(QStringLiteral("history takes exactly one alarm identifier"));
    if (!cli.openHost(&exitCode))
        return exitCode;
    const QString method = parser.isSet(QStringLiteral("export"))
                               ? METHOD_GET_ALARM_HISTORY_FOR_EXPORT
                               : METHOD_GET_ALARM_HISTORY;
    const QString id = parser.positionalArguments().constFirst();
    QList<PluginAnswer> answers;
    if (!cli.call(method, QVariantMap{{ARG_ALARM_ID, id}}, &answers, &exitCode))
        return exitCode;
    if (answers.constLast().resultCode != QLatin1String("0")) {
        // The server answers an alarm it does not know with a failure.
        const QString lost = cli.connectionError();
        return cli.fail(lost.isEmpty() ? unknownAlarmsMessage({id}) : lost);
    }
    for (const PluginAnswer& answer : std::as_const(answers))
        cli.printAnswer(method, answer);
    return Cli::ExitOk;
}

int mute(Cli& cli, const QStringList& arguments)
{
    return sendMute(cli, arguments, true);
}

int unmute(Cli& cli, const QStringList& arguments)
{
    return sendMute(cli, arguments, false);
}

} // namespace Commands
