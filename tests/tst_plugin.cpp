#include "support/FakeHost.h"

#include <MessageComposer.h>
#include <ORVOSrvTunnelControl.h>
#include <PluginAlarmSearchCommon.h>
#include <PluginAlarmSearchSrv.h>
#include <RequestSenderInfo.h>

#include <QtTest>

#include <memory>
#include <thread>

using namespace PluginAlarmSearchCommon;

Q_DECLARE_METATYPE(HDLR_DO_REQUEST_CB)

namespace {

const QString pluginId = QStringLiteral("C758778662E44060AC6E2EC5C9AD349B");
Qt::HANDLE const clientHandle = reinterpret_cast<Qt::HANDLE>(0xC11E);

RequestSenderInfo senderInfo()
{
    RequestSenderInfo info;
    info.clientHandle = clientHandle;
    return info;
}

// A started plug-in with its fake host.
struct Fixture
{
    FakeHost host;
    std::unique_ptr<PluginAlarmSearchSrv> plugin = std::make_unique<PluginAlarmSearchSrv>();

    explicit Fixture(bool start = true)
    {
        if (start)
            plugin->InitialPluginBase(&host);
    }

    void request(const QString& method, const QVariantMap& args)
    {
        plugin->Request(method, args, senderInfo(), host.answerSink());
    }

    void subscribe(const QString& key)
    {
        UntouchedResponser responser;
        plugin->SubscribeEventBlock(key, EVENT_ALARM_UPDATED, QVariant(), senderInfo(), responser);
        QCOMPARE(responser.calls, 0);
    }

    void unsubscribe(const QString& key)
    {
        UntouchedResponser responser;
        plugin->UnsubscribeEventBlock(key, QVariant(), responser);
    }
};

// An answer as one comparable value; the plug-in never sends a message text.
QVariant answer(bool isLast, const QString& code, const QVariant& result = QVariant())
{
    return QVariantList{isLast, code, QString(), result};
}

QVariantList answers(const FakeHost& host)
{
    QVariantList list;
    for (const FakeHost::Answer& a : host.answers())
        list.append(QVariant(QVariantList{a.isLast, a.resultCode, a.message, a.result}));
    return list;
}

const QString processReply =
    QStringLiteral("<ProcessAlarmRes><Result><AlarmID>A1</AlarmID><Code>0</Code></Result>"
                   "<Result><AlarmID>A2</AlarmID><Code>1</Code></Result></ProcessAlarmRes>");

} // namespace

class TestPlugin : public QObject
{
    Q_OBJECT

private slots:
    // Method names are matched exactly; the server's own command names are not methods, and a
    // blocking request is served by nothing.
    void unknownMethodsSendNothing_data()
    {
        QTest::addColumn<QString>("method");
        for (const char* method : {"qryalarmlist", "ProcessAlarm", "GetAlarmInfo", ""})
            QTest::newRow(method) << QString::fromUtf8(method);
    }

    void unknownMethodsSendNothing()
    {
        QFETCH(QString, method);
        Fixture f;
        f.request(method, {{ARG_ALARM_ID, "A1"}, {ARG_ALARM_ID_LIST, QStringList{"A1"}}});
        UntouchedResponser responser;
        f.plugin->RequestBlock(METHOD_QUERY_ALARM_LIST, QVariantMap(), senderInfo(), responser);
        QCOMPARE(responser.calls, 0);
        QVERIFY(f.host.tunnel.records().isEmpty());
        QVERIFY(f.host.answers().isEmpty());
    }

