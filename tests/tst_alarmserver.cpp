#include <AlarmServer.h>
#include <TcpAlarmServer.h>
#include <TcpFrame.h>

#include <PluginAlarmSearchCommon.h>

#include <QDomDocument>
#include <QRegularExpression>
#include <QSet>
#include <QTcpSocket>
#include <QTemporaryDir>
#include <QThread>
#include <QTimeZone>
#include <QtEndian>
#include <QtTest>

#include <functional>
#include <memory>

using namespace AlarmServerSim;
using namespace Qt::StringLiterals;

namespace {

// One alarm of a reply: child element name -> text.
using AlarmFields = QMap<QString, QString>;
using AlarmPredicate = std::function<bool(const AlarmFields&)>;

const QDateTime kSeedEnd(QDate(2026, 11, 20), QTime(12, 0), QTimeZone::utc());

// The alarm-list command as the plug-in writes it.
QString queryCommand(const QString& filters = QString(), const QString& start = QString(),
                     const QString& end = QString())
{
    const auto bound = [](const char* tag, const QString& time) {
        return time.isEmpty() ? u"<%1/>"_s.arg(QLatin1String(tag))
                              : u"<%1>%2</%1>"_s.arg(QLatin1String(tag), time);
    };
    return u"<QryAlarmList><Filters>%1</Filters><TmBound><TZ>+00:00</TZ>%2%3</TmBound><TmBase "
           "useUTC=\"true\">Station</TmBase><MaxRec>5000</MaxRec><OrderBy><Field>ServerTime</Field>"
           "<Descending>true</Descending></OrderBy></QryAlarmList>"_s.arg(
               filters.isEmpty() ? u"<TriggerEventList/>"_s : filters, bound("StartTm", start),
               bound("EndTm", end));
}

// The children of every element called tag under the reply's document element, in order.
QList<AlarmFields> elementsOf(const QString& reply, const QString& tag)
{
    QDomDocument document;
    document.setContent(reply);
    QList<AlarmFields> elements;
    const QDomNodeList nodes = document.documentElement().elementsByTagName(tag);
    for (int i = 0; i < nodes.size(); ++i) {
        AlarmFields& fields = elements.emplace_back();
        for (QDomElement child = nodes.at(i).firstChildElement(); !child.isNull();
             child = child.nextSiblingElement())
            fields.insert(child.tagName(), child.text());
    }
    return elements;
}

QList<AlarmFields> query(AlarmServer& server, const QString& command)
{
    return elementsOf(server.execute(u"QryAlarmList"_s, command).replyText, u"Alarm"_s);
}

// The children of every element called tag in the alarm's GetAlarmInfo reply.
QList<AlarmFields> info(AlarmServer& server, const QString& id, const QString& tag)
{
    const QString command = u"<GetAlarmInfo><AlarmID>%1</AlarmID></GetAlarmInfo>"_s.arg(id);
    return elementsOf(server.execute(u"GetAlarmInfo"_s, command).replyText, tag);
}

QString processCommand(const QStringList& ids, const QString& state, const QString& note)
{
    return u"<ProcessAlarm><AlarmList><Alarm ID=\"%1\"/></AlarmList><Status><State>%2</State>"
           "</Status><Note>%3</Note></ProcessAlarm>"_s.arg(ids.join(u"\"/><Alarm ID=\""_s), state,
                                                           note.toHtmlEscaped());
}

QString muteCommand(const QStringList& ids, bool mute, int seconds)
{
    return u"<MuteAlarm><EventTimecardIDList><ID>%1</ID></EventTimecardIDList><Mute>%2</Mute>"
           "<MuteInterval>%3</MuteInterval></MuteAlarm>"_s.arg(
               ids.join(u"</ID><ID>"_s), QVariant(mute).toString(), QString::number(seconds));
}

std::unique_ptr<AlarmServer> openServer(const QString& path, int seedCount)
{
    auto server = std::make_unique<AlarmServer>();
    QString error;
    if (!server->open({path, seedCount, kSeedEnd, 7}, &error))
        qFatal("%s", qPrintable(error));
    return server;
}

// An alarm matches when each named field matches its pattern in full.
AlarmPredicate fieldsMatch(const QList<QPair<const char*, QString>>& patterns)
{
    return [patterns](const AlarmFields& alarm) {
        return std::all_of(patterns.begin(), patterns.end(), [&alarm](const auto& pattern) {
            const QRegularExpression full(QRegularExpression::anchoredPattern(pattern.second));
            return full.match(alarm[QLatin1String(pattern.first)]).hasMatch();
        });
    };
}

} // namespace

Q_DECLARE_METATYPE(AlarmPredicate)

