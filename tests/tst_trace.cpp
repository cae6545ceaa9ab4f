// Tracing, in one program: the trace glue against the recording trace library in every state the
// library's trace object can take, the plug-in's own trace lines, and our stand-in trace library.
// The glue loads the library once per process, so the runs without a library and without
// registration are processes of their own that run only the glue's tests (tests/CMakeLists.txt).

#include "PluginAlarmSearchSrv_Log.h"
#include "TraceRecorderClient.h"
#include "support/FakeHost.h"
#include "support/ReaderRun.h"

#include <PluginAlarmSearchSrv.h>
#include <RequestSenderInfo.h>

#include <QtTest>

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

// The level code a check carries, as exact values for the module ids the tests hand out.
qint64 levelCode(int moduleId, int level)
{
    switch (moduleId) {
    case 0:
        return level;
    case 42: // what the recorder gives at registration
        return 10752 + level;
    case 0x800000: // reaches the sign bit of the 32-bit code
        return -2147483648LL + level;
    }
    qFatal("no level codes for module id %d", moduleId);
}

} // namespace

class TestTraceGlue : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QCOMPARE(m_recorder.isLoaded(), libraryPresent);
        QCOMPARE(g_ptTraceInfoAlarmSearchSrv != nullptr, libraryPresent);
        QCOMPARE(g_nGivenModIdAlarmSearchSrv, registers ? 42 : 0);
        QCOMPARE(m_loadJournal, registers ? registration : QStringList());
        if (libraryPresent)
            m_loaded = *g_ptTraceInfoAlarmSearchSrv;
    }

    // Every test runs with the trace object as loaded and with each of its parts missing.
    void initTestCase_data()
    {
        QTest::addColumn<bool>("outputs");
        QTest::addColumn<bool>("context");
        QTest::addColumn<int>("moduleId");
        const int given = registers ? 42 : 0;
        QTest::newRow("as loaded") << true << true << given;
        if (!libraryPresent)
            return;
        QTest::newRow("no output function") << false << true << given;
        QTest::newRow("null context") << true << false << given;
        QTest::newRow("module id reaching the sign bit") << true << true << 0x800000;
    }

    void init()
    {
        QFETCH_GLOBAL(bool, outputs);
        QFETCH_GLOBAL(bool, context);
        QFETCH_GLOBAL(int, moduleId);
        m_outputs = outputs;
        m_checks = libraryPresent && context;
        m_moduleId = g_nGivenModIdAlarmSearchSrv = moduleId;
        if (libraryPresent) {
            *g_ptTraceInfoAlarmSearchSrv = m_loaded;
            if (!outputs)
                g_ptTraceInfoAlarmSearchSrv->output = nullptr;
            if (!context)
                g_ptTraceInfoAlarmSearchSrv->context = nullptr;
        }
        m_recorder.reset();
    }

    // An entry log writes its entry line at construction and its exit line (checked with line 0)
    // at destruction; a failure line's arguments are evaluated only when the check passes.
    void lines_data()
    {
        QTest::addColumn<int>("kind");
        QTest::addColumn<QString>("status");
        QTest::addColumn<bool>("refused");
        QTest::addColumn<QStringList>("written");
        const QStringList entry{"X, Enter", "X, Leave"};
        QTest::newRow("entry") << int(Entry) << QString() << false << entry;
        QTest::newRow("entry left by an exception")
            << int(EntryThrows) << QString() << false << entry;
        QTest::newRow("entry refused") << int(Entry) << QString() << true << entry;
        const auto failure = [](const char* name, const QString& status, bool refused = false) {
            QTest::newRow(name) << int(Failure) << status << refused
                                << QStringList{"queryAlarmCB, failed, " + status};
        };
        failure("failure", "80000001");
        failure("failure, null status", QString());
        failure("failure, percent signs stay text", "100% %s %n");
        failure("failure, non-ASCII", QStringLiteral("St\u00f6rung"));
        failure("failure refused", "1", true);
    }

    void lines()
    {
        QFETCH(int, kind);
        QFETCH(QString, status);
        QFETCH(bool, refused);
        QFETCH(QStringList, written);
        const int level =
            kind == Failure ? AlarmSearchTrace::LevelFailure : AlarmSearchTrace::LevelEntry;
        if (refused)
            m_recorder.refuse(levelCode(m_moduleId, level));
        int evaluated = 0;
        const auto argument = [&] {
            ++evaluated;
            return AlarmSearchTrace::local8Bit(status);
        };
        QStringList atEnter;
        const int line = __LINE__ + 2;
        if (kind == Failure)
            ALARMSEARCH_TRACE_FAILURE("%s, failed, %s", "queryAlarmCB", argument().constData());
        try {
            if (kind != Failure) {
                EntryLog log(__FILE__, "X", line);
                atEnter = m_recorder.journal();
                if (kind == EntryThrows)
                    throw std::runtime_error("left by an exception");
            }
        } catch (const std::runtime_error&) {
        }
        QStringList expectedJournal;
        for (int i = 0; i < written.size(); ++i)
            expectedJournal << expected(level, i ? 0 : line, written.at(i), refused);
        if (kind != Failure)
            QCOMPARE(atEnter, expected(level, line, written.first(), refused));
        QCOMPARE(evaluated, kind == Failure && m_checks && !refused ? 1 : 0);
        QCOMPARE(m_recorder.journal(), expectedJournal);
    }

    // Last: a second owner loads and registers again, and closing it turns tracing off so that
    // nothing calls into a closed library.
    void cleanupTestCase()
    {
        if (libraryPresent)
            *g_ptTraceInfoAlarmSearchSrv = m_loaded;
        m_recorder.reset();
        {
            AUTOLOGGER_AlarmSearchSrv second;
        }
        QCOMPARE(g_ptTraceInfoAlarmSearchSrv, nullptr);
        QVERIFY(!AlarmSearchTrace::check(AlarmSearchTrace::LevelFailure, __FILE__, __LINE__));
        LocalTraceOutFuncAlarmSearchSrv("%s", "after unload");
        QCOMPARE(m_recorder.journal(), registers ? registration : QStringList());
    }

