// Tracing, in one program: the trace glue against the recording trace library in every state the
// library's trace object can take, the plug-in's own trace lines, and our stand-in trace library.
// The glue loads the library once per process, so the runs without a library and without
// registration are processes of their own that run only the glue's tests (tests/CMakeLists.txt).

#include "PluginAlarmSearchSrv_Log.h"
#include "support/FakeHost.h"
#include "support/ReaderRun.h"

#include <PluginAlarmSearchSrv.h>
#include <RequestSenderInfo.h>

#include <QtTest>

#include <dlfcn.h>

#include <stdexcept>
#include <thread>
#include <vector>

namespace {

#ifdef TRACEGLUE_NO_LIBRARY
constexpr bool libraryPresent = false;
#else
constexpr bool libraryPresent = true;
#endif
const bool registers =
    libraryPresent && qEnvironmentVariableIntValue("TRACERECORDER_NO_REGISTER") != 1;
const QStringList registration{QStringLiteral("register 19 AlarmSearchSrv")};

// The recording library (tracerecorder/) the glue has loaded, reached without linking it. The
// handle stays open so that the journal can be read after the glue closes the library.
namespace recorder {
void* const handle = dlopen("libZoltLogUtl.dylib", RTLD_LAZY | RTLD_NOLOAD);

// Calls one of its functions; without the library, does nothing and gives R().
template <typename R, typename... Args> R call(const char* name, Args... args)
{
    const auto fn = reinterpret_cast<R (*)(Args...)>(handle ? dlsym(handle, name) : nullptr);
    return fn ? fn(args...) : R();
}
QStringList journal()
{
    return QString::fromUtf8(call<const char*>("TraceRecorder_journal"))
        .split(QLatin1Char('\n'), Qt::SkipEmptyParts);
}
// The written lines, without their "out " prefix.
QStringList lines()
{
    const QRegularExpression out(QStringLiteral("^out "));
    return journal().filter(out).replaceInStrings(out, QString());
}
void reset()
{
    call<void>("TraceRecorder_reset");
}
} // namespace recorder

} // namespace