class TestAlarmServer : public QObject
{
    Q_OBJECT

private:
    std::unique_ptr<AlarmServer> m_server; // 400 demo alarms in memory
    QList<AlarmFields> m_all;              // all of them, as the unfiltered query lists them

private slots:
    void initTestCase()
    {
        m_server = openServer(u":memory:"_s, 400);
        m_all = query(*m_server, queryCommand());
        QCOMPARE(m_all.size(), 400);
    }

    void queryFilters_data()
    {
        using namespace PluginAlarmSearchCommon;
        QTest::addColumn<QString>("filters");
        QTest::addColumn<QString>("start");
        QTest::addColumn<QString>("end");
        QTest::addColumn<AlarmPredicate>("matches");

        // Name, the filters (after an empty event list unless they start with one), full-match
        // patterns of the fields of every alarm listed.
        const auto row = [](const char* name, const QString& filters,
                            const QList<QPair<const char*, QString>>& patterns) {
            const QString all =
                filters.startsWith("<Trigger"_L1) ? filters : "<TriggerEventList/>" + filters;
            QTest::newRow(name) << all << QString() << QString() << fieldsMatch(patterns);
        };
        // One row per rule; the default query's empty event list covers an empty list.
        row("events",
            u"<TriggerEventList>%1</TriggerEventList>"_s.arg(CAMERA_TRIGGER_EVENT_FILTER_STRING),
            {{"EventClass", "CamEvent|VCA|CamConn|RecStatus|RecErr"}});
        row("states",
            u"<AlarmStateList><State>Processing</State><State>FalseAlarm</State>"
            "</AlarmStateList>"_s,
            {{"State", "Processing|FalseAlarm"}});
        row("name lists all hold, percent-encoded, any case",
            u"<NameList><Name>LINE%20crossing</Name><Name>mOTION</Name></NameList>"
            "<NameList><Name>parking</Name></NameList>"_s,
            {{"AlarmName", "(?=.*(Line Crossing|Motion)).*Parking.*"}});
        row("device names, any case, whole name",
            u"<TriggerDeviceNameList><DeviceName>lobby ENTRANCE</DeviceName><DeviceName>Recording "
            "Server 01</DeviceName><DeviceName>Server</DeviceName></TriggerDeviceNameList>"_s,
            {{"DeviceName", "Lobby Entrance|Recording Server 01"}});
        // Each list is one bound value: SQLite refused 1000 or more parameters. The event
        // with a sub-event restricts the class to that sub-event.
        const auto many = [](const char* list, const char* item, const QString& last) {
            QString items;
            for (int i = 0; i < 5000; ++i)
                items += u"<%1>none %2</%1>"_s.arg(QLatin1String(item)).arg(i);
            return u"<%1>%2<%3>%4</%3></%1>"_s.arg(QLatin1String(list), items, QLatin1String(item),
                                                   last);
        };
        const AlarmFields motion =
            *std::find_if(m_all.begin(), m_all.end(),
                          [](const AlarmFields& a) { return a["SubEvent"] == "Motion"_L1; });
        row("5001 events, names and device names",
            many("TriggerEventList", "Event", u"CamEvent"_s)
                    .replace(u"<Event>CamEvent"_s, u"<Event CameraEvent=\"Motion\">CamEvent"_s) +
                many("NameList", "Name", u"%20"_s) +
                many("TriggerDeviceNameList", "DeviceName", motion["DeviceName"]),
            {{"EventClass", "CamEvent"},
             {"SubEvent", "Motion"},
             {"AlarmName", ".* .*"},
             {"DeviceName", QRegularExpression::escape(motion["DeviceName"])}});
        QTest::newRow("time bound, both ends inclusive")
            << "" << m_all.at(300)["ServerTime"].chopped(1) << m_all.at(100)["ServerTime"]
            << AlarmPredicate([this](const AlarmFields& a) {
                   return a["ServerTime"] >= m_all.at(300)["ServerTime"] &&
                          a["ServerTime"] <= m_all.at(100)["ServerTime"];
               });
    }

    void queryFilters()
    {
        QFETCH(QString, filters);
        QFETCH(QString, start);
        QFETCH(QString, end);
        QFETCH(AlarmPredicate, matches);
        QList<AlarmFields> expected;
        std::copy_if(m_all.begin(), m_all.end(), std::back_inserter(expected), matches);
        QVERIFY(!expected.isEmpty());
        QCOMPARE(query(*m_server, queryCommand(filters, start, end)), expected);
    }

