// The tunnel control: what it hands the tunnel for each operation, and what its readers make of
// the replies.

#include "support/ReaderRun.h"

#include <MessageComposer.h>
#include <ORVOSrvTunnelControl.h>
#include <PluginAlarmSearchCommon.h>

#include <QtTest>

#include <type_traits>

using namespace PluginAlarmSearchCommon;

// Both vtables hold just the four operations, in order, for classes built against that layout.
static_assert(std::is_polymorphic_v<MessageComposer> &&
              !std::has_virtual_destructor_v<MessageComposer>);
static_assert(std::is_polymorphic_v<ORVOSrvTunnelControl> &&
              !std::has_virtual_destructor_v<ORVOSrvTunnelControl>);

namespace {

// Writes back the arguments it is given, so that a test sees what the control handed it; a
// value "bad" makes a command it cannot write.
struct EchoComposer : MessageComposer
{
    static QString unless(const QString& text) { return text.contains("bad") ? QString() : text; }
    QString composeQueryAlarmListMessage(const QVariant& args) override
    {
        return unless("query " + args.toMap().value(ARG_STATE_FILTER).toString());
    }
    QString composeProcessAlarmMessage(const QList<QString>& ids, const QVariantMap& status,
                                       const QString& note) override
    {
        return unless("process " + ids.join(',') + ' ' + status.value(ARG_ALARM_STATUS).toString() +
                      ' ' + note);
    }
    QString composeGetAlarmInfoMessage(const QString& id) override { return unless("info " + id); }
    QString composeMuteAlarmMessage(const QList<QString>& ids, bool mute, int interval) override
    {
        return unless(QStringLiteral("mute %1 %2 %3").arg(ids.join(',')).arg(mute).arg(interval));
    }
};

enum Operation { Query, Process, Info, Mute };

void* const client = reinterpret_cast<void*>(0x1234);

// Runs one operation with the given request values; returns whether the control says it sent.
bool run(ORVOSrvTunnelControl& control, Operation operation, const QVariant& args,
         ReaderOutcome& out)
{
    const QVariantMap map = args.toMap();
    const QStringList ids = map.value(ARG_ALARMINFO_ID_LIST).toStringList();
    switch (operation) {
    case Query:
        return control.queryAlarm(client, args, recordQuery(out));
    case Process:
        return control.processAlarm(client, map, recordReply(out));
    case Info:
        return control.getAlarmInfo(client, ids.value(0), map.value(ARG_RELAY_PATH).toString(),
                                    recordReply(out));
    case Mute:
        control.muteAlarm(client, ids, true, 60);
        return true;
    }
    return false;
}

const QString threeAlarms = QStringLiteral(
    "<QryAlarmListRes><Alarm><AlarmID>1</AlarmID></Alarm><Other/>"
    "<Alarm><AlarmID>2</AlarmID><XML>own</XML></Alarm><Alarm ID=\"3\"/></QryAlarmListRes>");

} // namespace

class TestTunnelControl : public QObject
{
    Q_OBJECT

private slots:
    void requests_data()
    {
        QTest::addColumn<int>("operation");
        QTest::addColumn<QVariant>("args");
        QTest::addColumn<QString>("command"); // empty: nothing is sent
        QTest::addColumn<QString>("method");
        QTest::addColumn<QString>("relayPath");

        const auto row = [](const char* name, Operation operation, const QVariant& args,
                            const char* command, const char* method, const char* relayPath) {
            QTest::newRow(name) << int(operation) << args << QString(command) << QString(method)
                                << QString(relayPath);
        };
        const QVariantMap process{
            {ARG_ALARMINFO_ID_LIST, QStringList{"7", "8"}},
            {ARG_ALARMINFO_STATUS, QVariantMap{{ARG_ALARM_STATUS, "Handled"}}},
            {ARG_ALARMINFO_NOTE, "done"},
            {ARG_RELAY_PATH, "relay/p"}};
        const QVariantMap ids{{ARG_ALARMINFO_ID_LIST, QStringList{"7"}}, {ARG_RELAY_PATH, "r/i"}};
        row("query", Query, QVariantMap{{ARG_STATE_FILTER, "<S/>"}, {ARG_RELAY_PATH, "relay/q"}},
            "query <S/>", "QryAlarmList", "relay/q");
        row("query, not a map", Query, "<S/>", "query ", "QryAlarmList", "");
        row("process", Process, process, "process 7,8 Handled done", "ProcessAlarm", "relay/p");
        row("info", Info, ids, "info 7", "GetAlarmInfo", "r/i");
        row("mute", Mute, ids, "mute 7 1 60", "MuteAlarm", "");
        const QVariantMap bad{{ARG_STATE_FILTER, "bad"},
                              {ARG_ALARMINFO_ID_LIST, QStringList{"bad"}}};
        for (const Operation operation : {Query, Process, Info, Mute})
            QTest::addRow("unwritable, operation %d", operation)
                << int(operation) << QVariant(bad) << QString() << QString() << QString();
    }

