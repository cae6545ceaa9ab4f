#include "Cli.h"
#include "Commands.h"

#include <AlarmSearchLimits.h>

#include <AnswerFormat.h>
#include <HostTunnelClient.h>

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QCoreApplication>
#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>
#include <QWaitCondition>

#include <csignal>

using namespace PluginAlarmSearchCommon;

namespace {

volatile std::sig_atomic_t g_interrupted = 0;

extern "C" void onInterrupt(int)
{
    g_interrupted = 1;
}

QString subscriptionKey(const QString& purpose)
{
    return QStringLiteral("alarmsearch-%1-%2").arg(purpose).arg(QCoreApplication::applicationPid());
}

EventHub::Listener eventPrinter(Cli& cli)
{
    return [&cli](const PluginObjBase_EventSignalInfo& info) {
        cli.printOut(AnswerFormat::jsonLine(AnswerFormat::eventObject(info), cli.pretty()));
    };
}

} // namespace

namespace Commands {

int events(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Subscribes to AlarmUpdated and prints each event as a JSON line until Ctrl-C. Events "
        "are published by the plug-in of this host, after updates made through it."));
    parser.addOption(
        {QStringLiteral("count"), QStringLiteral("Stop after n events."), QStringLiteral("n")});
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    int count = 0;
    if (parser.isSet(QStringLiteral("count"))) {
        bool ok = false;
        count = parser.value(QStringLiteral("count")).toInt(&ok);
        if (!ok || count <= 0)
            return cli.usageError(QStringLiteral("--count needs a positive number"));
    }
    if (!cli.openHost(&exitCode))
        return exitCode;

    QMutex mutex;
    QWaitCondition arrived;
    int received = 0;
    const EventHub::Listener print = eventPrinter(cli);
    const QString key = subscriptionKey(QStringLiteral("events"));
    cli.session().subscribe(key, EVENT_ALARM_UPDATED,
                            [&](const PluginObjBase_EventSignalInfo& info) {
                                print(info);
                                QMutexLocker locker(&mutex);
                                ++received;
                                arrived.wakeAll();
                            });
    std::signal(SIGINT, onInterrupt);
    std::signal(SIGTERM, onInterrupt);
    cli.printNote(QStringLiteral("waiting for %1 events; Ctrl-C to stop").arg(EVENT_ALARM_UPDATED));
    {
        QMutexLocker locker(&mutex);
        // Short waits, so that a signal is noticed soon.
        while (!g_interrupted && (count == 0 || received < count))
            arrived.wait(&mutex, 200);
    }
    cli.session().unsubscribe(key);
    return Cli::ExitOk;
}

int batch(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Reads one request per line from standard input, {\"method\": \"QryAlarmList\", "
        "\"args\": {...}}, and prints one JSON line per answer. MuteAlarm, which gets no "
        "answer, prints {\"method\": \"MuteAlarm\", \"sent\": true}. Stops at the first line "
        "that is no request."));
    parser.addOption({QStringLiteral("events"),
                      QStringLiteral("Also print the AlarmUpdated events of the updates.")});
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!cli.openHost(&exitCode))
        return exitCode;
    const QString key = subscriptionKey(QStringLiteral("batch"));
    if (parser.isSet(QStringLiteral("events")))
        cli.session().subscribe(key, EVENT_ALARM_UPDATED, eventPrinter(cli));

    static const QStringList methods{METHOD_QUERY_UNHANDLED_ALARM,
                                     METHOD_QUERY_ALARM_LIST,
                                     METHOD_UPDATE_ALARM,
                                     METHOD_GET_ALARM_HISTORY,
                                     METHOD_GET_ALARM_HISTORY_FOR_EXPORT,
                                     METHOD_MUTE_ALARM};
    QFile input;
    if (!input.open(stdin, QIODevice::ReadOnly))
        return cli.fail(QStringLiteral("cannot read standard input"));
    bool allOk = true;
    for (int lineNumber = 1; !input.atEnd(); ++lineNumber) {
        QByteArray line = input.readLine(AlarmSearchLimits::MaxRequestLineBytes + 2);
        if (line.size() > AlarmSearchLimits::MaxRequestLineBytes)
            return cli.usageError(QStringLiteral("line %1: longer than %2 bytes")
                                      .arg(lineNumber)
                                      .arg(AlarmSearchLimits::MaxRequestLineBytes));
        line = line.trimmed();
        if (line.isEmpty())
            continue;
        QJsonParseError parseError;
        const QJsonDocument document = QJsonDocument::fromJson(line, &parseError);
        if (parseError.error != QJsonParseError::NoError)
            return cli.usageError(QStringLiteral("line %1: bad JSON: %2")
                                      .arg(lineNumber)
                                      .arg(parseError.errorString()));
        const QJsonObject request = document.object();
        const QString method = request.value(QLatin1String("method")).toString();
        const QJsonValue args = request.value(QLatin1String("args"));
        if (!document.isObject() || !methods.contains(method))
            return cli.usageError(QStringLiteral("line %1: \"method\" must be one of %2")
                                      .arg(lineNumber)
                                      .arg(methods.join(QLatin1String(", "))));
        if (!args.isObject() && !args.isUndefined())
            return cli.usageError(
                QStringLiteral("line %1: \"args\" must be an object").arg(lineNumber));

        const QVariantMap argMap = args.toObject().toVariantMap();
        if (method == METHOD_MUTE_ALARM) {
            cli.session().send(method, argMap);
            // Later lines must see the mute carried out.
            if (!cli.host().tunnelClient().waitForIdle(cli.timeoutMs()))
                return cli.fail(
                    QStringLiteral("line %1: MuteAlarm not delivered in time").arg(lineNumber));
            cli.printOut(AnswerFormat::jsonLine(
                QJsonObject{{QStringLiteral("method"), method}, {QStringLiteral("sent"), true}},
                cli.pretty()));
            continue;
        }
        QList<PluginAnswer> answers;
        if (!cli.call(method, argMap, &answers, &exitCode))
            return exitCode;
        for (const PluginAnswer& answer : std::as_const(answers)) {
            cli.printAnswer(method, answer);
            allOk = allOk && answer.resultCode == QLatin1String("0");
        }
    }
    cli.session().unsubscribe(key);
    return allOk ? Cli::ExitOk : Cli::ExitFailed;
}

} // namespace Commands