    void queryAnswers()
    {
        Fixture f;
        f.request(METHOD_QUERY_ALARM_LIST, {{ARG_RELAY_PATH, "relay/q"}});
        f.host.tunnel.replyOnThread(
            {true, "relay/t", "0",
             "<QryAlarmListRes><Alarm><AlarmID>A1</AlarmID></Alarm></QryAlarmListRes>", false});
        f.host.tunnel.replyOnThread({true, "relay/t", "80000001", "", false});
        f.host.tunnel.replyOnThread({true, "relay/t", "0", "<broken", true});

        // A failed or unreadable reply has the same shape; the status text and the empty list
        // tell it apart.
        const QVariantMap empty{{"queryResult", QVariantList()}, {"relayPath", "relay/t"}};
        const QVariantMap ok{
            {"queryResult",
             QVariantList{QVariantMap{
                 {"AlarmID", "A1"},
                 {"XML", "    <Alarm>\n        <AlarmID>A1</AlarmID>\n    </Alarm>\n"}}}},
            {"relayPath", "relay/t"}};
        QCOMPARE(answers(f.host),
                 (QVariantList{answer(false, "0", ok), answer(false, "80000001", empty),
                               answer(true, "0", empty)}));
    }

    // A request the tunnel refuses, or that finds no tunnel control (before start-up, or with a
    // null tunnel client from the host), is answered at once as not sent.
    void notSent_data()
    {
        QTest::addColumn<QString>("method");
        QTest::addColumn<int>("situation");
        const QStringList methods{"QryAlarmList", "UpdateAlarm", "GetAlarmHistory"};
        const QStringList situations{"refused", "not started", "null tunnel client"};
        for (const QString& m : methods)
            for (int s = 0; s < situations.size(); ++s)
                QTest::addRow("%s, %s", qPrintable(m), qPrintable(situations.at(s))) << m << s;
    }

    void notSent()
    {
        QFETCH(QString, method);
        QFETCH(int, situation);
        Fixture f(false);
        if (situation == 0)
            f.host.tunnel.setAccept(false);
        if (situation == 2)
            f.host.tunnelClient = nullptr;
        if (situation != 1)
            QVERIFY(f.plugin->InitialPluginBase(&f.host));
        f.subscribe("key");

        f.request(method, {{ARG_ALARM_ID_LIST, QStringList{"A1"}}, {ARG_RELAY_PATH, "r"}});
        QCOMPARE(answers(f.host), QVariantList{answer(true, "-1")});
        QVERIFY(f.host.events().isEmpty());

        f.request(METHOD_MUTE_ALARM, {{ARG_ALARM_ID_LIST, QStringList{"A1"}}});
        QCOMPARE(f.host.answers().size(), 1);
    }

    // The plug-in hands the composer the request's values and the tunnel what the composer
    // wrote; the commands' bytes themselves are the composer's.
    void commands_data()
    {
        QTest::addColumn<QString>("method");
        QTest::addColumn<QVariantMap>("args");
        QTest::addColumn<QString>("command");
        QTest::addColumn<QString>("relayPath");
        MessageComposer composer;
        const QStringList ids{"A1", "A2"};
        QTest::newRow("update") << METHOD_UPDATE_ALARM
                                << QVariantMap{{ARG_ALARM_ID_LIST, ids},
                                               {ARG_ALARM_STATUS, "Handled"},
                                               {ARG_ALARM_COMMENT, "checked on site"},
                                               {ARG_RELAY_PATH, "relay/u"}}
                                << composer.composeProcessAlarmMessage(
                                       ids, {{ARG_ALARM_STATUS, "Handled"}}, "checked on site")
                                << "relay/u";
        // The methods of each pair send the same command.
        const QVariantMap query{{ARG_STATE_FILTER, "<AlarmStateList><State>Unhandled</State>"
                                                   "</AlarmStateList>"},
                                {ARG_START_TIME, "2026-11-01T00:00:00"},
                                {ARG_RELAY_PATH, "relay/q"}};
        for (const QString& method : {METHOD_QUERY_ALARM_LIST, METHOD_QUERY_UNHANDLED_ALARM})
            QTest::newRow(qPrintable(method))
                << method << query << composer.composeQueryAlarmListMessage(query) << "relay/q";
        const QVariantMap history{{ARG_ALARM_ID, "A9"}, {ARG_RELAY_PATH, "relay/h"}};
        for (const QString& method :
             {METHOD_GET_ALARM_HISTORY, METHOD_GET_ALARM_HISTORY_FOR_EXPORT})
            QTest::newRow(qPrintable(method))
                << method << history << composer.composeGetAlarmInfoMessage("A9") << "relay/h";
        QTest::newRow("mute, ids only")
            << METHOD_MUTE_ALARM << QVariantMap{{ARG_ALARM_ID_LIST, QStringList{"A1"}}}
            << composer.composeMuteAlarmMessage({"A1"}, false, 0) << QString();
        QTest::newRow("mute, digits as text")
            << METHOD_MUTE_ALARM
            << QVariantMap{{ARG_ALARM_ID_LIST, ids},
                           {ARG_IS_MUTE, true},
                           {ARG_MUTE_TIME_SECOND, "15"}}
            << composer.composeMuteAlarmMessage(ids, true, 15) << QString();
        QTest::newRow("mute, no number")
            << METHOD_MUTE_ALARM << QVariantMap{{ARG_IS_MUTE, true}, {ARG_MUTE_TIME_SECOND, "soon"}}
            << composer.composeMuteAlarmMessage({}, true, 0) << QString();
    }