class TestTraceGlue : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QCOMPARE(recorder::handle != nullptr, libraryPresent);
        QCOMPARE(g_ptTraceInfoAlarmSearchSrv != nullptr, libraryPresent);
        QCOMPARE(g_nGivenModIdAlarmSearchSrv, registers ? 42 : 0);
        QCOMPARE(m_loadJournal, registers ? registration : QStringList());
        if (libraryPresent)
            m_loaded = *g_ptTraceInfoAlarmSearchSrv;
    }

    // Every test runs with the trace object as loaded and with each of its parts missing. The
    // level code is the module id shifted by 8 plus the level, wrapped to 32 bits.
    void initTestCase_data()
    {
        QTest::addColumn<bool>("outputs");
        QTest::addColumn<bool>("context");
        QTest::addColumn<int>("moduleId");
        QTest::addColumn<qint64>("levelCodeBase");
        const int given = registers ? 42 : 0;
        const qint64 base = registers ? 10752 : 0;
        QTest::newRow("as loaded") << true << true << given << base;
        if (!libraryPresent)
            return;
        QTest::newRow("no output function") << false << true << given << base;
        QTest::newRow("null context") << true << false << given << base;
        QTest::newRow("module id reaching the sign bit")
            << true << true << 0x800000 << -(1LL << 31);
    }

    void init()
    {
        QFETCH_GLOBAL(bool, outputs);
        QFETCH_GLOBAL(bool, context);
        QFETCH_GLOBAL(int, moduleId);
        QFETCH_GLOBAL(qint64, levelCodeBase);
        m_outputs = outputs;
        m_checks = libraryPresent && context;
        m_levelCodeBase = levelCodeBase;
        g_nGivenModIdAlarmSearchSrv = moduleId;
        if (libraryPresent) {
            *g_ptTraceInfoAlarmSearchSrv = m_loaded;
            if (!outputs)
                g_ptTraceInfoAlarmSearchSrv->output = nullptr;
            if (!context)
                g_ptTraceInfoAlarmSearchSrv->context = nullptr;
        }
        recorder::reset();
    }

    // An entry log writes its entry line when made and its exit line (checked with line 0) when
    // left, also by an exception; a failure line's arguments are evaluated only when the check
    // passes.
    void lines_data()
    {
        QTest::addColumn<int>("kind");
        QTest::addColumn<QString>("status");
        QTest::addColumn<bool>("refused");
        const auto row = [](const char* name, Kind kind, const QString& status = {},
                            bool refused = false) {
            QTest::newRow(name) << int(kind) << status << refused;
        };
        row("entry", Entry);
        row("entry left by an exception", EntryThrows);
        row("entry refused", Entry, {}, true);
        row("failure", Failure, "80000001");
        row("failure, null status", Failure);
        row("failure, percent signs stay text", Failure, "100% %s %n");
        row("failure, non-ASCII", Failure, QStringLiteral("St\u00f6rung"));
        row("failure refused", Failure, "1", true);
    }

    void lines()
    {
        QFETCH(int, kind);
        QFETCH(QString, status);
        QFETCH(bool, refused);
        const bool failure = kind == Failure;
        const qint64 code = m_levelCodeBase + (failure ? AlarmSearchTrace::LevelFailure
                                                       : AlarmSearchTrace::LevelEntry);
        if (refused)
            recorder::call<void>("TraceRecorder_refuse", int64_t(code));
        int evaluated = 0;
        const auto argument = [&] {
            ++evaluated;
            return AlarmSearchTrace::local8Bit(status);
        };
        const int line = __LINE__ + 2;
        if (failure)
            ALARMSEARCH_TRACE_FAILURE("%s, failed, %s", "queryAlarmCB", argument().constData());
        try {
            if (!failure) {
                EntryLog log(__FILE__, "X", line);
                if (kind == EntryThrows)
                    throw std::runtime_error("left by an exception");
            }
        } catch (const std::runtime_error&) {
        }
        const QStringList written = failure ? QStringList{"queryAlarmCB, failed, " + status}
                                            : QStringList{"X, Enter", "X, Leave"};
        QStringList expected;
        for (int i = 0; m_checks && i < written.size(); ++i) {
            expected
                << QStringLiteral("check %1 0 %2:%3").arg(code).arg(__FILE__).arg(i ? 0 : line);
            if (m_outputs && !refused)
                expected << "out " + written.at(i);
        }
        QCOMPARE(evaluated, failure && m_checks && !refused ? 1 : 0);
        QCOMPARE(recorder::journal(), expected);
    }

    // Last: a second owner loads and registers again, and closing it turns tracing off so that
    // nothing calls into a closed library.
    void cleanupTestCase()
    {
        if (libraryPresent)
            *g_ptTraceInfoAlarmSearchSrv = m_loaded;
        recorder::reset();
        {
            AUTOLOGGER_AlarmSearchSrv second;
        }
        QCOMPARE(g_ptTraceInfoAlarmSearchSrv, nullptr);
        QVERIFY(!AlarmSearchTrace::check(AlarmSearchTrace::LevelFailure, __FILE__, __LINE__));
        LocalTraceOutFuncAlarmSearchSrv("%s", "after unload");
        QCOMPARE(recorder::journal(), registers ? registration : QStringList());
    }

private:
    enum Kind { Entry, EntryThrows, Failure };

    const QStringList m_loadJournal = recorder::journal(); // made before any test changes it
    TraceGlobalObject m_loaded{};
    bool m_outputs = true;
    bool m_checks = true;
    qint64 m_levelCodeBase = 0;
};

// Our stand-in trace library, loaded by its path; it reads its environment when loaded, so each
// case loads it afresh. (tst_pluginloader reads its lines through the plug-in.)
struct StandIn
{
    void* const handle = dlopen(ZOLTLOGUTL_PATH, RTLD_NOW | RTLD_LOCAL);
    TraceGlobalObject* object = nullptr;

    StandIn()
    {
        const auto get = reinterpret_cast<LogTrace_GetGlobalObjectFn>(
            handle ? dlsym(handle, "LogTrace_GetGlobalObject") : nullptr);
        if (!get || get(0, &object) != 0 || !object)
            qFatal("cannot load %s", ZOLTLOGUTL_PATH);
    }
    ~StandIn() { dlclose(handle); }
    Q_DISABLE_COPY_MOVE(StandIn)