    // At most 5000 alarms, newest first, alarms of one second by ID (5200 demo alarms share
    // some seconds).
    void capAndOrder()
    {
        const QList<AlarmFields> alarms = query(*openServer(u":memory:"_s, 5200), queryCommand());
        QCOMPARE(alarms.size(), 5000);
        for (int i = 1; i < alarms.size(); ++i)
            QVERIFY(std::make_pair(alarms[i]["ServerTime"], alarms[i]["AlarmID"]) <
                    std::make_pair(alarms[i - 1]["ServerTime"], alarms[i - 1]["AlarmID"]));
    }

    // The demo alarms: the same seed seeds the same alarms, which cover every event of the three
    // filters (32 camera, 14 system and 9 external-device events), each with a history that
    // starts unhandled and ends in the alarm's state.
    void seededAlarms()
    {
        QCOMPARE(query(*openServer(u":memory:"_s, 400), queryCommand()), m_all);
        QSet<QStringList> events;
        for (const AlarmFields& alarm : std::as_const(m_all)) {
            events.insert({alarm["EventClass"], alarm["SubEventType"], alarm["SubEvent"]});
            const QList<AlarmFields> entries = info(*m_server, alarm["AlarmID"], u"Entry"_s);
            QVERIFY(!entries.isEmpty());
            QCOMPARE(entries.first(), (AlarmFields{{"Time", alarm["ServerTime"]},
                                                   {"State", "Unhandled"},
                                                   {"Note", ""},
                                                   {"User", "system"}}));
            QCOMPARE(entries.last()["State"] + u'|' + entries.last()["Note"],
                     alarm["State"] + u'|' + alarm["Note"]);
        }
        QCOMPARE(events.size(), 55);
    }

    void processThenInfo()
    {
        const QString first = m_all.at(10)["AlarmID"];
        const QString note = u"Gate <3> & \"north\" checked"_s;
        const QList<AlarmFields> before = info(*m_server, first, u"Entry"_s);
        // Unknown IDs are the integration test's; a malformed one fails alone.
        const CommandReply reply = m_server->execute(
            u"ProcessAlarm"_s, processCommand({u"B12"_s, first}, u"Handled"_s, note));
        QCOMPARE(reply.statusText, u"0"_s);
        QCOMPARE(elementsOf(reply.replyText, u"Result"_s),
                 (QList<AlarmFields>{{{"AlarmID", "B12"}, {"Code", "1"}},
                                     {{"AlarmID", first}, {"Code", "0"}}}));
        const AlarmFields alarm = info(*m_server, first, u"Alarm"_s).first();
        QCOMPARE(alarm["State"] + alarm["Note"], u"Handled"_s + note);
        QList<AlarmFields> after = info(*m_server, first, u"Entry"_s);
        after.last()["Time"].clear();
        const AlarmFields entry{
            {"Time", ""}, {"State", "Handled"}, {"Note", note}, {"User", "operator"}};
        QCOMPARE(after, before + QList<AlarmFields>{entry});

        // Without a Status the state stays; the note and the log still change.
        const QString noteOnly = u"<ProcessAlarm><AlarmList><Alarm ID=\"%1\"/></AlarmList>"
                                 "<Note>second look</Note></ProcessAlarm>"_s.arg(first);
        QCOMPARE(m_server->execute(u"ProcessAlarm"_s, noteOnly).statusText, u"0"_s);
        QCOMPARE(info(*m_server, first, u"Alarm"_s).first()["State"], u"Handled"_s);
        QCOMPARE(info(*m_server, first, u"Entry"_s).last()["Note"], u"second look"_s);

        m_all = query(*m_server, queryCommand());
    }

    void mute()
    {
        const QStringList ids = {m_all.at(3)["AlarmID"], m_all.at(4)["AlarmID"]};
        const QString earliest =
            QDateTime::currentDateTimeUtc().addSecs(3600).toString(u"yyyy-MM-ddTHH:mm:ss'Z'"_s);
        const CommandReply muted = m_server->execute(u"MuteAlarm"_s, muteCommand(ids, true, 3600));
        QCOMPARE(muted.statusText + muted.replyText, u"0<MuteAlarmRes/>"_s);
        for (const QString& id : ids) {
            const AlarmFields alarm = info(*m_server, id, u"Alarm"_s).first();
            QCOMPARE(alarm["Muted"], u"true"_s);
            QVERIFY(alarm["MuteUntil"] >= earliest);
        }
        QCOMPARE(query(*m_server, queryCommand()).at(5)["Muted"], u"false"_s);

        m_server->execute(u"MuteAlarm"_s, muteCommand(ids.mid(0, 1), false, 60));
        const AlarmFields unmuted = info(*m_server, ids.first(), u"Alarm"_s).first();
        QCOMPARE(unmuted["Muted"] + unmuted["MuteUntil"], u"false"_s);
    }

