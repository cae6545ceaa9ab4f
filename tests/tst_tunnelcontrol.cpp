#include "support/FakeTunnelClient.h"

#include <MessageComposer.h>
#include <ORVOSrvTunnelControl.h>
#include <PluginAlarmSearchCommon.h>

#include <QtTest>

#include <thread>
#include <type_traits>

using namespace PluginAlarmSearchCommon;

// Both vtables hold just the four operations, in order, for classes built against that layout.
static_assert(std::is_polymorphic_v<MessageComposer> &&
              !std::has_virtual_destructor_v<MessageComposer>);
static_assert(std::is_polymorphic_v<ORVOSrvTunnelControl> &&
              !std::has_virtual_destructor_v<ORVOSrvTunnelControl>);

namespace {

struct Outcome
{
    int calls = 0;
    bool ok = false;
    bool isLast = false;
    QVariant result;
    QString statusText;
    QString relayPath;
};

ORVOSrvTunnelControl::QueryAlarmCompletion recordQuery(Outcome& out)
{
    return
        [&out](bool ok, bool isLast, const QVariant& result, const QString& status,
               const QString& relay) { out = {out.calls + 1, ok, isLast, result, status, relay}; };
}

ORVOSrvTunnelControl::ReplyCompletion recordReply(Outcome& out)
{
    return [&out](bool ok, bool isLast, const QVariant& result, const QString& relay) {
        out = {out.calls + 1, ok, isLast, result, QString(), relay};
    };
}

void* const client = reinterpret_cast<void*>(0x1234);

const QString threeAlarms = QStringLiteral(
    "<QryAlarmListRes><Alarm><AlarmID>1</AlarmID></Alarm><Other/>"
    "<Alarm><AlarmID>2</AlarmID><XML>own</XML></Alarm><Alarm ID=\"3\"/></QryAlarmListRes>");

} // namespace

class TestTunnelControl : public QObject
{
    Q_OBJECT

private slots:
    void requestRecords_data()
    {
        QTest::addColumn<int>("operation");
        QTest::addColumn<QString>("method");
        QTest::addColumn<int>("kind");
        QTest::addColumn<QString>("commandText");
        QTest::addColumn<QString>("relayPath");
        QTest::addColumn<bool>("hasCallback");

        MessageComposer composer;
        const QVariantMap query{{ARG_STATE_FILTER, "<S/>"}, {ARG_RELAY_PATH, "relay/q"}};
        QTest::newRow("query") << 0 << "QryAlarmList" << 4
                               << composer.composeQueryAlarmListMessage(query) << "relay/q" << true;
        QTest::newRow("process") << 1 << "ProcessAlarm" << 4
                                 << composer.composeProcessAlarmMessage(
                                        {"7", "8"}, {{ARG_ALARM_STATUS, "Handled"}}, "done")
                                 << "relay/p" << true;
        QTest::newRow("info") << 2 << "GetAlarmInfo" << 4
                              << composer.composeGetAlarmInfoMessage("42") << "relay/i" << true;
        QTest::newRow("mute") << 3 << "MuteAlarm" << 2
                              << composer.composeMuteAlarmMessage({"7"}, true, 60) << QString()
                              << false;
    }

    void requestRecords()
    {
        QFETCH(int, operation);
        QFETCH(QString, method);
        QFETCH(int, kind);
        QFETCH(QString, commandText);
        QFETCH(QString, relayPath);
        QFETCH(bool, hasCallback);

        FakeTunnelClient tunnel;
        ORVOSrvTunnelControl control(&tunnel);
        Outcome outcome;
        switch (operation) {
        case 0:
            QVERIFY(control.queryAlarm(
                client, QVariantMap{{ARG_STATE_FILTER, "<S/>"}, {ARG_RELAY_PATH, "relay/q"}},
                recordQuery(outcome)));
            break;
        case 1:
            QVERIFY(control.processAlarm(
                client,
                {{ARG_ALARMINFO_ID_LIST, QStringList{"7", "8"}},
                 {ARG_ALARMINFO_STATUS, QVariantMap{{ARG_ALARM_STATUS, "Handled"}}},
                 {ARG_ALARMINFO_NOTE, "done"},
                 {ARG_RELAY_PATH, "relay/p"}},
                recordReply(outcome)));
            break;
        case 2:
            QVERIFY(control.getAlarmInfo(client, "42", "relay/i", recordReply(outcome)));
            break;
        case 3:
            control.muteAlarm(client, {"7"}, true, 60);
            break;
        }

        const QList<FakeTunnelClient::Record> records = tunnel.records();
        QCOMPARE(records.size(), 1);
        const FakeTunnelClient::Record& r = records.first();
        QCOMPARE(r.pluginId, QStringLiteral("C758778662E44060AC6E2EC5C9AD349B"));
        QCOMPARE(r.clientID, client);
        QCOMPARE(r.kind, kind);
        QCOMPARE(r.method, method);
        QCOMPARE(r.urgent, false);
        QCOMPARE(r.timeoutMs, 15000);
        QCOMPARE(r.commandText, commandText);
        QCOMPARE(r.relayPath, relayPath);
        QCOMPARE(bool(r.replyCallback), hasCallback);
        QCOMPARE(outcome.calls, 0); // nothing is answered before a reply arrives
    }