    int32_t registerModule(const char* name) const
    {
        int32_t id = -1;
        object->registerModule(object->context, 19, name, &id);
        return id;
    }
    // Writes like the glue does: a check, then the line if the check passed.
    Q_ATTRIBUTE_FORMAT_PRINTF(4, 5)
    bool trace(int32_t moduleId, int level, const char* format, ...) const
    {
        const int64_t code = static_cast<int32_t>(moduleId << 8 | level);
        if (object->checkLevel(object->context, code, 0, __FILE__, __LINE__) != 0)
            return false;
        va_list args;
        va_start(args, format);
        object->output(object->context, format, args);
        va_end(args);
        return true;
    }
};

// The plug-in's lines (entry and exit of the host-facing operations, every failure line of the
// handlers and reply readers) and our stand-in trace library.
class TestTraceLines : public QObject
{
    Q_OBJECT

private slots:
    void init()
    {
        recorder::reset();
        QVERIFY(m_dir.isValid());
        QFile::remove(m_dir.filePath("trace.log"));
        qputenv("ZOLTLOG_FILE", QFile::encodeName(m_dir.filePath("trace.log")));
        qunsetenv("ZOLTLOG_LEVEL");
    }

    void hostFacingOperations()
    {
        FakeHost host;
        host.tunnel.setAccept(false);
        RequestSenderInfo sender;
        UntouchedResponser responser;
        {
            PluginAlarmSearchSrv plugin;
            plugin.InitialPluginBase(&host);
            for (const char* method : {"QryAlarmList", "UpdateAlarm", "GetAlarmHistoryForExport",
                                       "MuteAlarm", "ProcessAlarm"})
                plugin.Request(method, QVariant(), sender, host.answerSink());
            plugin.RequestBlock("QryAlarmList", QVariant(), sender, responser);
            plugin.SubscribeEventBlock("k", "AlarmUpdated", QVariant(), sender, responser);
            plugin.UnsubscribeEventBlock("k", QVariant(), responser);
        }
        const QStringList expected =
            QStringLiteral(
                "InitialPluginBase, Enter|InitialPluginBase, Leave|Request, Enter|"
                "handleQueryAlarm, call queryAlarm failed|Request, Leave|Request, Enter|"
                "handleUpdateAlarm, call processAlarm failed|Request, Leave|Request, Enter|"
                "handleGetAlarmHistory, call getAlarmInfo failed|Request, Leave|Request, Enter|"
                "Request, Leave|Request, Enter|Request, Leave|RequestBlock, Enter|RequestBlock, "
                "Leave|"
                "SubscribeEventBlock, Enter|SubscribeEventBlock, Leave|UnsubscribeEventBlock, "
                "Enter|"
                "UnsubscribeEventBlock, Leave|~PluginAlarmSearchSrv, Enter|~PluginAlarmSearchSrv, "
                "Leave")
                .split(QLatin1Char('|'));
        QCOMPARE(recorder::lines(), expected);
        // Entry lines are checked at the operation's own line, exit lines with line 0.
        const QStringList checks = recorder::journal().filter(QStringLiteral("check 10757 "));
        QVERIFY(
            checks.value(0).contains(QRegularExpression("PluginAlarmSearchSrv.cpp:[1-9][0-9]*$")));
        QVERIFY(checks.value(1).endsWith(QLatin1String("PluginAlarmSearchSrv.cpp:0")));
    }

    // Each reader's failure lines, and none for an accepted reply.
    void readerFailureLines()
    {
        const struct
        {
            Reader reader;
            bool ok;
            const char* status;
            const char* reply;
            const char* line;
        } rows[] = {
            {Reader::Query, true, "80000000", "<QryAlarmListRes/>",
             "queryAlarmCB, QryAlarmList failed, 80000000"},
            {Reader::Query, false, "0", "<QryAlarmListRes/>",
             "queryAlarmCB, QryAlarmList failed, 0"},
            {Reader::Process, true, "FFFFFFFF", "<ProcessAlarmRes/>",
             "processAlarmCB, processAlarm failed, FFFFFFFF"},
            {Reader::Info, false, nullptr, "<GetAlarmInfoRes/>",
             "getAlarmInfoCB, getAlarmInfo failed, "},
            {Reader::Query, true, "0", "<QryAlarmListRes>",
             "queryAlarmCB, parse message failed, <QryAlarmListRes>"},
            {Reader::Process, true, "0", "caf\u00e9 100%s",
             "processAlarmCB, parse message failed, caf\u00e9 100%s"},
            {Reader::Info, true, "0", nullptr, "getAlarmInfoCB, parse message failed, "},
            {Reader::Process, true, "0", "<ProcessAlarmRes/>", ""},
            {Reader::Info, true, "0", "<GetAlarmInfoRes/>", ""},
        };
        for (const auto& row : rows) {
            recorder::reset();
            readReply(row.reader, {row.ok, "r", row.status, row.reply, true});
            QCOMPARE(recorder::lines().join(QLatin1Char('|')), QString::fromUtf8(row.line));
        }
    }

