// The plug-in's trace lines, recorded by the recording trace library: the entry and exit lines
// of the host-facing operations and every failure line of the handlers and reply readers.

#include "TraceRecorderClient.h"
#include "support/FakeHost.h"

#include <ORVOSrvTunnelControl.h>
#include <PluginAlarmSearchSrv.h>
#include <RequestSenderInfo.h>

#include <QtTest>

namespace {

constexpr int moduleId = 42; // what the recorder hands out
constexpr qint64 entryLevel = (moduleId << 8) | 5;
constexpr qint64 failureLevel = (moduleId << 8) | 2;

} // namespace

class TestPluginTrace : public QObject
{
    Q_OBJECT

private:
    // The written lines, without the checks that preceded them.
    QStringList lines() const
    {
        QStringList out;
        for (const QString& entry : m_recorder.journal())
            if (entry.startsWith(QLatin1String("out ")))
                out << entry.mid(4);
        return out;
    }

    QStringList checks() const
    {
        QStringList out;
        for (const QString& entry : m_recorder.journal())
            if (entry.startsWith(QLatin1String("check ")))
                out << entry.mid(6);
        return out;
    }

    const TraceRecorderClient m_recorder;

private slots:
    void initTestCase() { QVERIFY(m_recorder.isLoaded()); }
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
            plugin.Request("QryAlarmList", QVariant(), sender, host.answerSink());
            plugin.Request("UpdateAlarm", QVariant(), sender, host.answerSink());
            plugin.Request("GetAlarmHistoryForExport", QVariant(), sender, host.answerSink());
            plugin.Request("MuteAlarm", QVariant(), sender, host.answerSink());
            plugin.Request("ProcessAlarm", QVariant(), sender, host.answerSink());
            plugin.RequestBlock("QryAlarmList", QVariant(), sender, responser);
            plugin.SubscribeEventBlock("k", "AlarmUpdated", QVariant(), sender, responser);
            plugin.UnsubscribeEventBlock("k", QVariant(), responser);
        }
        QCOMPARE(lines(), (QStringList{
                              "InitialPluginBase, Enter",
                              "InitialPluginBase, Leave",
                              "Request, Enter",
                              "handleQueryAlarm, call queryAlarm failed",
                              "Request, Leave",
                              "Request, Enter",
                              "handleUpdateAlarm, call processAlarm failed",
                              "Request, Leave",
                              "Request, Enter",
                              "handleGetAlarmHistory, call getAlarmInfo failed",
                              "Request, Leave",
                              "Request, Enter",
                              "Request, Leave",
                              "Request, Enter",
                              "Request, Leave",
                              "RequestBlock, Enter",
                              "RequestBlock, Leave",
                              "SubscribeEventBlock, Enter",
                              "SubscribeEventBlock, Leave",
                              "UnsubscribeEventBlock, Enter",
                              "UnsubscribeEventBlock, Leave",
                              "~PluginAlarmSearchSrv, Enter",
                              "~PluginAlarmSearchSrv, Leave",
                          }));

        // Entry lines are checked at level 5 with the operation's line, exit lines with line 0;
        // failure lines at level 2.
        const QStringList checked = checks();
        QCOMPARE(checked.size(), lines().size());
        QVERIFY(checked.first().startsWith(QStringLiteral("%1 0 ").arg(entryLevel)));
        QVERIFY(checked.first().contains(QLatin1String("PluginAlarmSearchSrv.cpp:")));
        QVERIFY(!checked.first().endsWith(QLatin1String(":0")));
        QVERIFY(checked.at(1).startsWith(QStringLiteral("%1 0 ").arg(entryLevel)));
        QVERIFY(checked.at(1).endsWith(QLatin1String("PluginAlarmSearchSrv.cpp:0")));
        QVERIFY(checked.at(3).startsWith(QStringLiteral("%1 0 ").arg(failureLevel)));
        QVERIFY(checked.at(3).contains(QLatin1String("PluginAlarmSearchSrv_Request.cpp:")));
    }

    void refusedLevelSuppressesOnlyItsLines()
    {
        m_recorder.refuse(entryLevel);
        FakeHost host;
        host.tunnel.setAccept(false);
        PluginAlarmSearchSrv plugin;
        plugin.InitialPluginBase(&host);
        plugin.Request("GetAlarmHistory", QVariant(), RequestSenderInfo(), host.answerSink());
        QCOMPARE(lines(), QStringList{"handleGetAlarmHistory, call getAlarmInfo failed"});
        QCOMPARE(host.answers().size(), 1);
    }

    void readerFailureLines_data()
    {
        QTest::addColumn<int>("reader");
        QTest::addColumn<bool>("ok");
        QTest::addColumn<QString>("status");
        QTest::addColumn<QString>("reply");
        QTest::addColumn<QString>("line");
        QTest::newRow("query rejected") << 0 << true << "80000000"
                                        << "<QryAlarmListRes/>"
                                        << "queryAlarmCB, QryAlarmList failed, 80000000";
        QTest::newRow("query transport") << 0 << false << "0"
                                         << "<QryAlarmListRes/>"
                                         << "queryAlarmCB, QryAlarmList failed, 0";
        QTest::newRow("process rejected") << 1 << true << "FFFFFFFF"
                                          << "<ProcessAlarmRes/>"
                                          << "processAlarmCB, processAlarm failed, FFFFFFFF";
        QTest::newRow("info null status") << 2 << false << QString() << "<GetAlarmInfoRes/>"
                                          << "getAlarmInfoCB, getAlarmInfo failed, ";
        QTest::newRow("query unparseable") << 0 << true << "0"
                                           << "<QryAlarmListRes>"
                                           << "queryAlarmCB, parse message failed, "
                                              "<QryAlarmListRes>";
        QTest::newRow("process unparseable") << 1 << true << "0"
                                             << "caf\u00e9 100%s"
                                             << "processAlarmCB, parse message failed, "
                                                "caf\u00e9 100%s";
        QTest::newRow("info empty reply")
            << 2 << true << "0" << QString() << "getAlarmInfoCB, parse message failed, ";
    }

    void readerFailureLines()
    {
        QFETCH(int, reader);
        QFETCH(bool, ok);
        QFETCH(QString, status);
        QFETCH(QString, reply);
        QFETCH(QString, line);
        const auto ignoreQuery = [](bool, bool, const QVariant&, const QString&, const QString&) {};
        const auto ignore = [](bool, bool, const QVariant&, const QString&) {};
        switch (reader) {
        case 0:
            ORVOSrvTunnelControl::queryAlarmCB(ok, "r", status, reply, true, ignoreQuery);
            break;
        case 1:
            ORVOSrvTunnelControl::processAlarmCB(ok, "r", status, reply, true, ignore);
            break;
        case 2:
            ORVOSrvTunnelControl::getAlarmInfoCB(ok, "r", status, reply, true, ignore);
            break;
        }
        QCOMPARE(lines(), QStringList{line});
        QVERIFY(checks().first().startsWith(QStringLiteral("%1 0 ").arg(failureLevel)));
    }

    void acceptedRepliesWriteNothing()
    {
        const auto ignore = [](bool, bool, const QVariant&, const QString&) {};
        ORVOSrvTunnelControl::processAlarmCB(true, "r", "0", "<ProcessAlarmRes/>", true, ignore);
        ORVOSrvTunnelControl::getAlarmInfoCB(true, "r", "0", "<GetAlarmInfoRes/>", true, ignore);
        QCOMPARE(m_recorder.journal(), QStringList());
    }
};

QTEST_GUILESS_MAIN(TestPluginTrace)
#include "tst_plugintrace.moc"
