#include "Cli.h"
#include "Commands.h"
#include "OutputFile.h"
#include "Search.h"
#include "Terminal.h"

#include <AlarmFields.h>
#include <AlarmSearchLimits.h>
#include <AnswerFormat.h>
#include <EventCatalog.h>
#include <ExportWriter.h>
#include <SearchWriter.h>

#include <PluginAlarmSearchCommon.h>

#include <QDateTime>
#include <QThreadPool>
#include <QWaitCondition>

#include <atomic>
#include <vector>

using namespace PluginAlarmSearchCommon;

namespace {

// History requests an export keeps in flight at once.
const int kHistoryRequestsInFlight = 8;
// Output is handed to the file in pieces of about this size.
const qsizetype kWriteChunk = 1 << 16;

const QCommandLineOption kOutputOption({QStringLiteral("o"), QStringLiteral("output")},
                                       QStringLiteral("File to write (default: standard output); "
                                                      "written under a temporary name and renamed "
                                                      "when complete."),
                                       QStringLiteral("file"));

// Builds the search from the filter options and opens the host. On failure *exitCode holds the
// code to exit with.
bool prepareSearch(Cli& cli, const QCommandLineParser& parser, QString* method, QVariantMap* args,
                   int* exitCode)
{
    const QueryFilter filter = cli.readFilter(parser);
    QString error;
    if (!QueryArguments::build(filter, QDateTime::currentDateTimeUtc(), args, &error)) {
        *exitCode = cli.usageError(error);
        return false;
    }
    *method = QueryArguments::method(filter);
    return cli.openHost(exitCode);
}

// Fetches the change histories of the alarms of a search with a bounded number of requests in
// flight, and hands each alarm on with its history in the search's order. The histories of a
// page are fetched while the next page is searched for; at most two pages are held.
class HistoryFetcher
{
public:
    using Writer = std::function<bool(const ExportedAlarm& exported, QString* errorMessage)>;

    HistoryFetcher(Cli& cli, Writer write) : m_cli(cli), m_write(std::move(write))
    {
        m_pool.setMaxThreadCount(kHistoryRequestsInFlight);
    }
    ~HistoryFetcher()
    {
        m_stop = true;
        m_pool.waitForDone();
    }

    // Writes the alarms of the page started before, then starts fetching this page's histories.
    bool addPage(const QVariantList& alarms, QString* errorMessage)
    {
        if (!writePage(errorMessage))
            return false;
        m_page = alarms;
        m_results = std::vector<Slot>(size_t(alarms.size()));
        for (size_t i = 0; i < m_results.size(); ++i) {
            const QString id = alarms[qsizetype(i)].toMap().value(FIELD_ALARM_ID).toString();
            m_pool.start([this, i, id] {
                Slot result;
                if (!m_stop)
                    result.ok = fetch(id, &result.history, &result.error);
                QMutexLocker locker(&m_mutex);
                m_results[i] = std::move(result);
                m_results[i].done = true;
                // The writer waits for one alarm at a time; the others it finds done.
                if (i == m_awaited)
                    m_done.wakeOne();
            });
        }
        return true;
    }

    // Writes the alarms of the last page started, in order, as their histories arrive.
    bool writePage(QString* errorMessage)
    {
        bool ok = true;
        for (size_t i = 0; ok && i < m_results.size(); ++i) {
            Slot slot;
            {
                QMutexLocker locker(&m_mutex);
                m_awaited = i;
                while (!m_results[i].done)
                    m_done.wait(&m_mutex);
                slot = std::move(m_results[i]);
            }
            if (interrupted()) {
                *errorMessage = QStringLiteral("interrupted");
                ok = false;
            } else if (!slot.ok) {
                *errorMessage = slot.error;
                ok = false;
            } else {
                ok = m_write(ExportedAlarm{m_page[qsizetype(i)].toMap(), slot.history},
                             errorMessage);
            }
        }
        m_stop = !ok;
        m_pool.waitForDone();
        m_results.clear();
        m_page.clear();
        return ok;
    }

private:
    struct Slot
    {
        bool done = false;
        bool ok = false;
        QVariantList history;
        QString error;
    };

