// The trace glue against the recording trace library. The same tests run in every environment
// the glue can meet (see tests/CMakeLists.txt); what each environment must produce is derived
// from the recorder's settings, or, when built with TRACEGLUE_NO_LIBRARY, from the absence of
// any trace library.

#include "PluginAlarmSearchSrv_Log.h"
#include "TraceRecorderClient.h"

#include <QtTest>

#include <stdexcept>

namespace {

// What the environment lets the glue see of the trace library.
struct Setup
{
    bool loaded = false;
    bool registers = false;
    bool outputs = false;
    bool context = false;
    int moduleId = 0;

    // Whether lines reach the level check at all.
    bool checks() const { return loaded && context; }
};

Setup currentSetup()
{
    Setup setup;
#ifndef TRACEGLUE_NO_LIBRARY
    setup.loaded = true;
    setup.registers = qEnvironmentVariableIntValue("TRACERECORDER_NO_REGISTER") != 1;
    setup.outputs = qEnvironmentVariableIntValue("TRACERECORDER_NO_OUTPUT") != 1;
    setup.context = qEnvironmentVariableIntValue("TRACERECORDER_NULL_CONTEXT") != 1;
    if (setup.registers) {
        bool ok = false;
        setup.moduleId =
            qEnvironmentVariable("TRACERECORDER_MODULE_ID", QStringLiteral("42")).toInt(&ok, 0);
        Q_ASSERT(ok);
    }
#endif
    return setup;
}

} // namespace