    // Which levels ZOLTLOG_LEVEL lets through; an invalid setting keeps the default, 2.
    void levels_data()
    {
        QTest::addColumn<QByteArray>("setting");
        QTest::addColumn<int>("level");
        QTest::addColumn<bool>("written");
        QTest::newRow("default writes failures") << QByteArray() << 2 << true;
        QTest::newRow("default skips level 3") << QByteArray() << 3 << false;
        QTest::newRow("5 writes entry lines") << QByteArray("5") << 5 << true;
        QTest::newRow("5 skips level 6") << QByteArray("5") << 6 << false;
        QTest::newRow("0 writes nothing") << QByteArray("0") << 2 << false;
        QTest::newRow("invalid keeps default") << QByteArray("verbose") << 2 << true;
        QTest::newRow("invalid keeps default, level 5") << QByteArray("5x") << 5 << false;
    }

    void levels()
    {
        QFETCH(QByteArray, setting);
        QFETCH(int, level);
        QFETCH(bool, written);
        if (!setting.isNull())
            qputenv("ZOLTLOG_LEVEL", setting);
        const StandIn library;
        QCOMPARE(library.trace(library.registerModule("AlarmSearchSrv"), level, "-"), written);
    }

    // A line is "<UTC time to the millisecond> <module> <level> <text>"; lines from several
    // threads never mix and each carries its own thread's module and level. A module registered
    // again keeps its id.
    void concurrentLines()
    {
        qputenv("ZOLTLOG_LEVEL", "5");
        constexpr int Threads = 4;
        constexpr int LinesPerThread = 200;
        const QDateTime before = QDateTime::currentDateTimeUtc().addMSecs(-1);
        {
            const StandIn library;
            const int32_t ids[2] = {library.registerModule("ModuleA"),
                                    library.registerModule("ModuleB")};
            QCOMPARE(ids[1], 2);
            QCOMPARE(library.registerModule("ModuleA"), 1);
            std::vector<std::thread> threads;
            threads.reserve(Threads);
            for (int t = 0; t < Threads; ++t) {
                threads.emplace_back([&library, &ids, t] {
                    for (int i = 0; i < LinesPerThread; ++i)
                        library.trace(ids[t % 2], 2 + t, "line %d, %s", 2 + t,
                                      "padding-padding-padding-padding-padding-padding");
                });
            }
            for (std::thread& thread : threads)
                thread.join();
        }
        QFile file(m_dir.filePath("trace.log"));
        QVERIFY(file.open(QIODevice::ReadOnly));
        const QString content = QString::fromUtf8(file.readAll());
        QVERIFY(content.endsWith(QLatin1Char('\n')));
        const QStringList lines = content.split(QLatin1Char('\n'), Qt::SkipEmptyParts);
        QCOMPARE(lines.size(), Threads * LinesPerThread);
        const QRegularExpression pattern(QStringLiteral(
            R"(^(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z) Module([AB]) ([2-5]) line \3, padding(-padding){5}$)"));
        for (const QString& line : lines) {
            const QRegularExpressionMatch match = pattern.match(line);
            QVERIFY2(match.hasMatch(), qPrintable(line));
            QCOMPARE(match.captured(2), QString(match.captured(3).toInt() % 2 ? "B" : "A"));
        }
        const QDateTime stamp =
            QDateTime::fromString(pattern.match(lines.first()).captured(1), Qt::ISODateWithMs);
        QVERIFY(stamp >= before && stamp <= QDateTime::currentDateTimeUtc());
    }

private:
    QTemporaryDir m_dir;
};

// The glue's tests run last: they end by turning tracing off.
int main(int argc, char** argv)
{
    QCoreApplication app(argc, argv);
    TestTraceGlue glue; // first: it reads the journal of the load
    int failed = 0;
    if (registers) {
        TestTraceLines lines;
        failed = QTest::qExec(&lines, argc, argv);
    }
    return failed + QTest::qExec(&glue, argc, argv);
}

#include "tst_trace.moc"