private:
    enum Kind { Entry, EntryThrows, Failure };

    // Journal entries of one line at level from this file's line.
    QStringList expected(int level, int line, const QString& text, bool refused) const
    {
        if (!m_checks)
            return {};
        QStringList entries{QStringLiteral("check %1 0 %2:%3")
                                .arg(levelCode(m_moduleId, level))
                                .arg(__FILE__)
                                .arg(line)};
        if (m_outputs && !refused)
            entries << QStringLiteral("out ") + text;
        return entries;
    }

    const TraceRecorderClient m_recorder;
    const QStringList m_loadJournal = m_recorder.journal(); // constructed before any other test
    TraceGlobalObject m_loaded{};
    bool m_outputs = true;
    bool m_checks = true;
    int m_moduleId = 0;
};

// The plug-in's lines: entry and exit of the host-facing operations, and every failure line of
// the handlers and reply readers.
class TestPluginTraceLines : public QObject
{
    Q_OBJECT

private slots:
    void init() { m_recorder.reset(); }

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
        QStringList expected;
        const auto call = [&expected](const QString& name, const QString& failure = {}) {
            expected << name + ", Enter";
            if (!failure.isEmpty())
                expected << failure;
            expected << name + ", Leave";
        };
        call("InitialPluginBase");
        call("Request", "handleQueryAlarm, call queryAlarm failed");
        call("Request", "handleUpdateAlarm, call processAlarm failed");
        call("Request", "handleGetAlarmHistory, call getAlarmInfo failed");
        call("Request");
        call("Request");
        for (const char* name : {"RequestBlock", "SubscribeEventBlock", "UnsubscribeEventBlock",
                                 "~PluginAlarmSearchSrv"})
            call(name);
        QCOMPARE(m_recorder.entries(), expected);