    void refusedAndMissingClient()
    {
        FakeTunnelClient tunnel;
        tunnel.setAccept(false);
        ORVOSrvTunnelControl refusing(&tunnel);
        Outcome outcome;
        QVERIFY(!refusing.queryAlarm(client, QVariant(), recordQuery(outcome)));
        QVERIFY(!refusing.processAlarm(client, {}, recordReply(outcome)));
        QVERIFY(!refusing.getAlarmInfo(client, "1", "r", recordReply(outcome)));
        refusing.muteAlarm(client, {}, false, 0); // result ignored
        QCOMPARE(tunnel.records().size(), 4);
        QCOMPARE(outcome.calls, 0);

        // A control around no tunnel client refuses everything instead of crashing.
        ORVOSrvTunnelControl detached(nullptr);
        IOrvoTunnelClient::InsertRequestInfo info;
        QVERIFY(!detached.sendCommand(client, METHOD_QUERY_ALARM_LIST, info));
        QVERIFY(!detached.queryAlarm(client, QVariant(), recordQuery(outcome)));
        QVERIFY(!detached.processAlarm(client, {}, recordReply(outcome)));
        QVERIFY(!detached.getAlarmInfo(client, "1", "r", recordReply(outcome)));
        detached.muteAlarm(client, {"1"}, true, 5);
        QCOMPARE(outcome.calls, 0);
    }

    // A request the composer cannot write goes nowhere and is refused like a failed send.
    void unwritableRequestsAreNotSent()
    {
        FakeTunnelClient tunnel;
        ORVOSrvTunnelControl control(&tunnel);
        Outcome outcome;
        const QString deep = QStringLiteral("<e>").repeated(5000);
        const QString badId = QStringLiteral("A1\x01");
        QVERIFY(!control.queryAlarm(client, QVariantMap{{ARG_STATE_FILTER, deep}},
                                    recordQuery(outcome)));
        QVERIFY(!control.processAlarm(client, {{ARG_ALARMINFO_ID_LIST, QStringList{badId}}},
                                      recordReply(outcome)));
        QVERIFY(!control.getAlarmInfo(client, badId, "r", recordReply(outcome)));
        control.muteAlarm(client, {badId}, true, 5);
        QCOMPARE(tunnel.records().size(), 0);
        QCOMPARE(outcome.calls, 0);
    }

    void nonMapArgumentsStillQuery()
    {
        FakeTunnelClient tunnel;
        ORVOSrvTunnelControl control(&tunnel);
        Outcome outcome;
        QVERIFY(control.queryAlarm(client, QVariant(QStringLiteral("not a map")),
                                   recordQuery(outcome)));
        QCOMPARE(tunnel.last().commandText,
                 MessageComposer().composeQueryAlarmListMessage(QVariantMap()));
        QCOMPARE(tunnel.last().relayPath, QString());
    }

    // Every reader judges the status the same way; flags and relay path pass through on every
    // path.
    void statusJudging_data()
    {
        QTest::addColumn<bool>("ok");
        QTest::addColumn<QString>("status");
        QTest::addColumn<bool>("accepted");
        QTest::newRow("0") << true << "0" << true;
        QTest::newRow("7FFFFFFF") << true << "7FFFFFFF" << true;
        QTest::newRow("empty") << true << "" << true;
        QTest::newRow("not hex") << true << "xyz" << true;
        QTest::newRow("80000000") << true << "80000000" << false;
        QTest::newRow("FFFFFFFF") << true << "FFFFFFFF" << false;
        QTest::newRow("lower-case c0000001") << true << "c0000001" << false;
        QTest::newRow("bit 31 of a 64-bit status") << true << "180000000" << false;
        QTest::newRow("transport failure") << false << "0" << false;
    }

