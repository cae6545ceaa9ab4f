#include "Cli.h"
#include "Commands.h"
#include "Terminal.h"

#include <AlarmTable.h>

#include <AnswerFormat.h>
#include <HostTunnelClient.h>
#include <TimeArgument.h>

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QDateTime>
#include <QMutex>

using namespace PluginAlarmSearchCommon;

namespace {

const int kDemoAlarms = 2000;
const int kRowsShown = 5;
const int kMuteSeconds = 300;
const QString kSubscriber = QStringLiteral("demo-subscriber");

// The scripted walk: each step sends one request and tells in plain words what came back.
class DemoScript
{
public:
    explicit DemoScript(Cli& cli) : m_cli(cli) {}
    int run();

private:
    bool openSeededHost();
    void subscribe();
    bool showUnhandled();
    bool showCameraAlarms();
    bool updateFirstTwo();
    bool showHistory();
    bool showHistoryForExport();
    bool muteThird();
    bool checkUnhandledAfterwards();

    void step(const QString& title);
    void say(const QString& text);
    bool failWith(const QString& message);
    bool request(const QString& method, const QVariantMap& args, PluginAnswer* answer);
    bool queryUnhandled(QVariantList* alarms);
    void showAlarms(const QVariantList& alarms);

    Cli& m_cli;
    int m_step = 0;
    int m_exitCode = Cli::ExitOk;
    QString m_first;        // set to Processing, so no longer unhandled
    QString m_second;       // set to Processing along with m_first
    QString m_third;        // muted
    QVariantList m_history; // of m_first
    QMutex m_eventMutex;
    QStringList m_events;
};

int DemoScript::run()
{
    if (!openSeededHost())
        return m_exitCode;
    subscribe();
    if (!showUnhandled() || !showCameraAlarms() || !updateFirstTwo() || !showHistory() ||
        !showHistoryForExport() || !muteThird() || !checkUnhandledAfterwards())
        return m_exitCode;
    m_cli.session().unsubscribe(kSubscriber);
    m_cli.printOut(QByteArrayLiteral("\nDone: all six request methods answered as shown.\n"));
    return Cli::ExitOk;
}

bool DemoScript::openSeededHost()
{
    ReferenceHost::Options options;
    options.pluginPath = m_cli.pluginPath();
    options.embedded.databasePath = QStringLiteral(":memory:");
    options.embedded.seedCount = kDemoAlarms;
    options.embedded.seedEnd = QDateTime::currentDateTimeUtc();
    if (!m_cli.openHost(options, &m_exitCode))
        return false;
    m_cli.printOut(QStringLiteral("Plug-in loaded from %1.\nEmbedded alarm server in memory, "
                                  "seeded with %2 demo alarms of the last 30 days.\n")
                       .arg(options.pluginPath)
                       .arg(kDemoAlarms)
                       .toUtf8());
    return true;
}

void DemoScript::subscribe()
{
    m_cli.session().subscribe(
        kSubscriber, EVENT_ALARM_UPDATED, [this](const PluginObjBase_EventSignalInfo& info) {
            QMutexLocker locker(&m_eventMutex);
            m_events.append(
                QString::fromUtf8(AnswerFormat::jsonLine(AnswerFormat::eventObject(info), false))
                    .trimmed());
        });
}

// Shows the unhandled alarms and picks the three newest for the steps that change alarms.
bool DemoScript::showUnhandled()
{
    step(QStringLiteral("QryUnhandledAlarm: the unhandled alarms, newest first"));
    QVariantList unhandled;
    if (!queryUnhandled(&unhandled))
        return false;
    say(QStringLiteral("%1 unhandled alarm(s):").arg(unhandled.size()));
    showAlarms(unhandled);
    if (unhandled.size() < 3)
        return failWith(QStringLiteral("the demo needs at least three unhandled alarms"));
    m_first = unhandled[0].toMap().value(FIELD_ALARM_ID).toString();
    m_second = unhandled[1].toMap().value(FIELD_ALARM_ID).toString();
    m_third = unhandled[2].toMap().value(FIELD_ALARM_ID).toString();
    return true;
}

bool DemoScript::showCameraAlarms()
{
    step(QStringLiteral("QryAlarmList: camera alarms of the last 7 days, in any state"));
    const QVariantMap args{
        {ARG_TRIGGER_EVENT_FILTER, CAMERA_TRIGGER_EVENT_FILTER_STRING},
        {ARG_START_TIME, TimeArgument::toServerTime(QDateTime::currentDateTimeUtc().addDays(-7))}};
    PluginAnswer answer;
    if (!request(METHOD_QUERY_ALARM_LIST, args, &answer))
        return false;
    const QVariantList camera = AnswerFormat::alarms(answer, false);
    say(QStringLiteral("%1 camera alarm(s):").arg(camera.size()));
    showAlarms(camera);
    return true;
}

bool DemoScript::updateFirstTwo()
{
    step(QStringLiteral("UpdateAlarm: %1 and %2 become %3, with a note")
             .arg(m_first, m_second, STATE_PROCESSING));
    PluginAnswer answer;
    if (!request(METHOD_UPDATE_ALARM,
                 QVariantMap{{ARG_ALARM_ID_LIST, QStringList{m_first, m_second}},
                             {ARG_ALARM_STATUS, STATE_PROCESSING},
                             {ARG_ALARM_COMMENT, QStringLiteral("Operator on the way")}},
                 &answer))
        return false;
    QMutexLocker locker(&m_eventMutex);
    say(QStringLiteral("subscriber \"%1\" got %2 event(s) before the answer:")
            .arg(kSubscriber)
            .arg(m_events.size()));
    for (const QString& event : std::as_const(m_events))
        say(QStringLiteral("   ") + event);
    return true;
}

bool DemoScript::showHistory()
{
    step(QStringLiteral("GetAlarmHistory: the change history of %1").arg(m_first));
    PluginAnswer answer;
    if (!request(METHOD_GET_ALARM_HISTORY, QVariantMap{{ARG_ALARM_ID, m_first}}, &answer))
        return false;
    m_history = answer.result.toList();
    for (const QVariant& entry : std::as_const(m_history)) {
        const QVariantMap fields = entry.toMap();
        const QString note = fields.value(FIELD_NOTE).toString();
        say(QStringLiteral("   %1  %2  by %3%4")
                .arg(fields.value(FIELD_TIME).toString(),
                     fields.value(FIELD_STATE).toString().leftJustified(10),
                     fields.value(FIELD_USER).toString(),
                     note.isEmpty() ? QString() : QStringLiteral(": ") + note));
    }
    return true;
}

bool DemoScript::showHistoryForExport()
{
    step(QStringLiteral("GetAlarmHistoryForExport: the same history, as an export asks for it"));
    PluginAnswer answer;
    if (!request(METHOD_GET_ALARM_HISTORY_FOR_EXPORT, QVariantMap{{ARG_ALARM_ID, m_first}},
                 &answer))
        return false;
    say(answer.result.toList() == m_history
            ? QStringLiteral("%1 entries, the same as above").arg(m_history.size())
            : QStringLiteral("%1 entries, which differ from the above!").arg(m_history.size()));
    return true;
}

bool DemoScript::muteThird()
{
    step(QStringLiteral("MuteAlarm: %1 muted for %2 s; no answer comes back")
             .arg(m_third)
             .arg(kMuteSeconds));
    m_cli.session().send(METHOD_MUTE_ALARM, QVariantMap{{ARG_ALARM_ID_LIST, QStringList{m_third}},
                                                        {ARG_IS_MUTE, true},
                                                        {ARG_MUTE_TIME_SECOND, kMuteSeconds}});
    m_cli.host().tunnelClient().waitForIdle(m_cli.timeoutMs());
    say(QStringLiteral("sent; asking for the unhandled alarms again:"));
    return true;
}

// The updated alarms must have left the unhandled list; the muted one is still in it.
bool DemoScript::checkUnhandledAfterwards()
{
    QVariantList after;
    if (!queryUnhandled(&after))
        return false;
    QVariantMap muted;
    QStringList stillUnhandled;
    for (const QVariant& alarm : std::as_const(after)) {
        const QVariantMap fields = alarm.toMap();
        const QString id = fields.value(FIELD_ALARM_ID).toString();
        if (id == m_first || id == m_second)
            stillUnhandled.append(id);
        else if (id == m_third)
            muted = fields;
    }
    if (!stillUnhandled.isEmpty())
        return failWith(QStringLiteral("%1 still unhandled after the update")
                            .arg(stillUnhandled.join(QLatin1String(" and "))));
    say(QStringLiteral("%1 unhandled alarm(s) now; %2 and %3 have left the list")
            .arg(after.size())
            .arg(m_first, m_second));
    say(QStringLiteral("%1: Muted=%2, MuteUntil=%3")
            .arg(m_third, muted.value(FIELD_MUTED).toString(),
                 muted.value(FIELD_MUTE_UNTIL).toString()));
    return true;
}

void DemoScript::step(const QString& title)
{
    m_cli.printOut(QStringLiteral("\n%1. %2\n").arg(++m_step).arg(title).toUtf8());
}

void DemoScript::say(const QString& text)
{
    m_cli.printOut((QStringLiteral("   ") + text + QLatin1Char('\n')).toUtf8());
}

bool DemoScript::failWith(const QString& message)
{
    m_exitCode = m_cli.fail(message);
    return false;
}

bool DemoScript::request(const QString& method, const QVariantMap& args, PluginAnswer* answer)
{
    QList<PluginAnswer> answers;
    if (!m_cli.call(method, args, &answers, &m_exitCode))
        return false;
    *answer = answers.constLast();
    say(QStringLiteral("-> %1 answered with result code %2").arg(method, answer->resultCode));
    if (answer->resultCode != QLatin1String("0"))
        return failWith(QStringLiteral("%1 failed").arg(method));
    return true;
}

bool DemoScript::queryUnhandled(QVariantList* alarms)
{
    PluginAnswer answer;
    if (!request(METHOD_QUERY_UNHANDLED_ALARM,
                 QVariantMap{{ARG_STATE_FILTER, QueryArguments::stateFilter({STATE_UNHANDLED})}},
                 &answer))
        return false;
    *alarms = AnswerFormat::alarms(answer, false);
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
