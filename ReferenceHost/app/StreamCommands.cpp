#include "Cli.h"
#include "Commands.h"
#include "Search.h"
#include "Terminal.h"

#include <AlarmSearchLimits.h>

#include <AnswerFormat.h>
#include <BatchRequest.h>
#include <HostTunnelClient.h>

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QCoreApplication>
#include <QDateTime>
#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>
#include <QWaitCondition>

using namespace PluginAlarmSearchCommon;

namespace {

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

// Answers a search line: one search, or with "all" every time window; either way one answer
// carrying "truncated", true when matches may be missing.
bool answerSearch(Cli& cli, const BatchRequest& request, bool* ok, int* exitCode)
{
    PluginAnswer answer;
    bool truncated = false;
    if (request.all) {
        QVariantList alarms;
        const AlarmPager::PageSink collect = [&alarms](const QVariantList& page, QString*) {
            alarms += page;
            return true;
        };
        if (!runSearch(cli, request.method, request.args, true, collect, &truncated, exitCode))
            return false;
        answer = PluginAnswer{true, QStringLiteral("0"), QString(),
                              QVariantMap{{ARG_QUERY_RESULT, alarms},
                                          {ARG_RELAY_PATH, request.args.value(ARG_RELAY_PATH)}}};
    } else {
        QList<PluginAnswer> answers;
        if (!cli.call(request.method, request.args, &answers, exitCode))
            return false;
        answer = answers.constLast();
        truncated = AnswerFormat::alarms(answer, false).size() >= AlarmSearchLimits::MaxRecords;
    }
    QJsonObject object = AnswerFormat::answerObject(request.method, answer, cli.keepXml());
    object.insert(QStringLiteral("truncated"), truncated);
    cli.printOut(AnswerFormat::jsonLine(object, cli.pretty()));
    *ok = *ok && answer.resultCode == QLatin1String("0");
    return true;
}

} // namespace

namespace Commands {

int events(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Subscribes to AlarmUpdated and prints each event as a JSON line until Ctrl-C. Events "
        "are published by the plug-in of this host, after updates made through it; with --host, "
        "by the server's, after the updates of every operator."));
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
    QString error;
    if (!cli.session().subscribe(
            key, EVENT_ALARM_UPDATED,
            [&](const PluginObjBase_EventSignalInfo& info) {
                print(info);
                QMutexLocker locker(&mutex);
                ++received;
                arrived.wakeAll();
            },
            &error))
        return cli.fail(error);
    catchInterrupts();
    cli.printNote(QStringLiteral("waiting for %1 events; Ctrl-C to stop").arg(EVENT_ALARM_UPDATED));
    {
        QMutexLocker locker(&mutex);
        // Short waits, so that a signal is noticed soon.
        while (!interrupted() && (count == 0 || received < count))
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
        "\"args\": {...}}, and prints one JSON line per answer. Unknown keys and values of the "
        "wrong type are refused; the README lists the keys of each method. Searches take "
        "\"all\": true to walk every time window, and their answers carry \"truncated\". "
        "MuteAlarm, which gets no answer, prints {\"method\": \"MuteAlarm\", \"sent\": true}. "
        "Stops at the first line that is no valid request."));
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
        BatchRequest request;
        QString error;
        if (!document.isObject())
            return cli.usageError(
                QStringLiteral("line %1: a request is a JSON object").arg(lineNumber));
        if (!BatchRequest::read(document.object(), QDateTime::currentDateTimeUtc(), cli.timeZone(),
                                &request, &error))
            return cli.usageError(QStringLiteral("line %1: %2").arg(lineNumber).arg(error));
        const QString& method = request.method;
        if (method == METHOD_MUTE_ALARM) {
            cli.session().send(method, request.args);
            // Later lines must see the mute carried out.
            if (!cli.session().waitForIdle(cli.timeoutMs()))
                return cli.fail(
                    QStringLiteral("line %1: MuteAlarm not delivered in time").arg(lineNumber));
            cli.printOut(AnswerFormat::jsonLine(
                QJsonObject{{QStringLiteral("method"), method}, {QStringLiteral("sent"), true}},
                cli.pretty()));
            continue;
        }
        if (method == METHOD_QUERY_ALARM_LIST || method == METHOD_QUERY_UNHANDLED_ALARM) {
            if (!answerSearch(cli, request, &allOk, &exitCode))
                return exitCode;
            continue;
        }
        QList<PluginAnswer> answers;
        if (!cli.call(method, request.args, &answers, &exitCode))
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