        // Entry lines are checked with the operation's line, exit lines with line 0.
        const QStringList checks = m_recorder.entries("check ");
        QCOMPARE(checks.size(), expected.size());
        const auto checked = [&checks](int i, const char* pattern) {
            return checks.at(i).contains(QRegularExpression(QString::fromUtf8(pattern)));
        };
        QVERIFY(checked(0, "^10757 0 (.*/)?PluginAlarmSearchSrv.cpp:[1-9][0-9]*$"));
        QVERIFY(checked(1, "^10757 0 (.*/)?PluginAlarmSearchSrv.cpp:0$"));
        QVERIFY(checked(3, "^10754 0 (.*/)?PluginAlarmSearchSrv_Request.cpp:[1-9][0-9]*$"));
    }

    void readerFailureLines_data()
    {
        QTest::addColumn<int>("reader");
        QTest::addColumn<bool>("ok");
        QTest::addColumn<QString>("status");
        QTest::addColumn<QString>("reply");
        QTest::addColumn<QStringList>("lines");
        const auto row = [](const char* name, Reader reader, bool ok, const QString& status,
                            const QString& reply, const QString& line = {}) {
            QTest::newRow(name) << int(reader) << ok << status << reply
                                << (line.isEmpty() ? QStringList() : QStringList{line});
        };
        const Reader query = Reader::Query, process = Reader::Process, info = Reader::Info;
        row("query rejected", query, true, "80000000", "<QryAlarmListRes/>",
            "queryAlarmCB, QryAlarmList failed, 80000000");
        row("query transport", query, false, "0", "<QryAlarmListRes/>",
            "queryAlarmCB, QryAlarmList failed, 0");
        row("process rejected", process, true, "FFFFFFFF", "<ProcessAlarmRes/>",
            "processAlarmCB, processAlarm failed, FFFFFFFF");
        row("info null status", info, false, QString(), "<GetAlarmInfoRes/>",
            "getAlarmInfoCB, getAlarmInfo failed, ");
        row("query unparseable", query, true, "0", "<QryAlarmListRes>",
            "queryAlarmCB, parse message failed, <QryAlarmListRes>");
        row("process unparseable", process, true, "0", "caf\u00e9 100%s",
            "processAlarmCB, parse message failed, caf\u00e9 100%s");
        row("info empty reply", info, true, "0", QString(),
            "getAlarmInfoCB, parse message failed, ");
        row("process accepted", process, true, "0", "<ProcessAlarmRes/>");
        row("info accepted", info, true, "0", "<GetAlarmInfoRes/>");
    }

    void readerFailureLines()
    {
        QFETCH(int, reader);
        QFETCH(bool, ok);
        QFETCH(QString, status);
        QFETCH(QString, reply);
        QFETCH(QStringList, lines);
        readReply(Reader(reader), {ok, "r", status, reply, true});
        QCOMPARE(m_recorder.entries(), lines);
        for (const QString& check : m_recorder.entries("check "))
            QVERIFY(check.startsWith("10754 0 "));
    }

private:
    const TraceRecorderClient m_recorder;
};

// Our stand-in trace library, loaded by its path with the settings of each case; it reads its
// environment when loaded, so each case loads it afresh.
class TestStandInTraceLibrary : public QObject
{
    Q_OBJECT

    class StandIn
    {
    public:
        StandIn() : m_handle(dlopen(ZOLTLOGUTL_PATH, RTLD_NOW | RTLD_LOCAL))
        {
            if (!m_handle)
                qFatal("cannot load %s: %s", ZOLTLOGUTL_PATH, dlerror());
            auto get = reinterpret_cast<LogTrace_GetGlobalObjectFn>(
                dlsym(m_handle, "LogTrace_GetGlobalObject"));
            if (!get || get(0, &m_object) != 0 || !m_object)
                qFatal("no trace object");
        }
        ~StandIn() { dlclose(m_handle); }
        Q_DISABLE_COPY_MOVE(StandIn)

        int32_t registerModule(const char* name) const
        {
            int32_t id = -1;
            m_object->registerModule(m_object->context, 19, name, &id);
            return id;
        }

        // Writes like the glue does: a check, then the line if the check passed.
        Q_ATTRIBUTE_FORMAT_PRINTF(4, 5)
        bool trace(int32_t moduleId, int level, const char* format, ...) const
        {
            const int64_t code = static_cast<int32_t>(moduleId << 8 | level);
            if (m_object->checkLevel(m_object->context, code, 0, __FILE__, __LINE__) != 0)
                return false;
            va_list args;
            va_start(args, format);
            m_object->output(m_object->context, format, args);
            va_end(args);
            return true;
        }

    private:
        void* m_handle;
        TraceGlobalObject* m_object = nullptr;
    };

private slots:
    void init()
    {
        QVERIFY(m_dir.isValid());
        m_path = m_dir.filePath(QStringLiteral("trace.log"));
        QFile::remove(m_path);
        qputenv("ZOLTLOG_FILE", QFile::encodeName(m_path));
        qunsetenv("ZOLTLOG_LEVEL");
    }

