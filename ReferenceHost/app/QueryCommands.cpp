#include "Cli.h"
#include "Commands.h"
#include "Search.h"
#include "Terminal.h"

#include <AnswerFormat.h>
#include <ExportWriter.h>

#include <PluginAlarmSearchCommon.h>

#include <QDateTime>
#include <QFile>
#include <QSaveFile>

using namespace PluginAlarmSearchCommon;

namespace {

// Builds the search from the filter options, opens the host and runs it (every window with
// --all). On failure *exitCode holds the code to exit with.
bool searchAlarms(Cli& cli, const QCommandLineParser& parser, QString* method, QVariantList* alarms,
                  int* exitCode)
{
    const QueryFilter filter = Cli::readFilter(parser);
    QVariantMap args;
    QString error;
    if (!QueryArguments::build(filter, QDateTime::currentDateTimeUtc(), &args, &error)) {
        *exitCode = cli.usageError(error);
        return false;
    }
    *method = QueryArguments::method(filter);
    return cli.openHost(exitCode) &&
           runSearch(cli, *method, args, parser.isSet(QStringLiteral("all")), alarms, exitCode);
}

} // namespace

namespace Commands {

int query(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Searches alarms, newest first. The server returns at most 5000 alarms per search; "
        "--all walks back through older time windows until every match is found."));
    Cli::addFilterOptions(parser);
    parser.addOption({QStringLiteral("format"),
                      QStringLiteral("json (one object per answer) or table (default on a "
                                     "terminal)."),
                      QStringLiteral("format")});
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!parser.positionalArguments().isEmpty())
        return cli.usageError(QStringLiteral("query takes no arguments, only options"));
    const QString format = parser.isSet(QStringLiteral("format"))
                               ? parser.value(QStringLiteral("format"))
                               : QString::fromLatin1(isTerminal(stdout) ? "table" : "json");
    if (format != QLatin1String("json") && format != QLatin1String("table"))
        return cli.usageError(QStringLiteral("--format is json or table, not \"%1\"").arg(format));

    QString method;
    QVariantList alarms;
    if (!searchAlarms(cli, parser, &method, &alarms, &exitCode))
        return exitCode;

    if (format == QLatin1String("table")) {
        cli.printOut(AnswerFormat::alarmTable(alarms).toUtf8());
        cli.printNote(QStringLiteral("%1 alarm(s)").arg(alarms.size()));
    } else {
        const PluginAnswer answer{
            true, QStringLiteral("0"), QString(),
            QVariantMap{{ARG_QUERY_RESULT, alarms}, {ARG_RELAY_PATH, QString()}}};
        cli.printAnswer(method, answer);
    }
    return Cli::ExitOk;
}

int exportAlarms(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(
        QStringLiteral("Searches alarms, then fetches the change history of every alarm found "
                       "(GetAlarmHistoryForExport) and writes both as CSV or JSON."));
    Cli::addFilterOptions(parser);
    parser.addOptions({
        {QStringLiteral("format"), QStringLiteral("csv (default) or json."),
         QStringLiteral("format"), QStringLiteral("csv")},
        {{QStringLiteral("o"), QStringLiteral("output")},
         QStringLiteral("File to write (default: standard output)."),
         QStringLiteral("file")},
    });
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    const QString format = parser.value(QStringLiteral("format"));
    if (format != QLatin1String("csv") && format != QLatin1String("json"))
        return cli.usageError(QStringLiteral("--format is csv or json, not \"%1\"").arg(format));

    QString method;
    QVariantList alarms;
    if (!searchAlarms(cli, parser, &method, &alarms, &exitCode))
        return exitCode;

    QList<ExportedAlarm> exported;
    ProgressBar progress(int(alarms.size()));
    for (const QVariant& alarm : std::as_const(alarms)) {
        const QVariantMap fields = alarm.toMap();
        const QString id = fields.value(QStringLiteral("AlarmID")).toString();
        QList<PluginAnswer> answers;
        if (!cli.call(METHOD_GET_ALARM_HISTORY_FOR_EXPORT, QVariantMap{{ARG_ALARM_ID, id}},
                      &answers, &exitCode))
            return exitCode;
        if (answers.constLast().resultCode != QLatin1String("0"))
            return cli.fail(QStringLiteral("history of %1 failed with result code %2")
                                .arg(id, answers.constLast().resultCode));
        exported.append(ExportedAlarm{fields, answers.constLast().result.toList()});
        progress.advance();
    }

    const QByteArray bytes = format == QLatin1String("csv")
                                 ? ExportWriter::toCsv(exported)
                                 : ExportWriter::toJson(exported, cli.pretty());
    const QString fileName = parser.value(QStringLiteral("output"));
    if (fileName.isEmpty() || fileName == QLatin1String("-")) {
        cli.printOut(bytes);
    } else {
        QSaveFile file(fileName);
        if (!file.open(QIODevice::WriteOnly) || file.write(bytes) != bytes.size() || !file.commit())
            return cli.fail(
                QStringLiteral("cannot write %1: %2").arg(fileName, file.errorString()));
    }
    cli.printNote(QStringLiteral("exported %1 alarm(s)").arg(exported.size()));
    return Cli::ExitOk;
}

} // namespace Commands