    void commands()
    {
        QFETCH(QString, method);
        QFETCH(QVariantMap, args);
        QFETCH(QString, command);
        QFETCH(QString, relayPath);
        Fixture f;
        f.request(method, args);
        QCOMPARE(f.host.tunnel.records().size(), 1);
        const FakeTunnelClient::Record r = f.host.tunnel.last();
        QCOMPARE(r.clientID, clientHandle);
        QCOMPARE(r.commandText, command);
        QCOMPARE(r.relayPath, relayPath);
        // A mute is sent without waiting for a reply, and never answered.
        QCOMPARE(bool(r.replyCallback), method != METHOD_MUTE_ALARM);
        QVERIFY(f.host.answers().isEmpty());
    }

    void updatePublishesBeforeAnswering_data()
    {
        QTest::addColumn<QString>("reply");
        QTest::addColumn<QVariantList>("results");
        const auto result = [](const char* id, const char* code) {
            return QVariantMap{{"alarmId", id}, {"alarmStatus", "Handled"}, {"updateResult", code}};
        };
        QTest::newRow("two results")
            << processReply << QVariantList{result("A1", "0"), result("A2", "1")};
        QTest::newRow("no results") << "<ProcessAlarmRes/>" << QVariantList();
    }

    void updatePublishesBeforeAnswering()
    {
        QFETCH(QString, reply);
        QFETCH(QVariantList, results);
        Fixture f;
        f.subscribe("k1");
        f.subscribe("k2");
        f.request(METHOD_UPDATE_ALARM, {{ARG_ALARM_ID_LIST, QStringList{"A1", "A2"}},
                                        {ARG_ALARM_STATUS, "Handled"},
                                        {ARG_RELAY_PATH, "relay/request"}});
        f.host.tunnel.replyOnThread({true, "relay/tunnel", "0", reply, false});

        QCOMPARE(f.host.journal(), (QStringList{"event k1", "event k2", "answer 0"}));
        QCOMPARE(answers(f.host), QVariantList{answer(false, "0")});
        const QVariantMap expected{{"alarmUpdatedResults", results},
                                   {"relayPath", "relay/request"}};
        for (const FakeHost::Event& e : f.host.events()) {
            QCOMPARE(e.pluginId, pluginId);
            QCOMPARE(e.eventName, QStringLiteral("AlarmUpdated"));
            QCOMPARE(e.eventData.toMap(), expected);
            QVERIFY(e.eventTime > 0);
        }
    }

    void failedUpdateReply()
    {
        Fixture f;
        f.subscribe("k");
        f.request(METHOD_UPDATE_ALARM,
                  {{ARG_ALARM_ID_LIST, QStringList{"A1"}}, {ARG_RELAY_PATH, "relay/request"}});
        f.host.tunnel.reply({true, "relay/tunnel", "80000000", processReply, false});
        QVERIFY(f.host.events().isEmpty());
        const QVariantMap sent{{"alarmIdList", QStringList{"A1"}}, {"relayPath", "relay/request"}};
        QCOMPARE(answers(f.host), QVariantList{answer(false, "-1", sent)});
    }