    bool fetch(const QString& id, QVariantList* history, QString* errorMessage)
    {
        QList<PluginAnswer> answers;
        if (!m_cli.session().call(METHOD_GET_ALARM_HISTORY_FOR_EXPORT,
                                  QVariantMap{{ARG_ALARM_ID, id}}, m_cli.timeoutMs(), &answers,
                                  errorMessage))
            return false;
        if (answers.constLast().resultCode != QLatin1String("0")) {
            *errorMessage = QStringLiteral("%1 (alarm %2)")
                                .arg(m_cli.answerError(METHOD_GET_ALARM_HISTORY_FOR_EXPORT,
                                                       answers.constLast()),
                                     id);
            return false;
        }
        *history = answers.constLast().result.toList();
        return true;
    }

    Cli& m_cli;
    Writer m_write;
    QVariantList m_page;
    std::vector<Slot> m_results;
    size_t m_awaited = 0; // the slot writePage waits for, under m_mutex
    std::atomic<bool> m_stop{false};
    QMutex m_mutex;
    QWaitCondition m_done;
    QThreadPool m_pool; // last: destroyed first, once its tasks are done with the members above
};

} // namespace

namespace Commands {

int query(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(
        QStringLiteral(
            "Searches alarms, newest first. The server returns at most %1 alarms per search; a "
            "search that comes back full is marked \"truncated\": true and said so on standard "
            "error. --all walks back through older time windows until every match is found, "
            "writing each page as it arrives.")
            .arg(AlarmSearchLimits::MaxRecords));
    Cli::addFilterOptions(
        parser, QStringLiteral("Fetch every match, past the server's %1 alarms per search.")
                    .arg(AlarmSearchLimits::MaxRecords));
    parser.addOptions({{QStringLiteral("format"),
                        QStringLiteral("json (one answer object), jsonl (one alarm per line) or "
                                       "table (default on a terminal)."),
                        QStringLiteral("format")},
                       kOutputOption});
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!parser.positionalArguments().isEmpty())
        return cli.usageError(QStringLiteral("query takes no arguments, only options"));
    const QString fileName = parser.value(kOutputOption);
    const bool toTerminal = fileName.isEmpty() && isTerminal(stdout);
    const QString formatName = parser.isSet(QStringLiteral("format"))
                                   ? parser.value(QStringLiteral("format"))
                                   : QString::fromLatin1(toTerminal ? "table" : "json");
    const std::optional<SearchWriter::Format> format = SearchWriter::formatNamed(formatName);
    if (!format)
        return cli.usageError(
            QStringLiteral("--format is json, jsonl or table, not \"%1\"").arg(formatName));

    QString method;
    QVariantMap args;
    if (!prepareSearch(cli, parser, &method, &args, &exitCode))
        return exitCode;
    OutputFile output;
    QString error;
    if (!output.open(fileName, &error))
        return cli.fail(error);
    SearchWriter::Options options;
    options.format = *format;
    options.method = method;
    options.pretty = cli.pretty();
    options.zone = cli.timeZone();
    options.tableWidth = fileName.isEmpty() ? terminalWidth() : 0;
    SearchWriter writer(options);
    catchInterrupts();
    qint64 count = 0;
    bool truncated = false;
    {
        ProgressBar progress(QStringLiteral("alarms"), -1, !output.isTerminal());
        const AlarmPager::PageSink sink = [&](const QVariantList& page, QString* sinkError) {
            if (interrupted()) {
                *sinkError = QStringLiteral("interrupted");
                return false;
            }
            count += page.size();
            progress.advance(page.size());
            return output.write(writer.page(page), sinkError);
        };
        if (!runSearch(cli, method, args, parser.isSet(QStringLiteral("all")), sink, &truncated,
                       &exitCode))
            return exitCode;
    }
    if (!output.write(writer.finish(truncated), &error) || !output.commit(&error))
        return cli.fail(error);
    if (*format == SearchWriter::Format::Table)
        cli.printNote(QStringLiteral("%1 alarm(s)").arg(count));
    return Cli::ExitOk;
}