    void statusJudging()
    {
        QFETCH(bool, ok);
        QFETCH(QString, status);
        QFETCH(bool, accepted);

        for (const bool isLast : {false, true}) {
            const FakeTunnelClient::Reply reply{
                ok, "relay/x", status, "<QryAlarmListRes><Alarm/></QryAlarmListRes>", isLast};
            FakeTunnelClient tunnel;
            ORVOSrvTunnelControl control(&tunnel);

            Outcome query;
            control.queryAlarm(client, QVariant(), recordQuery(query));
            tunnel.reply(reply);
            QCOMPARE(query.calls, 1);
            QCOMPARE(query.ok, accepted);
            QCOMPARE(query.isLast, isLast);
            QCOMPARE(query.statusText, status);
            QCOMPARE(query.relayPath, QStringLiteral("relay/x"));
            QCOMPARE(query.result.isValid(), accepted);

            Outcome process;
            control.processAlarm(client, {}, recordReply(process));
            tunnel.reply(reply);
            QCOMPARE(process.ok, accepted);
            QCOMPARE(process.isLast, isLast);
            QCOMPARE(process.relayPath, QStringLiteral("relay/x"));
            QCOMPARE(process.result.isValid(), accepted);

            Outcome info;
            control.getAlarmInfo(client, "1", "ignored", recordReply(info));
            tunnel.reply(reply);
            QCOMPARE(info.ok, accepted);
            QCOMPARE(info.isLast, isLast);
            QCOMPARE(info.relayPath, QStringLiteral("relay/x"));
            QCOMPARE(info.result.isValid(), accepted);
        }
    }

    void unparseableReplies_data()
    {
        QTest::addColumn<QString>("replyText");
        QTest::newRow("empty") << QString();
        QTest::newRow("not xml") << "this is not xml";
        QTest::newRow("truncated") << "<QryAlarmListRes><Alarm>";
        QTest::newRow("two roots") << "<A/><B/>";
    }

    void unparseableReplies()
    {
        QFETCH(QString, replyText);
        FakeTunnelClient tunnel;
        ORVOSrvTunnelControl control(&tunnel);
        Outcome query, process, info;
        control.queryAlarm(client, QVariant(), recordQuery(query));
        tunnel.reply({true, "r", "0", replyText, false});
        control.processAlarm(client, {}, recordReply(process));
        tunnel.reply({true, "r", "0", replyText, false});
        control.getAlarmInfo(client, "1", "r", recordReply(info));
        tunnel.reply({true, "r", "0", replyText, false});
        for (const Outcome* o : {&query, &process, &info}) {
            QCOMPARE(o->calls, 1);
            QVERIFY(!o->ok);
            QVERIFY(!o->result.isValid());
            QCOMPARE(o->relayPath, QStringLiteral("r"));
        }
        QCOMPARE(query.statusText, QStringLiteral("0"));
    }

    void structurallyEmptyReplies_data()
    {
        QTest::addColumn<QString>("replyText");
        QTest::newRow("other root") << "<Unexpected><Alarm/><Result/></Unexpected>";
        QTest::newRow("empty roots") << "<QryAlarmListRes/>";
        QTest::newRow("info without change log")
            << "<GetAlarmInfoRes><Alarm><AlarmID>1</AlarmID></Alarm></GetAlarmInfoRes>";
    }

    void structurallyEmptyReplies()
    {
        QFETCH(QString, replyText);
        Outcome query, process, info;
        ORVOSrvTunnelControl::queryAlarmCB(true, "r", "0", replyText, true, recordQuery(query));
        ORVOSrvTunnelControl::processAlarmCB(true, "r", "0", replyText, true, recordReply(process));
        ORVOSrvTunnelControl::getAlarmInfoCB(true, "r", "0", replyText, true, recordReply(info));
        for (const Outcome* o : {&query, &process, &info}) {
            QVERIFY(o->ok);
            QCOMPARE(o->result.typeId(), QMetaType::QVariantList);
            QCOMPARE(o->result.toList(), QVariantList());
        }
    }