    void historyAnswers()
    {
        Fixture f;
        f.request(METHOD_GET_ALARM_HISTORY, {{ARG_ALARM_ID, "A9"}});
        f.host.tunnel.replyOnThread(
            {true, "x", "0",
             "<GetAlarmInfoRes><Alarm><ChangeLogs><Entry><State>New</State></Entry>"
             "<Entry><State>Handled</State></Entry></ChangeLogs></Alarm></GetAlarmInfoRes>",
             false});
        f.host.tunnel.replyOnThread({false, "x", "0", "", true});

        const QVariantList states{QVariantMap{{"State", "New"}}, QVariantMap{{"State", "Handled"}}};
        QCOMPARE(answers(f.host), (QVariantList{answer(false, "0", states), answer(true, "-1")}));
    }

    void subscriptions()
    {
        Fixture f;
        f.subscribe("a");
        f.subscribe("b");
        f.subscribe("a");
        f.subscribe("A");
        f.unsubscribe("missing");
        f.plugin->emitEventSignal("E", QVariant());
        QStringList keys;
        for (const FakeHost::Event& e : f.host.events())
            keys << e.subscriptionKey;
        QCOMPARE(keys, (QStringList{"a", "b", "A"}));
        QVERIFY(f.host.events().first().eventData.isNull());

        f.unsubscribe("a");
        f.unsubscribe("b");
        f.unsubscribe("A");
        f.plugin->emitEventSignal("E", 1);
        QCOMPARE(f.host.events().size(), 3);
    }

    void publishingWithoutAHostCallbackCallsNothing()
    {
        Fixture notStarted(false);
        notStarted.subscribe("k");
        notStarted.plugin->emitEventSignal("E", 1); // must not call an empty callback

        Fixture emptyCallback(false);
        emptyCallback.host.eventSignal = nullptr;
        emptyCallback.plugin->InitialPluginBase(&emptyCallback.host);
        emptyCallback.subscribe("k");
        emptyCallback.request(METHOD_UPDATE_ALARM, {});
        emptyCallback.host.tunnel.reply({true, "", "0", processReply, true});
        QCOMPARE(emptyCallback.host.answers().size(), 1);
    }

    void startUp()
    {
        // An installed tunnel control is kept; the host's tunnel client is not asked for.
        FakeHost host;
        FakeTunnelClient own;
        PluginAlarmSearchSrv plugin;
        plugin.setORVOSrvTunnelCtrl(QSharedPointer<ORVOSrvTunnelControl>::create(&own));
        QVERIFY(plugin.InitialPluginBase(&host));
        QCOMPARE(host.tunnelClientAsked, 0);
        plugin.Request(METHOD_GET_ALARM_HISTORY, QVariantMap(), senderInfo(), host.answerSink());
        QCOMPARE(own.records().size(), 1);
        QVERIFY(host.tunnel.records().isEmpty());

        // A second start-up replaces the event callback and keeps the control.
        FakeHost second;
        QVERIFY(plugin.InitialPluginBase(&second));
        QCOMPARE(second.tunnelClientAsked, 0);
        UntouchedResponser responser;
        plugin.SubscribeEventBlock("k", QString(), QVariant(), senderInfo(), responser);
        plugin.emitEventSignal("E", 1);
        QVERIFY(host.events().isEmpty());
        QCOMPARE(second.events().size(), 1);
    }