class TestTraceGlue : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QCOMPARE(m_recorder.isLoaded(), m_setup.loaded);
        m_loadJournal = m_recorder.journal();
    }

    void init() { m_recorder.reset(); }

    void loading()
    {
        QCOMPARE(g_ptTraceInfoAlarmSearchSrv != nullptr, m_setup.loaded);
        QCOMPARE(g_nGivenModIdAlarmSearchSrv, m_setup.moduleId);
        const QStringList registration{QStringLiteral("register 19 AlarmSearchSrv")};
        QCOMPARE(m_loadJournal, m_setup.registers ? registration : QStringList());
    }

    // The glue's C symbols stay visible although everything is built with hidden visibility.
    void exportedSymbols_data()
    {
        QTest::addColumn<QByteArray>("name");
        QTest::addColumn<quintptr>("address");
        QTest::newRow("output function")
            << QByteArray("LocalTraceOutFuncAlarmSearchSrv")
            << reinterpret_cast<quintptr>(&LocalTraceOutFuncAlarmSearchSrv);
        QTest::newRow("trace object") << QByteArray("g_ptTraceInfoAlarmSearchSrv")
                                      << reinterpret_cast<quintptr>(&g_ptTraceInfoAlarmSearchSrv);
        QTest::newRow("module id") << QByteArray("g_nGivenModIdAlarmSearchSrv")
                                   << reinterpret_cast<quintptr>(&g_nGivenModIdAlarmSearchSrv);
        QTest::newRow("library owner")
            << QByteArray("g_AlarmSearchSrv") << reinterpret_cast<quintptr>(&g_AlarmSearchSrv);
    }

    void exportedSymbols()
    {
        QFETCH(QByteArray, name);
        QFETCH(quintptr, address);
        QCOMPARE(reinterpret_cast<quintptr>(dlsym(RTLD_DEFAULT, name.constData())), address);
    }

    void entryLog_data()
    {
        QTest::addColumn<bool>("throws");
        QTest::addColumn<bool>("refused");
        QTest::newRow("returns") << false << false;
        QTest::newRow("throws") << true << false;
        QTest::newRow("refused") << false << true;
    }

    void entryLog()
    {
        QFETCH(bool, throws);
        QFETCH(bool, refused);
        if (refused)
            m_recorder.refuse(levelCode(AlarmSearchTrace::LevelEntry));
        QStringList atEnter;
        const int line = __LINE__;
        try {
            EntryLog log(__FILE__, "X", line);
            atEnter = m_recorder.journal();
            if (throws)
                throw std::runtime_error("left by an exception");
        } catch (const std::runtime_error&) {
        }
        const QStringList enter = expected(AlarmSearchTrace::LevelEntry, line, "X, Enter", refused);
        const QStringList leave = expected(AlarmSearchTrace::LevelEntry, 0, "X, Leave", refused);
        QCOMPARE(atEnter, enter);
        QCOMPARE(m_recorder.journal(), enter + leave);
    }

    void failureLine_data()
    {
        QTest::addColumn<QString>("status");
        QTest::addColumn<QString>("written");
        QTest::newRow("status") << QStringLiteral("80000001") << "queryAlarmCB, failed, 80000001";
        QTest::newRow("null") << QString() << "queryAlarmCB, failed, ";
        QTest::newRow("empty") << QStringLiteral("") << "queryAlarmCB, failed, ";
        QTest::newRow("percent signs stay text")
            << QStringLiteral("100% %s %n") << "queryAlarmCB, failed, 100% %s %n";
        QTest::newRow("non-ASCII") << QStringLiteral("St\u00f6rung")
                                   << QStringLiteral("queryAlarmCB, failed, St\u00f6rung");
    }

    void failureLine()
    {
        QFETCH(QString, status);
        QFETCH(QString, written);
        using AlarmSearchTrace::local8Bit;
        const int line = __LINE__ + 1;
        ALARMSEARCH_TRACE_FAILURE("%s, failed, %s", "queryAlarmCB", local8Bit(status).constData());
        QCOMPARE(m_recorder.journal(),
                 expected(AlarmSearchTrace::LevelFailure, line, written, false));
    }

    // A failure line formats its arguments only when the check lets it through.
    void failureArgumentsEvaluatedAfterCheck_data()
    {
        QTest::addColumn<bool>("refused");
        QTest::newRow("passes") << false;
        QTest::newRow("refused") << true;
    }

    void failureArgumentsEvaluatedAfterCheck()
    {
        QFETCH(bool, refused);
        if (refused)
            m_recorder.refuse(levelCode(AlarmSearchTrace::LevelFailure));
        int evaluated = 0;
        const auto argument = [&evaluated] {
            ++evaluated;
            return "argument";
        };
        const int line = __LINE__ + 1;
        ALARMSEARCH_TRACE_FAILURE("%s, failed", argument());
        QCOMPARE(evaluated, m_setup.checks() && !refused ? 1 : 0);
        QCOMPARE(m_recorder.journal(),
                 expected(AlarmSearchTrace::LevelFailure, line, "argument, failed", refused));
    }

    void check_data()
    {
        QTest::addColumn<bool>("refused");
        QTest::newRow("passes") << false;
        QTest::newRow("refused") << true;
    }

    void check()
    {
        QFETCH(bool, refused);
        if (refused)
            m_recorder.refuse(levelCode(AlarmSearchTrace::LevelFailure));
        QCOMPARE(AlarmSearchTrace::check(AlarmSearchTrace::LevelFailure, "file.cpp", 7),
                 m_setup.checks() && !refused);
        // Only the failure level was refused.
        QCOMPARE(AlarmSearchTrace::check(AlarmSearchTrace::LevelEntry, "file.cpp", 8),
                 m_setup.checks());
    }

    // Runs last: a second owner loads and registers again, and closing it turns tracing off
    // so that nothing calls into a closed library.
    void unloadTurnsTracingOff()
    {
        {
            AUTOLOGGER_AlarmSearchSrv second;
        }
        QCOMPARE(g_ptTraceInfoAlarmSearchSrv, nullptr);
        const QStringList registration{QStringLiteral("register 19 AlarmSearchSrv")};
        QCOMPARE(m_recorder.journal(), m_setup.registers ? registration : QStringList());
        QVERIFY(!AlarmSearchTrace::check(AlarmSearchTrace::LevelFailure, __FILE__, __LINE__));
        LocalTraceOutFuncAlarmSearchSrv("%s", "after unload");
        QCOMPARE(m_recorder.journal(), m_setup.registers ? registration : QStringList());
    }

private:
    // Level code for the module id this environment hands out, as exact values.
    qint64 levelCode(int level) const
    {
        switch (m_setup.moduleId) {
        case 0:
            return level;
        case 42:
            return 10752 + level;
        case 0x800000: // reaches the sign bit of the 32-bit code
            return -2147483648LL + level;
        }
        qFatal("no level codes for module id %d", m_setup.moduleId);
    }

    // Journal entries of one line at level from this file's line.
    QStringList expected(int level, int line, const QString& text, bool refused) const
    {
        QStringList entries;
        if (!m_setup.checks())
            return entries;
        entries << QStringLiteral("check %1 0 %2:%3").arg(levelCode(level)).arg(__FILE__).arg(line);
        if (m_setup.outputs && !refused)
            entries << QStringLiteral("out ") + text;
        return entries;
    }

    const Setup m_setup = currentSetup();
    const TraceRecorderClient m_recorder;
    QStringList m_loadJournal;
};

QTEST_GUILESS_MAIN(TestTraceGlue)
#include "tst_traceglue.moc"