    void registration()
    {
        const StandIn library;
        QCOMPARE(library.registerModule("AlarmSearchSrv"), 1);
        QCOMPARE(library.registerModule("Other"), 2);
        QCOMPARE(library.registerModule("AlarmSearchSrv"), 1);
    }

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

    // A written line is "<UTC time to the millisecond> <module> <level> <text>".
    void levels()
    {
        QFETCH(QByteArray, setting);
        QFETCH(int, level);
        QFETCH(bool, written);
        if (!setting.isNull())
            qputenv("ZOLTLOG_LEVEL", setting);
        const QDateTime before = QDateTime::currentDateTimeUtc().addMSecs(-1);
        {
            const StandIn library;
            const int32_t id = library.registerModule("AlarmSearchSrv");
            QCOMPARE(library.trace(id, level, "line %d, %s", level, "failed"), written);
        }
        const QStringList lines = readLines();
        QCOMPARE(lines.size(), written ? 1 : 0);
        if (!written)
            return;
        const QRegularExpressionMatch match = linePattern.match(lines.first());
        QVERIFY2(match.hasMatch(), qPrintable(lines.first()));
        const QDateTime stamp = QDateTime::fromString(match.captured(1), Qt::ISODateWithMs);
        QCOMPARE(stamp.timeSpec(), Qt::UTC);
        QVERIFY(stamp >= before && stamp <= QDateTime::currentDateTimeUtc());
        QCOMPARE(match.captured(2), QStringLiteral("AlarmSearchSrv %1 line %1, failed").arg(level));
    }

    // Lines from several threads never mix, and each carries its own thread's module and level.
    void concurrentLines()
    {
        qputenv("ZOLTLOG_LEVEL", "5");
        constexpr int Threads = 4;
        constexpr int LinesPerThread = 200;
        {
            const StandIn library;
            const int32_t ids[2] = {library.registerModule("ModuleA"),
                                    library.registerModule("ModuleB")};
            std::vector<std::thread> threads;
            for (int t = 0; t < Threads; ++t) {
                threads.emplace_back([&library, &ids, t] {
                    for (int i = 0; i < LinesPerThread; ++i)
                        library.trace(ids[t % 2], 2 + t, "thread %d line %d %s", t, i,
                                      "padding-padding-padding-padding-padding-padding");
                });
            }
            for (std::thread& thread : threads)
                thread.join();
        }
        const QStringList lines = readLines();
        QCOMPARE(lines.size(), Threads * LinesPerThread);
        const QRegularExpression text(
            QStringLiteral(R"(^Module([AB]) (\d) thread (\d) line \d+ padding(-padding){5}$)"));
        for (const QString& line : lines) {
            const QRegularExpressionMatch match = text.match(linePattern.match(line).captured(2));
            QVERIFY2(match.hasMatch(), qPrintable(line));
            const int thread = match.captured(3).toInt();
            QCOMPARE(match.captured(1), thread % 2 ? QStringLiteral("B") : QStringLiteral("A"));
            QCOMPARE(match.captured(2).toInt(), 2 + thread);
        }
    }

private:
    QStringList readLines() const
    {
        QFile file(m_path);
        if (!file.open(QIODevice::ReadOnly))
            return {};
        const QString content = QString::fromUtf8(file.readAll());
        if (!content.isEmpty() && !content.endsWith(QLatin1Char('\n')))
            return {QStringLiteral("unterminated: ") + content};
        return content.split(QLatin1Char('\n'), Qt::SkipEmptyParts);
    }

    const QRegularExpression linePattern{
        QStringLiteral(R"(^(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z) (.*)$)")};
    QTemporaryDir m_dir;
    QString m_path;
};

// The glue's tests run last: they end by turning tracing off.
int main(int argc, char** argv)
{
    QCoreApplication app(argc, argv);
    TestTraceGlue glue;
    int failed = 0;
    if (registers) {
        TestPluginTraceLines lines;
        TestStandInTraceLibrary standIn;
        failed += QTest::qExec(&lines, argc, argv) + QTest::qExec(&standIn, argc, argv);
    }
    return failed + QTest::qExec(&glue, argc, argv);
}

#include "tst_trace.moc"
