// Speed of the alarm-list reply read against one bare QXmlStreamReader pass over the same text,
// and of the other reply readers and the query composer. After the benchmarks it prints, per
// reply size, "reply-read ratio N: X" (fastest ReplyRead / fastest BareStreamReader of this
// run, in CPU time) with the cost per alarm, and the peak memory one read of 5000 alarms adds.
#include "AlarmReplies.h"

#include <AlarmXmlParser.h>
#include <MessageComposer.h>
#include <ORVOSrvTunnelControl.h>
#include <PluginAlarmSearchCommon.h>
#include <XML2Json.h>

#include <QFile>
#include <QXmlStreamReader>

#include <benchmark/benchmark.h>
#include <malloc.h>

#include <algorithm>
#include <cstdio>
#include <iterator>
#include <map>
#include <string>
#include <utility>

using namespace PluginAlarmSearchCommon;

namespace {

const QString& replyOf(qsizetype alarms)
{
    static std::map<qsizetype, QString> replies;
    auto it = replies.find(alarms);
    if (it == replies.end())
        it = replies.emplace(alarms, AlarmReplies::reply(int(alarms))).first;
    return it->second;
}

void sizes(benchmark::internal::Benchmark* benchmark)
{
    benchmark->Arg(500)->Arg(5000)->Arg(50000)->Unit(benchmark::kMillisecond);
}

void setAlarmCounters(benchmark::State& state)
{
    state.counters["alarms"] = double(state.range(0));
    state.counters["chars"] = double(replyOf(state.range(0)).size());
}

// One read of the reply by the tunnel's reader, as the tunnel client delivers it: the alarm
// list, or an invalid QVariant when the reply was not read.
QVariant readAnswer(const QString& reply)
{
    QVariant answer;
    ORVOSrvTunnelControl::queryAlarmCB(
        true, QStringLiteral("relay"), QStringLiteral("0"), reply, true,
        [&answer](bool ok, bool, const QVariant& result, const QString&, const QString&) {
            if (ok)
                answer = result;
        });
    return answer;
}

// The number of alarms one read gives, -1 when the reply was not read.
qsizetype readReply(const QString& reply)
{
    const QVariant answer = readAnswer(reply);
    return answer.isValid() ? answer.toList().size() : -1;
}

void BM_BareStreamReader(benchmark::State& state)
{
    const QString& reply = replyOf(state.range(0));
    for (auto _ : state) {
        QXmlStreamReader reader(reply);
        while (!reader.atEnd())
            reader.readNext();
        benchmark::DoNotOptimize(reader.hasError());
    }
    setAlarmCounters(state);
}
BENCHMARK(BM_BareStreamReader)->Apply(sizes);

void BM_ReplyRead(benchmark::State& state)
{
    const QString& reply = replyOf(state.range(0));
    for (auto _ : state) {
        if (readReply(reply) != state.range(0))
            state.SkipWithError("the reply was not read whole");
    }
    setAlarmCounters(state);
}
BENCHMARK(BM_ReplyRead)->Apply(sizes);

// As BM_ReplyRead, but the answer is destroyed outside the timed region, as its consumer would
// later: what is left is the read alone, without freeing (and, for large replies, without the
// heap being handed back to the system and faulted in again by the next read).
void BM_ReplyReadKeep(benchmark::State& state)
{
    const QString& reply = replyOf(state.range(0));
    for (auto _ : state) {
        QVariant answer = readAnswer(reply);
        state.PauseTiming();
        if (answer.toList().size() != state.range(0))
            state.SkipWithError("the reply was not read whole");
        answer.clear();
        state.ResumeTiming();
    }
    setAlarmCounters(state);
}
BENCHMARK(BM_ReplyReadKeep)->Apply(sizes);

// What handing over an answer of this shape costs any reader: an alarm list as long as the
// read's, each alarm a copy of one alarm map with its "XML" text allocated afresh, built and
// destroyed with nothing read. The copies share their other values with that one alarm, so this
// is a lower bound: what it adds per alarm from the smallest to the largest reply is growth no
// reader can avoid (the memory of the answer itself: caches, and pages the heap hands back).
void BM_AnswerFloor(benchmark::State& state)
{
    const QVariantList sample = readAnswer(replyOf(500)).toList();
    const QVariantMap model = sample.value(sample.size() / 2).toMap();
    const QString xmlKey = QStringLiteral("XML");
    const QString xml = model.value(xmlKey).toString();
    for (auto _ : state) {
        QVariantList answer;
        for (qsizetype i = 0; i < state.range(0); ++i) {
            QVariantMap alarm = model;
            alarm.insert(xmlKey, QString(xml.constData(), xml.size()));
            answer.append(QVariant(alarm));
        }
        benchmark::DoNotOptimize(answer.size());
    }
    setAlarmCounters(state);
}
BENCHMARK(BM_AnswerFloor)->Apply(sizes);

// Replies of other shapes, 5000 alarms each; the argument is the shape's place in
// AlarmReplies::Shapes.
constexpr int ShapedAlarms = 5000;

const QString& shapedReplyOf(AlarmReplies::Shape shape, int alarms)
{
    static std::map<std::pair<AlarmReplies::Shape, int>, QString> replies;
    auto it = replies.find({shape, alarms});
    if (it == replies.end())
        it = replies.emplace(std::pair(shape, alarms), AlarmReplies::shapedReply(shape, alarms))
                 .first;
    return it->second;
}

void shapes(benchmark::internal::Benchmark* benchmark)
{
    for (std::size_t i = 0; i < std::size(AlarmReplies::Shapes); ++i)
        benchmark->Arg(int64_t(i));
    benchmark->Unit(benchmark::kMillisecond);
}

void BM_ShapeBareStreamReader(benchmark::State& state)
{
    const QString& reply = shapedReplyOf(AlarmReplies::Shapes[state.range(0)], ShapedAlarms);
    for (auto _ : state) {
        QXmlStreamReader reader(reply);
        while (!reader.atEnd())
            reader.readNext();
        benchmark::DoNotOptimize(reader.hasError());
    }
}
BENCHMARK(BM_ShapeBareStreamReader)->Apply(shapes);

void BM_ShapeRead(benchmark::State& state)
{
    const QString& reply = shapedReplyOf(AlarmReplies::Shapes[state.range(0)], ShapedAlarms);
    for (auto _ : state) {
        if (readReply(reply) != ShapedAlarms)
            state.SkipWithError("the reply was not read whole");
    }
}
BENCHMARK(BM_ShapeRead)->Apply(shapes);

// Every alarm brings a field name no other alarm has: the cost per alarm must not grow with
// the number of names seen.
void BM_DistinctNamesRead(benchmark::State& state)
{
    const QString& reply = shapedReplyOf(AlarmReplies::Shape::DistinctNames, int(state.range(0)));
    for (auto _ : state) {
        if (readReply(reply) != state.range(0))
            state.SkipWithError("the reply was not read whole");
    }
}
BENCHMARK(BM_DistinctNamesRead)->Arg(500)->Arg(5000)->Unit(benchmark::kMillisecond);

// Replies that held a reply thread for seconds or took gigabytes before they were bounded,
// read once each: one alarm with 32 000 distinct child names, one with 80 000 attributes, and
// 8.39 million empty alarms just within the length bound.
enum Hostile { ManyNames, ManyAttributes, ManyAlarms };

QString hostileReply(int kind)
{
    QString xml = QStringLiteral("<QryAlarmListRes><Alarm");
    if (kind == ManyNames) {
        xml += u'>';
        for (int i = 0; i < 32000; ++i)
            xml += QStringLiteral("<n%1/>").arg(i);
        xml += QStringLiteral("</Alarm>");
    } else if (kind == ManyAttributes) {
        for (int i = 0; i < 80000; ++i)
            xml += QStringLiteral(" a%1=''").arg(i);
        xml += QStringLiteral("/>");
    } else {
        xml += QStringLiteral("/>") + QStringLiteral("<Alarm/>").repeated(8388000 - 1);
    }
    return xml + QStringLiteral("</QryAlarmListRes>");
}

void BM_HostileReply(benchmark::State& state)
{
    const QString reply = hostileReply(int(state.range(0)));
    for (auto _ : state)
        benchmark::DoNotOptimize(readReply(reply));
}
BENCHMARK(BM_HostileReply)
    ->Arg(ManyNames)
    ->Arg(ManyAttributes)
    ->Arg(ManyAlarms)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

void BM_GetAlarmList(benchmark::State& state)
{
    const QString& reply = replyOf(state.range(0));
    for (auto _ : state)
        benchmark::DoNotOptimize(AlarmXmlParser::getAlarmList(reply).size());
    setAlarmCounters(state);
}
BENCHMARK(BM_GetAlarmList)->Apply(sizes);

void BM_Xml2JsonParse(benchmark::State& state)
{
    const QString& reply = replyOf(state.range(0));
    for (auto _ : state)
        benchmark::DoNotOptimize(XML2Json().parse(reply).isValid());
    setAlarmCounters(state);
}
BENCHMARK(BM_Xml2JsonParse)->Apply(sizes);

void BM_ComposeQuery(benchmark::State& state)
{
    const auto rule = [](int type, const QStringList& tags) {
        return QVariantMap{{ARG_RULE_TYPE, type}, {ARG_RULE_TAG_LIST, QVariant(tags)}};
    };
    const QVariantMap request{
        {ARG_TRIGGER_EVENT_FILTER, CAMERA_TRIGGER_EVENT_FILTER_STRING},
        {ARG_STATE_FILTER, QStringLiteral("<StateList><State>Unhandled</State>"
                                          "<State>Handling</State></StateList>")},
        {ARG_RULES,
         QVariantList{rule(RULE_TYPE_NAME, {"Motion at Lobby", QString::fromUtf8("Kamera Süd")}),
                      rule(RULE_TYPE_DEVICE_NAME, {"Lobby Entrance", "Server Room & Rack"})}},
        {ARG_START_TIME, QStringLiteral("2026-11-20T00:00:00")},
        {ARG_END_TIME, QStringLiteral("2026-11-21T00:00:00")},
        {ARG_RELAY_PATH, QStringLiteral("relay/1")},
    };
    MessageComposer composer;
    for (auto _ : state)
        benchmark::DoNotOptimize(composer.composeQueryAlarmListMessage(request).size());
}
BENCHMARK(BM_ComposeQuery)->Unit(benchmark::kMicrosecond);

void BM_ProcessReply(benchmark::State& state)
{
    QString reply = QStringLiteral("<ProcessAlarmRes>");
    for (int i = 1; i <= 100; ++i)
        reply += QStringLiteral("<Result><AlarmID>A%1</AlarmID><Code>0</Code></Result>").arg(i);
    reply += QStringLiteral("</ProcessAlarmRes>");
    for (auto _ : state) {
        ORVOSrvTunnelControl::processAlarmCB(
            true, QStringLiteral("relay"), QStringLiteral("0"), reply, true,
            [](bool, bool, const QVariant& result, const QString&) {
                benchmark::DoNotOptimize(result.toList().size());
            });
    }
}
BENCHMARK(BM_ProcessReply)->Unit(benchmark::kMicrosecond);

void BM_InfoReply(benchmark::State& state)
{
    QString reply = QStringLiteral("<GetAlarmInfoRes><Alarm><AlarmID>A1</AlarmID><ChangeLogs>");
    for (int i = 1; i <= 50; ++i)
        reply += QStringLiteral("<Entry><Time>2026-11-20T08:%1:00Z</Time><State>Handling</State>"
                                "<Note>Step %1 &amp; check</Note><User>operator</User></Entry>")
                     .arg(i % 60, 2, 10, QLatin1Char('0'));
    reply += QStringLiteral("</ChangeLogs></Alarm></GetAlarmInfoRes>");
    for (auto _ : state) {
        ORVOSrvTunnelControl::getAlarmInfoCB(
            true, QStringLiteral("relay"), QStringLiteral("0"), reply, true,
            [](bool, bool, const QVariant& result, const QString&) {
                benchmark::DoNotOptimize(result.toList().size());
            });
    }
}
BENCHMARK(BM_InfoReply)->Unit(benchmark::kMicrosecond);

// Whether a run failed or was skipped: Google Benchmark 1.8 replaced Run::error_occurred by
// Run::skipped. The first overload is taken wherever the newer member exists.
template <typename BenchmarkRun>
auto runSkipped(const BenchmarkRun& run, int) -> decltype(run.skipped != 0)
{
    return run.skipped != 0;
}
template <typename BenchmarkRun> bool runSkipped(const BenchmarkRun& run, long)
{
    return run.error_occurred;
}

// Keeps the fastest CPU time per benchmark, over repetitions, besides the usual console output.
// CPU time rather than wall time: the ratio then holds on a machine that other work shares.
class FastestReporter : public benchmark::ConsoleReporter
{
public:
    void ReportRuns(const std::vector<Run>& runs) override
    {
        for (const Run& run : runs) {
            if (run.run_type != Run::RT_Iteration || runSkipped(run, 0) || run.iterations == 0)
                continue;
            const std::string name = run.run_name.function_name + "/" + run.run_name.args;
            const double seconds = run.cpu_accumulated_time / double(run.iterations);
            auto [it, inserted] = m_fastest.emplace(name, seconds);
            if (!inserted)
                it->second = std::min(it->second, seconds);
        }
        ConsoleReporter::ReportRuns(runs);
    }