    // Bad input from the host is survived: no framework tools, an empty client callback.
    void badHostInput()
    {
        Fixture f(false);
        QVERIFY(f.plugin->InitialPluginBase(nullptr));
        f.request(METHOD_QUERY_ALARM_LIST, {});
        QCOMPARE(answers(f.host), QVariantList{answer(true, "-1")});

        QVERIFY(f.plugin->InitialPluginBase(&f.host));
        for (const QString& method :
             {METHOD_QUERY_ALARM_LIST, METHOD_UPDATE_ALARM, METHOD_GET_ALARM_HISTORY}) {
            f.plugin->Request(method, QVariantMap(), senderInfo(), HDLR_DO_REQUEST_CB());
            f.host.tunnel.replyOnThread({true, "", "0", processReply, true});
        }
        QCOMPARE(f.host.tunnel.records().size(), 3);
        f.host.tunnel.setAccept(false);
        f.plugin->Request(METHOD_UPDATE_ALARM, QVariantMap(), senderInfo(), HDLR_DO_REQUEST_CB());
        QCOMPARE(f.host.answers().size(), 1);
    }

    // A reply that arrives after the plug-in was deleted reaches neither the plug-in nor the
    // client: no answer, no event.
    void updateReplyAfterDeletion()
    {
        Fixture f;
        f.subscribe("k");
        f.request(METHOD_UPDATE_ALARM, {{ARG_ALARM_ID_LIST, QStringList{"A1"}}});
        f.request(METHOD_QUERY_ALARM_LIST, {});
        const QList<FakeTunnelClient::Record> pending = f.host.tunnel.records();
        f.plugin.reset();
        std::thread([&] {
            for (const FakeTunnelClient::Record& r : pending)
                FakeTunnelClient::deliver(r, {true, "", "0", processReply, true});
        }).join();
        QVERIFY(f.host.events().isEmpty());
        // The query completion holds nothing of the plug-in and still answers its client.
        QCOMPARE(f.host.journal(), QStringList{"answer 0"});
    }

    // The host may delete the plug-in from inside a callback of an update's reply, on the thread
    // that delivers it: the deletion does not wait for that reply, whose remaining subscribers
    // and client are still served.
    void deletionFromInsideAnUpdateReply_data()
    {
        QTest::addColumn<bool>("inEvent");
        QTest::newRow("event callback") << true;
        QTest::newRow("answer callback") << false;
    }

    void deletionFromInsideAnUpdateReply()
    {
        QFETCH(bool, inEvent);
        Fixture f(false);
        const HDLR_EVENT_SIGNAL_CB recordEvent = f.host.eventSignal;
        f.host.eventSignal = [&](const PluginObjBase_EventSignalInfo* info) {
            recordEvent(info);
            if (inEvent)
                f.plugin.reset();
        };
        f.plugin->InitialPluginBase(&f.host);
        f.subscribe("k1");
        f.subscribe("k2");
        const HDLR_DO_REQUEST_CB recordAnswer = f.host.answerSink();
        f.plugin->Request(
            METHOD_UPDATE_ALARM, QVariantMap{{ARG_ALARM_ID_LIST, QStringList{"A1"}}}, senderInfo(),
            [&](bool isLast, const QString& code, const QString& message, const QVariant& result) {
                recordAnswer(isLast, code, message, result);
                f.plugin.reset();
            });
        f.host.tunnel.replyOnThread({true, "", "0", processReply, true});

        QVERIFY(!f.plugin);
        QCOMPARE(f.host.journal(), (QStringList{"event k1", "event k2", "answer 0"}));
    }

    void invokableQueryThroughTheMetaObject()
    {
        Fixture f;
        const HDLR_DO_REQUEST_CB callback = f.host.answerSink();
        const QVariant args = QVariantMap{{ARG_RELAY_PATH, "relay/m"}};
        QVERIFY(QMetaObject::invokeMethod(f.plugin.get(), "handleQueryAlarm", Qt::DirectConnection,
                                          Q_ARG(Qt::HANDLE, clientHandle), Q_ARG(QVariant, args),
                                          Q_ARG(HDLR_DO_REQUEST_CB, callback)));
        QCOMPARE(f.host.tunnel.last().relayPath, QStringLiteral("relay/m"));
        QCOMPARE(f.host.tunnel.last().clientID, clientHandle);
    }
};

QTEST_GUILESS_MAIN(TestPlugin)
#include "tst_plugin.moc"
