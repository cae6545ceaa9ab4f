#include "Cli.h"
#include "Commands.h"
#include "OutputFile.h"
#include "Search.h"
#include "Terminal.h"

#include <AnswerFormat.h>
#include <EventCatalog.h>
#include <ExportWriter.h>
#include <SearchWriter.h>

#include <PluginAlarmSearchCommon.h>

#include <QDateTime>
#include <QDeadlineTimer>
#include <QMutex>
#include <QWaitCondition>

#include <memory>
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
// page are fetched while the next page is searched for; at most two pages are held. Requests
// are sent without a thread waiting for each: as one is answered, its callback sends the next.
class HistoryFetcher
{
public:
    using Writer = std::function<bool(const ExportedAlarm& exported, QString* errorMessage)>;

    HistoryFetcher(Cli& cli, Writer write)
        : m_cli(cli), m_write(std::move(write)), m_state(std::make_shared<State>())
    {
    }
    // Waits for the requests in flight, up to the time limit of one request.
    ~HistoryFetcher()
    {
        QMutexLocker locker(&m_state->mutex);
        m_state->stop = true;
        QDeadlineTimer deadline(m_cli.timeoutMs());
        while (m_state->inFlight > 0 && m_state->changed.wait(&m_state->mutex, deadline)) {
        }
    }

    // Writes the alarms of the page started before, then starts fetching this page's histories.
    bool addPage(const QVariantList& alarms, QString* errorMessage)
    {
        if (!writePage(errorMessage))
            return false;
        m_page = alarms;
        {
            QMutexLocker locker(&m_state->mutex);
            m_state->ids.clear();
            for (const QVariant& alarm : alarms)
                m_state->ids.append(alarm.toMap().value(QStringLiteral("AlarmID")).toString());
            m_state->results = std::vector<Slot>(size_t(alarms.size()));
            m_state->next = 0;
        }
        sendMore(m_state, m_cli.session(), m_cli.timeoutMs());
        return true;
    }

    // Writes the alarms of the last page started, in order, as their histories arrive.
    bool writePage(QString* errorMessage)
    {
        bool ok = true;
        for (qsizetype i = 0; ok && i < m_page.size(); ++i) {
            Slot slot;
            {
                QMutexLocker locker(&m_state->mutex);
                m_state->awaited = i;
                QDeadlineTimer deadline(m_cli.timeoutMs());
                while (!m_state->results[size_t(i)].done &&
                       m_state->changed.wait(&m_state->mutex, deadline)) {
                }
                slot = std::move(m_state->results[size_t(i)]);
                m_state->stop = m_state->stop || !slot.done;
            }
            const QString id = m_page[i].toMap().value(QStringLiteral("AlarmID")).toString();
            if (interrupted()) {
                *errorMessage = QStringLiteral("interrupted");
                ok = false;
            } else if (!slot.done) {
                *errorMessage = QStringLiteral("no answer to %1 within %2 s (alarm %3)")
                                    .arg(METHOD_GET_ALARM_HISTORY_FOR_EXPORT)
                                    .arg(m_cli.timeoutMs() / 1000.0)
                                    .arg(id);
                ok = false;
            } else if (!slot.ok) {
                *errorMessage = slot.error;
                ok = false;
            } else if (slot.answer.resultCode != QLatin1String("0")) {
                *errorMessage =
                    QStringLiteral("%1 (alarm %2)")
                        .arg(m_cli.answerError(METHOD_GET_ALARM_HISTORY_FOR_EXPORT, slot.answer),
                             id);
                ok = false;
            } else {
                ok = m_write(ExportedAlarm{m_page[i].toMap(), slot.answer.result.toList()},
                             errorMessage);
            }
        }
        if (!ok) {
            QMutexLocker locker(&m_state->mutex);
            m_state->stop = true;
        }
        m_page.clear();
        return ok;
    }

private:
    struct Slot
    {
        bool done = false;
        bool ok = false;
        PluginAnswer answer; // the last one
        QString error;
    };

    // What the requests' callbacks share with the writer; they keep it alive past a time-out.
    struct State
    {
        QMutex mutex;
        QWaitCondition changed; // a slot the writer waits for is done, or the last one in flight
        QStringList ids;        // of the page being fetched
        std::vector<Slot> results;
        qsizetype next = 0; // the next id to send a request for
        int inFlight = 0;
        qsizetype awaited = 0; // the slot writePage waits for
        bool stop = false;
    };

    // Sends requests for the page's next ids while fewer than kHistoryRequestsInFlight are out.
    static void sendMore(const std::shared_ptr<State>& state, ClientSession& session, int timeoutMs)
    {
        for (;;) {
            qsizetype i = 0;
            QString id;
            {
                QMutexLocker locker(&state->mutex);
                if (state->stop || state->inFlight == kHistoryRequestsInFlight ||
                    state->next == state->ids.size())
                    return;
                i = state->next++;
                id = state->ids[i];
                ++state->inFlight;
            }
            session.callAsync(
                METHOD_GET_ALARM_HISTORY_FOR_EXPORT, QVariantMap{{ARG_ALARM_ID, id}}, timeoutMs,
                [state, &session, timeoutMs, i](bool ok, const QList<PluginAnswer>& answers,
                                                const QString& error) {
                    {
                        QMutexLocker locker(&state->mutex);
                        Slot& slot = state->results[size_t(i)];
                        slot.done = true;
                        slot.ok = ok && !answers.isEmpty();
                        slot.answer = answers.isEmpty() ? PluginAnswer() : answers.constLast();
                        slot.error = error;
                        // A failed request ends the export: no more are sent.
                        state->stop =
                            state->stop || !slot.ok || slot.answer.resultCode != QLatin1String("0");
                        --state->inFlight;
                        if (i == state->awaited || state->inFlight == 0)
                            state->changed.wakeAll();
                    }
                    sendMore(state, session, timeoutMs);
                });
        }
    }

    Cli& m_cli;
    Writer m_write;
    QVariantList m_page;
    std::shared_ptr<State> m_state;
};

} // namespace

namespace Commands {

int query(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Searches alarms, newest first. The server returns at most 5000 alarms per search; a "
        "search that comes back full is marked \"truncated\": true and said so on standard "
        "error. --all walks back through older time windows until every match is found, "
        "writing each page as it arrives."));
    Cli::addFilterOptions(parser, QStringLiteral("Fetch every match, past the server's 5000 "
                                                 "alarms per search."));
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