    void badCommands_data()
    {
        QTest::addColumn<QString>("method");
        QTest::addColumn<QString>("command");
        QTest::addColumn<QString>("status");
        QString attributes;
        for (int i = 0; i < 80000; ++i)
            attributes += u" a%1=''"_s.arg(i);
        const auto row = [](const char* name, const char* method, const QString& command,
                            const char* status = "80000001") {
            QTest::newRow(name) << method << command << status;
        };
        row("not XML", "QryAlarmList", u"<QryAlarmList><Filters>"_s);
        row("root of another command", "GetAlarmInfo",
            u"<MuteAlarm><Mute>false</Mute></MuteAlarm>"_s);
        row("DTD", "GetAlarmInfo",
            u"<!DOCTYPE GetAlarmInfo [<!ENTITY id \"A0000001\">]>"
            "<GetAlarmInfo><AlarmID>&id;</AlarmID></GetAlarmInfo>"_s);
        row("bad time", "QryAlarmList", queryCommand(QString(), u"2026-13-01T00:00:00"_s));
        row("unknown state", "ProcessAlarm", processCommand({u"A0000001"_s}, u"Done"_s, QString()));
        row("mute flag", "MuteAlarm",
            muteCommand({u"A0000001"_s}, true, 5).replace(u">true<"_s, u">yes<"_s));
        // The parsed tree's destructor recursed once per level: 400 000 levels crashed.
        row("nested 257 levels", "GetAlarmInfo",
            "<GetAlarmInfo>" + u"<e>"_s.repeated(256) + u"</e>"_s.repeated(256) +
                "</GetAlarmInfo>");
        row("nested 400000 levels", "QryAlarmList",
            "<QryAlarmList><Filters>" + u"<e>"_s.repeated(400000));
        row("80000 attributes", "GetAlarmInfo", "<GetAlarmInfo" + attributes + "/>");
        row("unknown method", "QryAlarms", queryCommand(), "80000002");
        row("method in another case", "qryalarmlist", queryCommand(), "80000002");
    }

    void badCommands()
    {
        QFETCH(QString, method);
        QFETCH(QString, command);
        QFETCH(QString, status);
        const CommandReply reply = m_server->execute(method, command);
        QCOMPARE(reply.statusText, status);
        QCOMPARE(reply.replyText, QString());
    }

    // Four threads each change ten alarms and list all of them meanwhile, in memory and in a file
    // (in a folder still to be made), which keeps the changes when it is opened again.
    void concurrentExecute_data()
    {
        QTest::addColumn<bool>("inFile");
        QTest::newRow("memory") << false;
        QTest::newRow("file") << true;
    }
    void concurrentExecute()
    {
        QFETCH(bool, inFile);
        QTemporaryDir dir;
        const QString path = inFile ? dir.filePath(u"nested/alarms.sqlite"_s) : u":memory:"_s;
        std::unique_ptr<AlarmServer> server = openServer(path, 200);
        QAtomicInt failures;
        std::vector<std::unique_ptr<QThread>> threads;
        for (int t = 0; t < 4; ++t) {
            threads.emplace_back(QThread::create([&server, &failures, t] {
                for (int i = 1 + t * 10; i <= 10 + t * 10; ++i) {
                    const QString command = processCommand({u"A%1"_s.arg(i, 7, 10, QChar('0'))},
                                                           u"Processing"_s, u"done"_s);
                    const CommandReply reply = server->execute(u"ProcessAlarm"_s, command);
                    failures += !reply.replyText.contains("<Code>0</Code>"_L1) ||
                                query(*server, queryCommand()).size() != 200;
                }
            }));
            threads.back()->start();
        }
        for (auto& thread : threads)
            QVERIFY(thread->wait());
        QCOMPARE(failures.loadRelaxed(), 0);
        const QList<AlarmFields> alarms = query(*server, queryCommand());
        QCOMPARE(std::count_if(alarms.begin(), alarms.end(),
                               [](const AlarmFields& a) { return a["Note"] == "done"_L1; }),
                 40);
        if (inFile) {
            server.reset();
            server = openServer(path, 200);
            QCOMPARE(query(*server, queryCommand()), alarms);
        }
    }

