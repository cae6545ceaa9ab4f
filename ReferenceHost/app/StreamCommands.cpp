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

// Reads the request on line lineNumber of input into request; false with exitCode set when the
// line is too long or no valid request, and with request->method empty for a blank line.
bool readRequestLine(Cli& cli, QFile& input, int lineNumber, BatchRequest* request, int* exitCode)
{
    QByteArray line = input.readLine(AlarmSearchLimits::MaxRequestLineBytes + 2);
    if (line.size() > AlarmSearchLimits::MaxRequestLineBytes) {
        *exitCode = cli.usageError(QStringLiteral("line %1: longer than %2 bytes")
                                       .arg(lineNumber)
                                       .arg(AlarmSearchLimits::MaxRequestLineBytes));
        return false;
    }
    line = line.trimmed();
    *request = BatchRequest();
    if (line.isEmpty())
        return true;
    QJsonParseError parseError;
    const QJsonDocument document = QJsonDocument::fromJson(line, &parseError);
    QString error;
    if (parseError.error != QJsonParseError::NoError)
        error = QStringLiteral("bad JSON: %1").arg(parseError.errorString());
    else if (!document.isObject())
        error = QStringLiteral("a request is a JSON object");
    else if (BatchRequest::read(document.object(), QDateTime::currentDateTimeUtc(), cli.timeZone(),
                                request, &error))
        return true;
    *exitCode = cli.usageError(QStringLiteral("line %1: %2").arg(lineNumber).arg(error));
    return false;
}

// Sends a MuteAlarm line, which gets no answer, and waits until it is carried out: later lines
// must see it.
bool sendMute(Cli& cli, const BatchRequest& request, int lineNumber, int* exitCode)
{
    cli.session().send(request.method, request.args);
    if (!cli.session().waitForIdle(cli.timeoutMs())) {
        *exitCode = cli.fail(QStringLiteral("line %1: %2 not delivered in time")
                                 .arg(lineNumber)
                                 .arg(request.method));
        return false;
    }
    cli.printOut(AnswerFormat::jsonLine(
        QJsonObject{{QStringLiteral("method"), request.method}, {QStringLiteral("sent"), true}},
        cli.pretty()));
    return true;
}

// Prints every answer of one request line; ok becomes false when one of them is a failure.
bool answerRequest(Cli& cli, const BatchRequest& request, int lineNumber, bool* ok, int* exitCode)
{
    const QString& method = request.method;
    if (method == METHOD_MUTE_ALARM)
        return sendMute(cli, request, lineNumber, exitCode);
    if (method == METHOD_QUERY_ALARM_LIST || method == METHOD_QUERY_UNHANDLED_ALARM)
        return answerSearch(cli, request, ok, exitCode);
    QList<PluginAnswer> answers;
    if (!cli.call(method, request.args, &answers, exitCode))
        return false;
    for (const PluginAnswer& answer : std::as_const(answers)) {
        cli.printAnswer(method, answer);
        *ok = *ok && answer.resultCode == QLatin1String("0");
    }
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
        BatchRequest request;
        if (!readRequestLine(cli, input, lineNumber, &request, &exitCode))
            return exitCode;
        if (!request.method.isEmpty() &&
            !answerRequest(cli, request, lineNumber, &allOk, &exitCode))
            return exitCode;
    }
    cli.session().unsubscribe(key);
    return allOk ? Cli::ExitOk : Cli::ExitFailed;
}

} // namespace Commands