    void alarmsPairedWithTheirXml()
    {
        Outcome out;
        ORVOSrvTunnelControl::queryAlarmCB(true, "r", "0", threeAlarms, true, recordQuery(out));
        QVERIFY(out.ok);
        const QVariantList alarms = out.result.toList();
        QCOMPARE(alarms.size(), 3);
        QCOMPARE(
            alarms.at(0).toMap(),
            (QVariantMap{{"AlarmID", "1"},
                         {"XML", "    <Alarm>\n        <AlarmID>1</AlarmID>\n    </Alarm>\n"}}));
        // The alarm's own "XML" child is replaced by its text.
        QCOMPARE(alarms.at(1).toMap().value("XML").toString(),
                 QStringLiteral("    <Alarm>\n        <AlarmID>2</AlarmID>\n"
                                "        <XML>own</XML>\n    </Alarm>\n"));
        QCOMPARE(alarms.at(1).toMap().value("AlarmID").toString(), QStringLiteral("2"));
        QCOMPARE(alarms.at(2).toMap(),
                 (QVariantMap{{"@ID", "3"}, {"XML", "    <Alarm ID=\"3\"/>\n"}}));

        Outcome single;
        ORVOSrvTunnelControl::queryAlarmCB(
            true, "r", "0", "<QryAlarmListRes><Alarm><A>x</A></Alarm></QryAlarmListRes>", false,
            recordQuery(single));
        QCOMPARE(single.result.toList().size(), 1);
        QCOMPARE(single.result.toList().first().toMap().value("A").toString(), QStringLiteral("x"));
    }

    void processOutcomes()
    {
        Outcome out;
        ORVOSrvTunnelControl::processAlarmCB(
            true, "r", "0",
            "<ProcessAlarmRes><Result><AlarmID>7</AlarmID><Code>0</Code><Extra>x</Extra></Result>"
            "<Result><AlarmID>8</AlarmID></Result></ProcessAlarmRes>",
            true, recordReply(out));
        QVERIFY(out.ok);
        QCOMPARE(out.result.toList(),
                 (QVariantList{QVariantMap{{"alarmId", "7"}, {"updateResult", "0"}},
                               QVariantMap{{"alarmId", "8"}, {"updateResult", ""}}}));
    }

    void changeLogEntries()
    {
        Outcome out;
        ORVOSrvTunnelControl::getAlarmInfoCB(
            true, "r", "0",
            "<GetAlarmInfoRes><Alarm><AlarmID>1</AlarmID><ChangeLogs>"
            "<Entry><State>A</State></Entry><Entry><State>B</State><Note>n</Note></Entry>"
            "<Entry/></ChangeLogs></Alarm></GetAlarmInfoRes>",
            true, recordReply(out));
        QVERIFY(out.ok);
        QCOMPARE(out.result.toList(),
                 (QVariantList{QVariantMap{{"State", "A"}},
                               QVariantMap{{"State", "B"}, {"Note", "n"}}, QString()}));

        Outcome single;
        ORVOSrvTunnelControl::getAlarmInfoCB(
            true, "r", "0",
            "<GetAlarmInfoRes><Alarm><ChangeLogs><Entry><State>A</State></Entry></ChangeLogs>"
            "</Alarm></GetAlarmInfoRes>",
            true, recordReply(single));
        QCOMPARE(single.result.toList(), (QVariantList{QVariantMap{{"State", "A"}}}));
    }

    // The tunnel may call a reply callback more than once, from any thread, even after the
    // control that sent the request is gone.
    void repeatedRepliesOnOtherThreadsAfterDestruction()
    {
        FakeTunnelClient tunnel;
        std::atomic<int> calls{0};
        std::atomic<int> alarms{0};
        {
            ORVOSrvTunnelControl control(&tunnel);
            control.queryAlarm(
                client, QVariant(),
                [&](bool ok, bool, const QVariant& result, const QString&, const QString&) {
                    ++calls;
                    if (ok)
                        alarms += int(result.toList().size());
                });
        }
        const FakeTunnelClient::Record record = tunnel.last();
        std::vector<std::thread> threads;
        threads.reserve(4);
        for (int i = 0; i < 4; ++i) {
            threads.emplace_back([&] {
                for (int j = 0; j < 25; ++j)
                    FakeTunnelClient::deliver(record, {true, "r", "0", threeAlarms, j == 24});
            });
        }
        for (std::thread& t : threads)
            t.join();
        QCOMPARE(calls.load(), 100);
        QCOMPARE(alarms.load(), 300);
    }

    void replacedComposerIsUsed()
    {
        struct Fixed : MessageComposer
        {
            QString composeGetAlarmInfoMessage(const QString&) override { return "<Fixed/>"; }
        };
        FakeTunnelClient tunnel;
        ORVOSrvTunnelControl control(&tunnel);
        control.setMessageComposer(QSharedPointer<Fixed>::create());
        Outcome out;
        control.getAlarmInfo(client, "1", "r", recordReply(out));
        QCOMPARE(tunnel.last().commandText, QStringLiteral("<Fixed/>"));
    }
};

QTEST_GUILESS_MAIN(TestTunnelControl)
#include "tst_tunnelcontrol.moc"