    void framing_data()
    {
        QTest::addColumn<QByteArray>("stream");
        QTest::addColumn<int>("frames");
        QTest::addColumn<int>("leftOver");
        QTest::addColumn<bool>("valid");
        const QByteArray first = encodeFrame({{"id", 1}, {"method", QString::fromUtf8("Bär <&>")}});
        const QByteArray second = encodeFrame({{"id", 2}});
        QByteArray huge(4, '\0');
        qToBigEndian(kMaxFramePayload + 1, huge.data());
        const QByteArray twoBytes = encodeFrame({}).left(4); // the header of "{}"
        QTest::newRow("two frames at once") << first + second << 2 << 0 << true;
        QTest::newRow("frame and all but a byte")
            << first + second.chopped(1) << 1 << second.size() - 1 << true;
        QTest::newRow("header only") << first.left(3) << 0 << 3 << true;
        QTest::newRow("too long") << first + huge << 1 << 4 << false;
        QTest::newRow("not an object") << twoBytes + "[]" << 0 << 6 << false;
        QTest::newRow("not JSON") << first + twoBytes + "{x" << 1 << 6 << false;
    }

    void framing()
    {
        QFETCH(QByteArray, stream);
        QFETCH(int, frames);
        QFETCH(int, leftOver);
        QFETCH(bool, valid);
        QList<QJsonObject> out;
        QString error;
        QCOMPARE(takeFrames(stream, out, &error), valid);
        QCOMPARE(out.size(), frames);
        QCOMPARE(stream.size(), leftOver);
        QCOMPARE(error.isEmpty(), valid);
        if (frames > 0)
            QCOMPARE(out.first(),
                     (QJsonObject{{"id", 1}, {"method", QString::fromUtf8("Bär <&>")}}));
    }

    // A client that sends without reading: the server stops taking its requests while their
    // replies wait unsent, so the client's writes back up instead of the server's memory
    // growing (844 MB after 400 pipelined queries of 5000 alarms); once it reads, every reply
    // comes, in order, with its status.
    void pipelinedWithoutReading()
    {
        TcpAlarmServer tcp(*m_server);
        QVERIFY(tcp.listenOnLoopback(0));
        QTcpSocket socket;
        socket.connectToHost(QHostAddress::LocalHost, tcp.serverPort());
        QVERIFY(socket.waitForConnected(5000));
        const QString padded = "<GetAlarmInfo>" + QString(20000, u' ') + "</GetAlarmInfo>";
        const int queries = 200, requests = queries + 2000;
        for (int id = 0; id < requests; ++id) {
            socket.write(encodeFrame({{"id", id},
                                      {"method", id < queries ? "QryAlarmList" : "GetAlarmInfo"},
                                      {"command", id < queries ? queryCommand() : padded}}));
        }
        socket.write(encodeFrame({{"id", requests}, {"method", "Unknown"}, {"command", ""}}));
        QTest::qWait(2000);
        QVERIFY2(socket.bytesToWrite() > 0, "the server read every request");

        QByteArray buffer;
        QList<QJsonObject> replies;
        connect(&socket, &QTcpSocket::readyRead, this, [&] {
            buffer += socket.readAll();
            QVERIFY(takeFrames(buffer, replies, nullptr));
        });
        QTRY_COMPARE_WITH_TIMEOUT(replies.size(), requests + 1, 120000);
        for (int id = 0; id <= requests; ++id) {
            QCOMPARE(replies.at(id).value("id").toInt(), id);
            QCOMPARE(replies.at(id).value("status").toString(), id < queries    ? u"0"_s
                                                                : id < requests ? u"80000004"_s
                                                                                : u"80000002"_s);
        }
    }

    // Clients past the cap are closed at once; a request frame longer than a request may be
    // drops its client. The others are served.
    void connectionBounds()
    {
        TcpAlarmServer tcp(*m_server);
        tcp.setMaxConnections(2);
        QVERIFY(tcp.listenOnLoopback(0));
        QTcpSocket sockets[3];
        for (QTcpSocket& socket : sockets) {
            socket.connectToHost(QHostAddress::LocalHost, tcp.serverPort());
            QVERIFY(socket.waitForConnected(5000));
        }
        QTRY_COMPARE(sockets[2].state(), QAbstractSocket::UnconnectedState);

        QByteArray oversized(4, '\0');
        qToBigEndian(quint32(TcpAlarmServer::MaxRequestPayload + 1), oversized.data());
        sockets[1].write(oversized);
        QTRY_COMPARE(sockets[1].state(), QAbstractSocket::UnconnectedState);

        sockets[0].write(encodeFrame({{"id", 1}, {"method", "GetAlarmInfo"}, {"command", ""}}));
        QTRY_VERIFY(sockets[0].bytesAvailable() > 0);
        QVERIFY(sockets[0].state() == QAbstractSocket::ConnectedState);
    }
};

QTEST_GUILESS_MAIN(TestAlarmServer)
#include "tst_alarmserver.moc"
