#include "Cli.h"
#include "Commands.h"
#include "Terminal.h"

#include <AlarmTable.h>

#include <AnswerFormat.h>
#include <HostTunnelClient.h>

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QDateTime>
#include <QMutex>

using namespace PluginAlarmSearchCommon;

namespace {

const int kDemoAlarms = 2000;
const int kRowsShown = 5;

// The scripted walk: each step sends one request and tells in plain words what came back.
class DemoScript
{
public:
    explicit DemoScript(Cli& cli) : m_cli(cli) {}
    int run();

private:
    void step(const QString& title);
    void say(const QString& text);
    bool request(const QString& method, const QVariantMap& args, PluginAnswer* answer);
    void showAlarms(const QVariantList& alarms);
    QVariantMap findAlarm(const QVariantList& alarms, const QString& id) const;

    Cli& m_cli;
    int m_step = 0;
    int m_exitCode = Cli::ExitOk;
    QMutex m_eventMutex;
    QStringList m_events;
};

void DemoScript::step(const QString& title)
{
    m_cli.printOut(QStringLiteral("\n%1. %2\n").arg(++m_step).arg(title).toUtf8());
}

void DemoScript::say(const QString& text)
{
    m_cli.printOut((QStringLiteral("   ") + text + QLatin1Char('\n')).toUtf8());
}

bool DemoScript::request(const QString& method, const QVariantMap& args, PluginAnswer* answer)
{
    QList<PluginAnswer> answers;
    if (!m_cli.call(method, args, &answers, &m_exitCode))
        return false;
    *answer = answers.constLast();
    say(QStringLiteral("-> %1 answered with result code %2").arg(method, answer->resultCode));
    if (answer->resultCode != QLatin1String("0")) {
        m_exitCode = m_cli.fail(QStringLiteral("%1 failed").arg(method));
        return false;
    }
    return true;
}

void DemoScript::showAlarms(const QVariantList& alarms)
{
    AlarmTable table(m_cli.timeZone(), qMax(0, terminalWidth() - 6));
    const QString lines = table.page(alarms.mid(0, kRowsShown));
    for (const QString& line : lines.split(QLatin1Char('\n'), Qt::SkipEmptyParts))
        say(QStringLiteral("   ") + line);
    if (alarms.size() > kRowsShown)
        say(QStringLiteral("   ... and %1 more").arg(alarms.size() - kRowsShown));
}

QVariantMap DemoScript::findAlarm(const QVariantList& alarms, const QString& id) const
{
    for (const QVariant& alarm : alarms) {
        if (alarm.toMap().value(FIELD_ALARM_ID).toString() == id)
            return alarm.toMap();
    }
    return QVariantMap();
}

int DemoScript::run()
{
    ReferenceHost::Options options;
    options.pluginPath = m_cli.pluginPath();
    options.embedded.databasePath = QStringLiteral(":memory:");
    options.embedded.seedCount = kDemoAlarms;
    options.embedded.seedEnd = QDateTime::currentDateTimeUtc();
    if (!m_cli.openHost(options, &m_exitCode))
        return m_exitCode;
    m_cli.printOut(QStringLiteral("Plug-in loaded from %1.\nEmbedded alarm server in memory, "
                                  "seeded with %2 demo alarms of the last 30 days.\n")
                       .arg(options.pluginPath)
                       .arg(kDemoAlarms)
                       .toUtf8());

    const QString key = QStringLiteral("demo-subscriber");
    m_cli.session().subscribe(
        key, EVENT_ALARM_UPDATED, [this](const PluginObjBase_EventSignalInfo& info) {
            QMutexLocker locker(&m_eventMutex);
            m_events.append(
                QString::fromUtf8(AnswerFormat::jsonLine(AnswerFormat::eventObject(info), false))
                    .trimmed());
        });

    step(QStringLiteral("QryUnhandledAlarm: the unhandled alarms, newest first"));
    const QVariantMap unhandledArgs{
        {ARG_STATE_FILTER, QueryArguments::stateFilter({STATE_UNHANDLED})}};
    PluginAnswer answer;
    if (!request(METHOD_QUERY_UNHANDLED_ALARM, unhandledArgs, &answer))
        return m_exitCode;
    const QVariantList unhandled = AnswerFormat::alarms(answer, false);
    say(QStringLiteral("%1 unhandled alarm(s):").arg(unhandled.size()));
    showAlarms(unhandled);
    if (unhandled.size() < 3)
        return m_cli.fail(QStringLiteral("the demo needs at least three unhandled alarms"));
    const QString first = unhandled[0].toMap().value(FIELD_ALARM_ID).toString();
    const QString second = unhandled[1].toMap().value(FIELD_ALARM_ID).toString();
    const QString third = unhandled[2].toMap().value(FIELD_ALARM_ID).toString();

    step(QStringLiteral("QryAlarmList: camera alarms of the last 7 days, in any state"));
    const QVariantMap cameraArgs{
        {ARG_TRIGGER_EVENT_FILTER, CAMERA_TRIGGER_EVENT_FILTER_STRING},
        {ARG_START_TIME, QDateTime::currentDateTimeUtc().addDays(-7).toString(
                             QStringLiteral("yyyy-MM-ddTHH:mm:ss"))}};
    if (!request(METHOD_QUERY_ALARM_LIST, cameraArgs, &answer))
        return m_exitCode;
    const QVariantList camera = AnswerFormat::alarms(answer, false);
    say(QStringLiteral("%1 camera alarm(s):").arg(camera.size()));
    showAlarms(camera);

    step(
        QStringLiteral("UpdateAlarm: %1 and %2 become Processing, with a note").arg(first, second));
    if (!request(METHOD_UPDATE_ALARM,
                 QVariantMap{{ARG_ALARM_ID_LIST, QStringList{first, second}},
                             {ARG_ALARM_STATUS, STATE_PROCESSING},
                             {ARG_ALARM_COMMENT, QStringLiteral("Operator on the way")}},
                 &answer))
        return m_exitCode;
    {
        QMutexLocker locker(&m_eventMutex);
        say(QStringLiteral("subscriber \"%1\" got %2 event(s) before the answer:")
                .arg(key)
                .arg(m_events.size()));
        for (const QString& event : std::as_const(m_events))
            say(QStringLiteral("   ") + event);
    }

    step(QStringLiteral("GetAlarmHistory: the change history of %1").arg(first));
    if (!request(METHOD_GET_ALARM_HISTORY, QVariantMap{{ARG_ALARM_ID, first}}, &answer))
        return m_exitCode;
    const QVariantList entries = answer.result.toList();
    for (const QVariant& entry : entries) {
        const QVariantMap fields = entry.toMap();
        const QString note = fields.value(FIELD_NOTE).toString();
        say(QStringLiteral("   %1  %2  by %3%4")
                .arg(fields.value(FIELD_TIME).toString(),
                     fields.value(FIELD_STATE).toString().leftJustified(10),
                     fields.value(FIELD_USER).toString(),
                     note.isEmpty() ? QString() : QStringLiteral(": ") + note));
    }

    step(QStringLiteral("GetAlarmHistoryForExport: the same history, as an export asks for it"));
    if (!request(METHOD_GET_ALARM_HISTORY_FOR_EXPORT, QVariantMap{{ARG_ALARM_ID, first}}, &answer))
        return m_exitCode;
    say(answer.result.toList() == entries
            ? QStringLiteral("%1 entries, the same as above").arg(entries.size())
            : QStringLiteral("%1 entries, which differ from the above!").arg(entries.size()));

    step(QStringLiteral("MuteAlarm: %1 muted for 300 s; no answer comes back").arg(third));
    m_cli.session().send(METHOD_MUTE_ALARM, QVariantMap{{ARG_ALARM_ID_LIST, QStringList{third}},
                                                        {ARG_IS_MUTE, true},
                                                        {ARG_MUTE_TIME_SECOND, 300}});
    m_cli.host().tunnelClient().waitForIdle(m_cli.timeoutMs());
    say(QStringLiteral("sent; asking for the unhandled alarms again:"));
    if (!request(METHOD_QUERY_UNHANDLED_ALARM, unhandledArgs, &answer))
        return m_exitCode;
    const QVariantList after = AnswerFormat::alarms(answer, false);
    const QVariantMap muted = findAlarm(after, third);
    say(QStringLiteral("%1 unhandled alarm(s) now; %2 and %3 have left the list")
            .arg(after.size())
            .arg(first, second));
    say(QStringLiteral("%1: Muted=%2, MuteUntil=%3")
            .arg(third, muted.value(FIELD_MUTED).toString(),
                 muted.value(FIELD_MUTE_UNTIL).toString()));

    m_cli.session().unsubscribe(key);
    m_cli.printOut(QByteArrayLiteral("\nDone: all six request methods answered as shown.\n"));
    return Cli::ExitOk;
}

} // namespace

namespace Commands {

int demo(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Walks through all six request methods against a fresh in-memory server seeded with "
        "demo alarms, showing each answer and event. Leaves no data behind."));
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!cli.embeddedServerDefault())
        return cli.usageError(QStringLiteral("demo runs its own in-memory server; --server, --db, "
                                             "--memory and --seed-count do not apply to it"));
    DemoScript script(cli);
    return script.run();
}

} // namespace Commands