    // The control sends what its composer writes, and nothing when the composer cannot write it.
    void requests()
    {
        QFETCH(int, operation);
        QFETCH(QVariant, args);
        QFETCH(QString, command);
        QFETCH(QString, method);
        QFETCH(QString, relayPath);

        FakeTunnelClient tunnel;
        ORVOSrvTunnelControl control(&tunnel);
        control.setMessageComposer(QSharedPointer<EchoComposer>::create());
        ReaderOutcome outcome;
        QCOMPARE(run(control, Operation(operation), args, outcome),
                 !command.isEmpty() || operation == Mute);
        QCOMPARE(outcome.calls, 0); // nothing is answered before a reply arrives
        QCOMPARE(tunnel.records().size(), command.isEmpty() ? 0 : 1);
        if (command.isEmpty())
            return;
        const FakeTunnelClient::Record& r = tunnel.last();
        QCOMPARE(r.pluginId, QStringLiteral("C758778662E44060AC6E2EC5C9AD349B"));
        QCOMPARE(r.clientID, client);
        QCOMPARE(r.kind, operation == Mute ? 2 : 4);
        QCOMPARE(r.method, method);
        QCOMPARE(r.urgent, false);
        QCOMPARE(r.timeoutMs, 15000);
        QCOMPARE(r.commandText, command);
        QCOMPARE(r.relayPath, relayPath);
        QCOMPARE(bool(r.replyCallback), operation != Mute);
    }

    // Every reader judges the status and reads the reply the same way; flags and relay path pass
    // through on every path.
    void readers_data()
    {
        QTest::addColumn<bool>("ok");
        QTest::addColumn<QString>("status");
        QTest::addColumn<QString>("reply");
        QTest::addColumn<QList<int>>("items"); // per reader; empty: refused

        const QString one = QStringLiteral("<QryAlarmListRes><Alarm/></QryAlarmListRes>");
        const QList<int> read{1, 0, 0};
        for (const char* status : {"0", "7FFFFFFF", "", "xyz"})
            QTest::addRow("status %s", status) << true << status << one << read;
        for (const char* status : {"80000000", "FFFFFFFF", "c0000001", "180000000"})
            QTest::addRow("status %s", status) << true << status << one << QList<int>();
        QTest::newRow("transport failure") << false << "0" << one << QList<int>();
        for (const char* reply : {"", "this is not xml", "<QryAlarmListRes><Alarm>", "<A/><B/>"})
            QTest::addRow("unparseable %s", reply) << true << "0" << reply << QList<int>();
        for (const char* reply :
             {"<Unexpected><Alarm/><Result/></Unexpected>", "<QryAlarmListRes/>",
              "<GetAlarmInfoRes><Alarm><AlarmID>1</AlarmID></Alarm></GetAlarmInfoRes>"})
            QTest::addRow("nothing to read in %s", reply)
                << true << "0" << reply << QList<int>{0, 0, 0};
    }

    void readers()
    {
        QFETCH(bool, ok);
        QFETCH(QString, status);
        QFETCH(QString, reply);
        QFETCH(QList<int>, items);
        for (const bool isLast : {false, true}) {
            for (const Operation reader : {Query, Process, Info}) {
                const ReaderOutcome o =
                    readReply(Reader(reader), {ok, "relay/x", status, reply, isLast});
                QCOMPARE(o.calls, 1);
                QCOMPARE(o.ok, !items.isEmpty());
                QCOMPARE(o.isLast, isLast);
                QCOMPARE(o.relayPath, QStringLiteral("relay/x"));
                QCOMPARE(o.statusText, reader == Query ? status : QString());
                QCOMPARE(o.result.isValid(), o.ok);
                if (o.ok)
                    QCOMPARE(o.result.toList().size(), items.at(reader));
            }
        }
    }

    void readerResults()
    {
        // The alarm's own "XML" child is replaced by its text.
        QCOMPARE(readReply(Reader::Query, {true, "", "0", threeAlarms, true}).result.toList(),
                 (QVariantList{QVariantMap{{"AlarmID", "1"},
                                           {"XML", "    <Alarm>\n        <AlarmID>1</AlarmID>\n"
                                                   "    </Alarm>\n"}},
                               QVariantMap{{"AlarmID", "2"},
                                           {"XML", "    <Alarm>\n        <AlarmID>2</AlarmID>\n"
                                                   "        <XML>own</XML>\n    </Alarm>\n"}},
                               QVariantMap{{"@ID", "3"}, {"XML", "    <Alarm ID=\"3\"/>\n"}}}));

        const QString results =
            "<ProcessAlarmRes><Result><AlarmID>7</AlarmID><Code>0</Code><Extra>x</Extra></Result>"
            "<Result><AlarmID>8</AlarmID></Result></ProcessAlarmRes>";
        QCOMPARE(readReply(Reader::Process, {true, "", "0", results, true}).result.toList(),
                 (QVariantList{QVariantMap{{"alarmId", "7"}, {"updateResult", "0"}},
                               QVariantMap{{"alarmId", "8"}, {"updateResult", ""}}}));

        const QString changes = "<GetAlarmInfoRes><Alarm><AlarmID>1</AlarmID><ChangeLogs>"
                                "<Entry><State>A</State></Entry><Entry><State>B</State><Note>n"
                                "</Note></Entry><Entry/></ChangeLogs></Alarm></GetAlarmInfoRes>";
        QCOMPARE(readReply(Reader::Info, {true, "", "0", changes, true}).result.toList(),
                 (QVariantList{QVariantMap{{"State", "A"}},
                               QVariantMap{{"State", "B"}, {"Note", "n"}}, QString()}));
    }
};

QTEST_GUILESS_MAIN(TestTunnelControl)
#include "tst_tunnelcontrol.moc"