int exportAlarms(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Searches alarms, walking back through every time window of the range, then fetches the "
        "change history of every alarm found (GetAlarmHistoryForExport) and writes both as CSV "
        "or JSON. The output is complete or the command fails: a file named with -o appears "
        "only when everything was written."));
    Cli::addFilterOptions(parser, QStringLiteral("Accepted for symmetry with query; export always "
                                                 "fetches every match."));
    parser.addOptions({
        {QStringLiteral("format"), QStringLiteral("csv (default) or json."),
         QStringLiteral("format"), QStringLiteral("csv")},
        kOutputOption,
        {QStringLiteral("raw"),
         QStringLiteral("CSV: write cells as they are; by default a cell starting with =, +, -, "
                        "@, tab or carriage return gets a leading ' so that spreadsheets do not "
                        "run it as a formula.")},
        {QStringLiteral("bom"),
         QStringLiteral("CSV: start with a UTF-8 byte order mark, for spreadsheet programs that "
                        "need one.")},
    });
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!parser.positionalArguments().isEmpty())
        return cli.usageError(QStringLiteral("export takes no arguments, only options"));
    ExportWriter::Options options;
    const QString format = parser.value(QStringLiteral("format"));
    if (format != QLatin1String("csv") && format != QLatin1String("json"))
        return cli.usageError(QStringLiteral("--format is csv or json, not \"%1\"").arg(format));
    options.json = format == QLatin1String("json");
    options.raw = parser.isSet(QStringLiteral("raw"));
    options.byteOrderMark = parser.isSet(QStringLiteral("bom"));
    if (options.json && (options.raw || options.byteOrderMark))
        return cli.usageError(QStringLiteral("--raw and --bom apply to CSV only"));
    options.pretty = cli.pretty();
    options.zone = cli.timeZone();

    QString method;
    QVariantMap args;
    if (!prepareSearch(cli, parser, &method, &args, &exitCode))
        return exitCode;
    OutputFile output;
    QString error;
    if (!output.open(parser.value(kOutputOption), &error))
        return cli.fail(error);
    ExportWriter writer(options);
    if (!output.write(writer.begin(), &error))
        return cli.fail(error);

    catchInterrupts();
    qint64 exported = 0;
    bool truncated = false;
    {
        ProgressBar progress(QStringLiteral("exported"), -1, !output.isTerminal());
        QByteArray chunk;
        HistoryFetcher fetcher(cli, [&](const ExportedAlarm& alarm, QString* writeError) {
            chunk += writer.alarm(alarm);
            ++exported;
            progress.advance();
            if (chunk.size() < kWriteChunk)
                return true;
            const QByteArray bytes = std::exchange(chunk, QByteArray());
            return output.write(bytes, writeError);
        });
        const AlarmPager::PageSink sink = [&](const QVariantList& page, QString* sinkError) {
            return fetcher.addPage(page, sinkError);
        };
        if (!runSearch(cli, method, args, true, sink, &truncated, &exitCode))
            return exitCode;
        if (!fetcher.writePage(&error) || !output.write(chunk, &error))
            return cli.fail(error);
    }
    if (truncated)
        return cli.fail(QStringLiteral("export incomplete, nothing written: the range holds "
                                       "more alarms in one second than a search returns"));
    if (!output.write(writer.end(), &error) || !output.commit(&error))
        return cli.fail(error);
    cli.printNote(QStringLiteral("exported %1 alarm(s)").arg(exported));
    return Cli::ExitOk;
}

int classes(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Lists the event classes that --event takes, with their group (for --events) and their "
        "sub-events (CLASS:SUBEVENT). Names are matched ignoring letter case."));
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!parser.positionalArguments().isEmpty())
        return cli.usageError(QStringLiteral("classes takes no arguments"));
    cli.printOut(EventCatalog::listing().toUtf8());
    return Cli::ExitOk;
}

} // namespace Commands