    // Seconds of the fastest run, 0 when it did not run.
    double fastest(const std::string& name) const
    {
        const auto it = m_fastest.find(name);
        return it == m_fastest.end() ? 0 : it->second;
    }

private:
    std::map<std::string, double> m_fastest;
};

long statusKiB(const char* field)
{
    QFile status(QStringLiteral("/proc/self/status"));
    if (!status.open(QIODevice::ReadOnly))
        return -1;
    const QByteArray prefix = QByteArray(field) + ':';
    for (const QByteArray& line : status.readAll().split('\n')) {
        if (line.startsWith(prefix))
            return line.mid(prefix.size()).trimmed().split(' ').value(0).toLong();
    }
    return -1;
}

// Peak resident memory one read adds: free heap memory is handed back to the system first, so
// whatever the read allocates must be faulted in, then the kernel's peak-RSS mark is reset to
// the current RSS ("5" to clear_refs) and read again after the read. -1 where not supported.
long peakExtraKiB(const QString& reply)
{
    malloc_trim(0);
    QFile clearRefs(QStringLiteral("/proc/self/clear_refs"));
    if (!clearRefs.open(QIODevice::WriteOnly) || clearRefs.write("5") != 1)
        return -1;
    clearRefs.close();
    const long before = statusKiB("VmRSS");
    readReply(reply);
    const long peak = statusKiB("VmHWM");
    return before < 0 || peak < 0 ? -1 : peak - before;
}

} // namespace

int main(int argc, char** argv)
{
    // glibc raises its mmap threshold to the largest mmapped block freed so far (up to 32 MiB)
    // and its trim threshold to twice that, so a long-running process soon allocates with these
    // values. Setting them from the start keeps each benchmark's figures independent of which
    // benchmarks ran before it (a freed answer larger than 64 MiB is still handed back).
    mallopt(M_MMAP_THRESHOLD, 32 * 1024 * 1024);
    mallopt(M_TRIM_THRESHOLD, 64 * 1024 * 1024);

    // Measured first, before the benchmarks leave freed memory resident in the heap.
    const QString& memoryReply = replyOf(5000);
    const long extraKiB = peakExtraKiB(memoryReply);

    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    FastestReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();

    // Microseconds per alarm of the fastest run, 0 when it did not run.
    const auto perAlarm = [&reporter](const char* benchmark, const char* size) {
        return reporter.fastest(std::string(benchmark) + '/' + size) * 1e6 / std::stod(size);
    };
    std::printf("\n");
    for (const char* size : {"500", "5000", "50000"}) {
        const double bare = perAlarm("BM_BareStreamReader", size);
        const double read = perAlarm("BM_ReplyRead", size);
        const double kept = perAlarm("BM_ReplyReadKeep", size);
        if (read > 0 && bare > 0)
            std::printf("reply-read ratio %s: %.2f (%.2f us per alarm)\n", size, read / bare, read);
        if (kept > 0 && bare > 0)
            std::printf("reply-read ratio %s, answer destroyed untimed: %.2f (%.2f us per "
                        "alarm)\n",
                        size, kept / bare, kept);
    }
    for (const char* benchmark : {"BM_ReplyRead", "BM_AnswerFloor"}) {
        const double small = perAlarm(benchmark, "500");
        const double large = perAlarm(benchmark, "50000");
        if (small > 0 && large > 0)
            std::printf("%s per alarm, 500 -> 50000: %.2f -> %.2f us (%.2fx, +%.2f us)\n",
                        benchmark, small, large, large / small, large - small);
    }
    for (std::size_t i = 0; i < std::size(AlarmReplies::Shapes); ++i) {
        const std::string arg = std::to_string(i);
        const double bare = reporter.fastest("BM_ShapeBareStreamReader/" + arg);
        const double read = reporter.fastest("BM_ShapeRead/" + arg);
        if (read > 0 && bare > 0)
            std::printf("reply-read ratio 5000, %s: %.2f (target <= 1.00; %.2f us per alarm)\n",
                        AlarmReplies::shapeName(AlarmReplies::Shapes[i]), read / bare,
                        read * 1e6 / ShapedAlarms);
    }
    const double distinctSmall = perAlarm("BM_DistinctNamesRead", "500");
    const double distinctLarge = perAlarm("BM_DistinctNamesRead", "5000");
    if (distinctSmall > 0 && distinctLarge > 0)
        std::printf("a distinct name per alarm, per alarm, 500 -> 5000: %.2f -> %.2f us (%.2fx, "
                    "target: no growth)\n",
                    distinctSmall, distinctLarge, distinctLarge / distinctSmall);
    const char* const hostileNames[] = {"one alarm of 32000 distinct names (read)",
                                        "one alarm of 80000 attributes (refused)",
                                        "8.39 million empty alarms (refused)"};
    for (int kind : {ManyNames, ManyAttributes, ManyAlarms}) {
        const double seconds = reporter.fastest("BM_HostileReply/" + std::to_string(kind));
        if (seconds > 0)
            std::printf("hostile reply, %s: %.0f ms\n", hostileNames[kind], seconds * 1e3);
    }
    if (reporter.fastest("BM_HostileReply/" + std::to_string(ManyAlarms)) > 0)
        std::printf("hostile reply, 8.39 million empty alarms: peak memory %ld KiB over the "
                    "reply\n",
                    peakExtraKiB(hostileReply(ManyAlarms)));
    const double replyKiB = double(memoryReply.size()) * sizeof(QChar) / 1024;
    std::printf("peak memory of one 5000-alarm read: %ld KiB over a reply of %.0f KiB "
                "(UTF-16), %.2fx\n",
                extraKiB, replyKiB, double(extraKiB) / replyKiB);
    return 0;
}
