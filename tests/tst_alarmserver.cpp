#include <AlarmServer.h>
#include <TcpAlarmServer.h>
#include <TcpFrame.h>

#include <PluginAlarmSearchCommon.h>

#include <QDomDocument>
#include <QJsonArray>
#include <QJsonDocument>
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
        return time.isEmpty() ? QStringLiteral("<%1/>").arg(QLatin1String(tag))
                              : QStringLiteral("<%1>%2</%1>").arg(QLatin1String(tag), time);
    };
    return QStringLiteral("<QryAlarmList><Filters>%1</Filters><TmBound><TZ>+00:00</TZ>%2%3"
                          "</TmBound><TmBase useUTC=\"true\">Station</TmBase><MaxRec>5000</MaxRec>"
                          "<OrderBy><Field>ServerTime</Field><Descending>true</Descending>"
                          "</OrderBy></QryAlarmList>")
        .arg(filters.isEmpty() ? QStringLiteral("<TriggerEventList/>") : filters,
             bound("StartTm", start), bound("EndTm", end));
}

AlarmFields fieldsOf(const QDomElement& element)
{
    AlarmFields fields;
    for (QDomElement child = element.firstChildElement(); !child.isNull();
         child = child.nextSiblingElement())
        fields.insert(child.tagName(), child.text());
    return fields;
}

// The children of every element called tag under the reply's document element, in order.
QList<AlarmFields> elementsOf(const QString& reply, const QString& tag)
{
    QDomDocument document;
    if (!document.setContent(reply))
        return {};
    QList<AlarmFields> elements;
    const QDomNodeList nodes = document.documentElement().elementsByTagName(tag);
    for (int i = 0; i < nodes.size(); ++i)
        elements.append(fieldsOf(nodes.at(i).toElement()));
    return elements;
}

QList<AlarmFields> query(AlarmServer& server, const QString& command)
{
    const CommandReply reply = server.execute(QStringLiteral("QryAlarmList"), command);
    if (reply.statusText != QLatin1String("0"))
        return {};
    return elementsOf(reply.replyText, QStringLiteral("Alarm"));
}

QString infoCommand(const QString& id)
{
    return QStringLiteral("<GetAlarmInfo><AlarmID>%1</AlarmID></GetAlarmInfo>").arg(id);
}

QString processCommand(const QStringList& ids, const QString& state, const QString& note)
{
    QString text = QStringLiteral("<ProcessAlarm><AlarmList>");
    for (const QString& id : ids)
        text += QStringLiteral("<Alarm ID=\"%1\"/>").arg(id);
    text += QStringLiteral("</AlarmList><Status><State>%1</State></Status>").arg(state);
    if (!note.isEmpty())
        text += QStringLiteral("<Note>%1</Note>").arg(note.toHtmlEscaped());
    return text + QStringLiteral("</ProcessAlarm>");
}

QString muteCommand(const QStringList& ids, bool mute, int seconds)
{
    QString list;
    for (const QString& id : ids)
        list += QStringLiteral("<ID>%1</ID>").arg(id);
    return QStringLiteral("<MuteAlarm><EventTimecardIDList>%1</EventTimecardIDList><Mute>%2</Mute>"
                          "<MuteInterval>%3</MuteInterval></MuteAlarm>")
        .arg(list, mute ? QStringLiteral("true") : QStringLiteral("false"))
        .arg(seconds);
}

std::unique_ptr<AlarmServer> openServer(const QString& path, int seedCount)
{
    auto server = std::make_unique<AlarmServer>();
    QString error;
    AlarmServer::Options options;
    options.databasePath = path;
    options.seedCount = seedCount;
    options.seedEnd = kSeedEnd;
    options.seed = 7;
    if (!server->open(options, &error)) {
        qWarning("%s", qPrintable(error));
        return nullptr;
    }
    return server;
}

QSet<QString> setOf(std::initializer_list<const char*> texts)
{
    QSet<QString> set;
    for (const char* text : texts)
        set.insert(QLatin1String(text));
    return set;
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
        m_server = openServer(QStringLiteral(":memory:"), 400);
        QVERIFY(m_server);
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

        const auto events = [](const QString& fragment) {
            return QStringLiteral("<TriggerEventList>%1</TriggerEventList>").arg(fragment);
        };
        QTest::newRow("event with attribute")
            << events(QStringLiteral("<Event CameraEvent=\"Motion\">CamEvent</Event>")) << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["EventClass"] == "CamEvent" && a["SubEvent"] == "Motion";
               });
        QTest::newRow("event without attribute")
            << events(QStringLiteral("<Event>VCA</Event>")) << ""
            << "" << AlarmPredicate([](const AlarmFields& a) { return a["EventClass"] == "VCA"; });
        QTest::newRow("camera filter")
            << events(CAMERA_TRIGGER_EVENT_FILTER_STRING) << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return setOf({"CamEvent", "VCA", "CamConn", "RecStatus", "RecErr"})
                       .contains(a["EventClass"]);
               });
        QTest::newRow("system filter")
            << events(SYSTEM_TRIGGER_EVENT_FILTER_STRING) << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["SubEvent"].isEmpty() &&
                          setOf({"StationConn", "StorageConn", "StorageCapacity", "SysLicense",
                                 "SysNetwork", "SysVirMem", "FanStatus", "GpsConn", "GpsSpeed",
                                 "Gsensor", "SysVcaAreaReport", "BruteForceAttack", "CyberAttack",
                                 "QuarantineEvent"})
                              .contains(a["EventClass"]);
               });
        QTest::newRow("external device filter")
            << events(EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING) << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return setOf({"ExtIODevice", "DIOStatus", "ExtTCPMessage", "ExtDataMagnet",
                                 "ExtAccessRule", "VirtualTrigger", "ManualEvent"})
                       .contains(a["EventClass"]);
               });
        QTest::newRow("states") << "<TriggerEventList/><AlarmStateList><State>Processing</State>"
                                   "<State>FalseAlarm</State></AlarmStateList>"
                                << ""
                                << "" << AlarmPredicate([](const AlarmFields& a) {
                                       return a["State"] == "Processing" ||
                                              a["State"] == "FalseAlarm";
                                   });
        QTest::newRow("empty state list")
            << "<TriggerEventList/><AlarmStateList/>"
            << ""
            << "" << AlarmPredicate([](const AlarmFields&) { return true; });
        QTest::newRow("percent-encoded name, any case")
            << "<TriggerEventList/><NameList><Name>LINE%20crossing</Name>"
               "<Name>Intrusion%20at</Name></NameList>"
            << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["AlarmName"].contains("Line Crossing") ||
                          a["AlarmName"].contains("Intrusion at");
               });
        QTest::newRow("two name lists must both hold")
            << "<TriggerEventList/><NameList><Name>Motion</Name><Name>Loitering</Name></NameList>"
               "<NameList><Name>Parking</Name></NameList>"
            << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return (a["AlarmName"].contains("Motion") ||
                           a["AlarmName"].contains("Loitering")) &&
                          a["AlarmName"].contains("Parking");
               });
        QTest::newRow("device names, any case, whole name")
            << "<TriggerEventList/><TriggerDeviceNameList><DeviceName>lobby ENTRANCE</DeviceName>"
               "<DeviceName>Recording Server 01</DeviceName><DeviceName>Server</DeviceName>"
               "</TriggerDeviceNameList>"
            << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["DeviceName"] == "Lobby Entrance" ||
                          a["DeviceName"] == "Recording Server 01";
               });
        // Each list is one bound value: SQLite refused 1000 or more parameters.
        const auto many = [](const char* list, const char* item, const QString& last) {
            QString items;
            for (int i = 0; i < 5000; ++i)
                items += QStringLiteral("<%1>none %2</%1>").arg(QLatin1String(item)).arg(i);
            return QStringLiteral("<TriggerEventList/><%1>%2<%3>%4</%3></%1>")
                .arg(QLatin1String(list), items, QLatin1String(item), last);
        };
        QTest::newRow("5001 device names")
            << many("TriggerDeviceNameList", "DeviceName", "Lobby Entrance") << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["DeviceName"] == "Lobby Entrance";
               });
        QTest::newRow("5001 names") << many("NameList", "Name", "Loitering") << ""
                                    << "" << AlarmPredicate([](const AlarmFields& a) {
                                           return a["AlarmName"].contains("Loitering");
                                       });
        QTest::newRow("5001 events")
            << events(QStringLiteral("<Event>None</Event>").repeated(5000) +
                      "<Event CameraEvent=\"Motion\">CamEvent</Event>")
            << ""
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["EventClass"] == "CamEvent" && a["SubEvent"] == "Motion";
               });
        QTest::newRow("time bound, both ends inclusive")
            << "" << m_all.at(300)["ServerTime"].chopped(1) << m_all.at(100)["ServerTime"]
            << AlarmPredicate([this](const AlarmFields& a) {
                   return a["ServerTime"] >= m_all.at(300)["ServerTime"] &&
                          a["ServerTime"] <= m_all.at(100)["ServerTime"];
               });
        QTest::newRow("open start")
            << ""
            << ""
            << "2026-11-05T00:00:00" << AlarmPredicate([](const AlarmFields& a) {
                   return a["ServerTime"] <= "2026-11-05T00:00:00Z";
               });
        QTest::newRow("events, state and time together")
            << events(QStringLiteral("<Event>CamEvent</Event>")) +
                   "<AlarmStateList><State>Handled</State></AlarmStateList>"
            << "2026-11-01T00:00:00"
            << "" << AlarmPredicate([](const AlarmFields& a) {
                   return a["EventClass"] == "CamEvent" && a["State"] == "Handled" &&
                          a["ServerTime"] >= "2026-11-01T00:00:00Z";
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

    void capAndOrderOfLargeDatabase()
    {
        const std::unique_ptr<AlarmServer> server = openServer(QStringLiteral(":memory:"), 5200);
        QVERIFY(server);
        const CommandReply reply = server->execute(QStringLiteral("QryAlarmList"), queryCommand());
        const QList<AlarmFields> alarms = elementsOf(reply.replyText, QStringLiteral("Alarm"));
        QCOMPARE(alarms.size(), 5000);
        QCOMPARE(alarms.first()["AlarmID"], QStringLiteral("A0005200"));
        QSet<QString> events;
        for (int i = 0; i < alarms.size(); ++i) {
            const AlarmFields& alarm = alarms.at(i);
            events.insert(alarm["EventClass"] + '/' + alarm["SubEventType"] + '/' +
                          alarm["SubEvent"]);
            if (i > 0) {
                const AlarmFields& newer = alarms.at(i - 1);
                QVERIFY(std::make_pair(alarm["ServerTime"], alarm["AlarmID"]) <
                        std::make_pair(newer["ServerTime"], newer["AlarmID"]));
            }
        }
        // Every event of the three filters: 32 camera, 14 system and 9 external-device events.
        QCOMPARE(events.size(), 55);

        // The same seed seeds the same alarms.
        const std::unique_ptr<AlarmServer> again = openServer(QStringLiteral(":memory:"), 5200);
        QVERIFY(again);
        QCOMPARE(again->execute(QStringLiteral("QryAlarmList"), queryCommand()).replyText,
                 reply.replyText);
    }

    void seededHistory()
    {
        int processed = 0;
        for (const AlarmFields& alarm : m_all) {
            const QList<AlarmFields> entries = elementsOf(
                m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(alarm["AlarmID"]))
                    .replyText,
                QStringLiteral("Entry"));
            QVERIFY(!entries.isEmpty());
            QCOMPARE(entries.first(), (AlarmFields{{"Time", alarm["ServerTime"]},
                                                   {"State", "Unhandled"},
                                                   {"Note", ""},
                                                   {"User", "system"}}));
            QCOMPARE(entries.last()["State"], alarm["State"]);
            if (alarm["State"] != QLatin1String("Unhandled")) {
                ++processed;
                QVERIFY(entries.size() >= 2);
                QCOMPARE(entries.last()["Note"], alarm["Note"]);
            }
        }
        QVERIFY(processed > 100);
    }

    void processThenInfo()
    {
        const QString first = m_all.at(10)["AlarmID"];
        const QString second = m_all.at(11)["AlarmID"];
        const QString note = QStringLiteral("Gate <3> & \"north\" checked");
        const QList<AlarmFields> before = elementsOf(
            m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(first)).replyText,
            QStringLiteral("Entry"));

        const CommandReply reply = m_server->execute(
            QStringLiteral("ProcessAlarm"),
            processCommand({first, QStringLiteral("A9999999"), second, QStringLiteral("B12")},
                           QStringLiteral("Handled"), note));
        QCOMPARE(reply.statusText, QStringLiteral("0"));
        const QList<AlarmFields> results = elementsOf(reply.replyText, QStringLiteral("Result"));
        QCOMPARE(results, (QList<AlarmFields>{{{"AlarmID", first}, {"Code", "0"}},
                                              {{"AlarmID", "A9999999"}, {"Code", "1"}},
                                              {{"AlarmID", second}, {"Code", "0"}},
                                              {{"AlarmID", "B12"}, {"Code", "1"}}}));

        const CommandReply info =
            m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(first));
        const QList<AlarmFields> alarm = elementsOf(info.replyText, QStringLiteral("Alarm"));
        QCOMPARE(alarm.size(), 1);
        QCOMPARE(alarm.first()["State"], QStringLiteral("Handled"));
        QCOMPARE(alarm.first()["Note"], note);
        const QList<AlarmFields> after = elementsOf(info.replyText, QStringLiteral("Entry"));
        QCOMPARE(after.mid(0, before.size()), before);
        QCOMPARE(after.size(), before.size() + 1);
        QCOMPARE(after.last()["State"], QStringLiteral("Handled"));
        QCOMPARE(after.last()["Note"], note);
        QCOMPARE(after.last()["User"], QStringLiteral("operator"));

        // Without a Status the state stays; the note and the log still change.
        const CommandReply noteOnly = m_server->execute(
            QStringLiteral("ProcessAlarm"),
            QStringLiteral("<ProcessAlarm><AlarmList><Alarm ID=\"%1\"/></AlarmList>"
                           "<Note>second look</Note></ProcessAlarm>")
                .arg(first));
        QCOMPARE(noteOnly.statusText, QStringLiteral("0"));
        const QString infoText =
            m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(first)).replyText;
        QCOMPARE(elementsOf(infoText, QStringLiteral("Alarm")).first()["State"],
                 QStringLiteral("Handled"));
        QCOMPARE(elementsOf(infoText, QStringLiteral("Entry")).last()["Note"],
                 QStringLiteral("second look"));

        const CommandReply unknown =
            m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand("A9999999"));
        QCOMPARE(unknown.statusText, QStringLiteral("80000004"));
        QCOMPARE(unknown.replyText, QString());
        m_all = query(*m_server, queryCommand());
    }

    void mute()
    {
        const QStringList ids = {m_all.at(3)["AlarmID"], m_all.at(4)["AlarmID"]};
        const QString earliest = QDateTime::currentDateTimeUtc().addSecs(3600).toString(
            QStringLiteral("yyyy-MM-ddTHH:mm:ss'Z'"));
        const CommandReply muted =
            m_server->execute(QStringLiteral("MuteAlarm"), muteCommand(ids, true, 3600));
        QCOMPARE(muted.statusText, QStringLiteral("0"));
        QCOMPARE(muted.replyText, QStringLiteral("<MuteAlarmRes/>"));
        for (const QString& id : ids) {
            const AlarmFields alarm =
                elementsOf(
                    m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(id)).replyText,
                    QStringLiteral("Alarm"))
                    .first();
            QCOMPARE(alarm["Muted"], QStringLiteral("true"));
            QVERIFY(alarm["MuteUntil"] >= earliest);
        }
        QCOMPARE(query(*m_server, queryCommand()).at(5)["Muted"], QStringLiteral("false"));

        m_server->execute(QStringLiteral("MuteAlarm"), muteCommand(ids.mid(0, 1), false, 0));
        const AlarmFields unmuted =
            elementsOf(m_server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(ids.first()))
                           .replyText,
                       QStringLiteral("Alarm"))
                .first();
        QCOMPARE(unmuted["Muted"], QStringLiteral("false"));
        QCOMPARE(unmuted["MuteUntil"], QString());
    }

    void badCommands_data()
    {
        QTest::addColumn<QString>("method");
        QTest::addColumn<QString>("command");
        QTest::addColumn<QString>("status");
        QTest::newRow("not XML") << "QryAlarmList"
                                 << "<QryAlarmList><Filters>"
                                 << "80000001";
        QTest::newRow("empty") << "GetAlarmInfo"
                               << ""
                               << "80000001";
        QTest::newRow("root of another command") << "GetAlarmInfo"
                                                 << "<MuteAlarm><Mute>false</Mute></MuteAlarm>"
                                                 << "80000001";
        QTest::newRow("DTD") << "GetAlarmInfo"
                             << "<!DOCTYPE GetAlarmInfo [<!ENTITY id \"A0000001\">]>"
                                "<GetAlarmInfo><AlarmID>&id;</AlarmID></GetAlarmInfo>"
                             << "80000001";
        QTest::newRow("bad time") << "QryAlarmList"
                                  << queryCommand(QString(), "2026-13-01T00:00:00") << "80000001";
        QTest::newRow("unknown state")
            << "ProcessAlarm" << processCommand({"A0000001"}, "Done", QString()) << "80000001";
        QTest::newRow("mute flag")
            << "MuteAlarm" << muteCommand({"A0000001"}, true, 5).replace(">true<", ">yes<")
            << "80000001";
        // The parsed tree's destructor recursed once per level: 400 000 levels crashed.
        QTest::newRow("nested 257 levels")
            << "GetAlarmInfo"
            << "<GetAlarmInfo>" + QStringLiteral("<e>").repeated(256) +
                   QStringLiteral("</e>").repeated(256) + "</GetAlarmInfo>"
            << "80000001";
        QTest::newRow("nested 400000 levels")
            << "QryAlarmList"
            << "<QryAlarmList><Filters>" + QStringLiteral("<e>").repeated(400000) << "80000001";
        QString attributes;
        for (int i = 0; i < 80000; ++i)
            attributes += QStringLiteral(" a%1=''").arg(i);
        QTest::newRow("80000 attributes") << "GetAlarmInfo"
                                          << "<GetAlarmInfo" + attributes + "/>"
                                          << "80000001";
        QTest::newRow("unknown method") << "QryAlarms" << queryCommand() << "80000002";
        QTest::newRow("method in another case") << "qryalarmlist" << queryCommand() << "80000002";
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

    void persistsAcrossReopen()
    {
        QTemporaryDir dir;
        QVERIFY(dir.isValid());
        const QString path = dir.filePath(QStringLiteral("nested/alarms.sqlite"));
        std::unique_ptr<AlarmServer> server = openServer(path, 50);
        QVERIFY(server);
        const QString id = query(*server, queryCommand()).at(7)["AlarmID"];
        server->execute(QStringLiteral("ProcessAlarm"),
                        processCommand({id}, QStringLiteral("FalseAlarm"), QStringLiteral("cat")));
        const QString before =
            server->execute(QStringLiteral("QryAlarmList"), queryCommand()).replyText;
        server.reset();

        server = openServer(path, 50);
        QVERIFY(server);
        QCOMPARE(server->execute(QStringLiteral("QryAlarmList"), queryCommand()).replyText, before);
        const QList<AlarmFields> entries =
            elementsOf(server->execute(QStringLiteral("GetAlarmInfo"), infoCommand(id)).replyText,
                       QStringLiteral("Entry"));
        QCOMPARE(entries.last()["Note"], QStringLiteral("cat"));
    }

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
        const std::unique_ptr<AlarmServer> server = openServer(
            inFile ? dir.filePath(QStringLiteral("alarms.sqlite")) : QStringLiteral(":memory:"),
            200);
        QVERIFY(server);
        constexpr int kThreads = 4;
        constexpr int kAlarmsPerThread = 10;
        QList<QThread*> threads;
        QAtomicInt failures;
        for (int t = 0; t < kThreads; ++t) {
            threads.append(QThread::create([&server, &failures, t] {
                for (int i = 0; i < kAlarmsPerThread; ++i) {
                    const QString id =
                        QStringLiteral("A%1").arg(1 + t * kAlarmsPerThread + i, 7, 10, QChar('0'));
                    const CommandReply processed =
                        server->execute(QStringLiteral("ProcessAlarm"),
                                        processCommand({id}, QStringLiteral("Processing"),
                                                       QStringLiteral("thread %1").arg(t)));
                    const CommandReply listed =
                        server->execute(QStringLiteral("QryAlarmList"), queryCommand());
                    if (!processed.replyText.contains(QLatin1String("<Code>0</Code>")) ||
                        listed.replyText.count(QLatin1String("<Alarm>")) != 200)
                        failures.fetchAndAddRelaxed(1);
                }
            }));
            threads.last()->start();
        }
        for (QThread* thread : threads) {
            QVERIFY(thread->wait());
            delete thread;
        }
        QCOMPARE(failures.loadRelaxed(), 0);
        const QString processing = QStringLiteral(
            "<TriggerEventList/><AlarmStateList><State>Processing</State></AlarmStateList>"
            "<NameList><Name>%20</Name></NameList>");
        int changed = 0;
        for (const AlarmFields& alarm : query(*server, queryCommand(processing)))
            changed += alarm["Note"].startsWith(QLatin1String("thread ")) ? 1 : 0;
        QCOMPARE(changed, kThreads * kAlarmsPerThread);
    }

    void framing_data()
    {
        QTest::addColumn<QByteArray>("stream");
        QTest::addColumn<int>("frames");
        QTest::addColumn<int>("leftOver");
        QTest::addColumn<bool>("valid");
        const QByteArray first = encodeFrame({{"id", 1}, {"method", "MuteAlarm"}});
        const QByteArray second = encodeFrame({{"id", 2}, {"reply", QString::fromUtf8("Bär <&>")}});
        QByteArray huge(4, '\0');
        qToBigEndian(kMaxFramePayload + 1, huge.data());
        QByteArray array(4, '\0');
        qToBigEndian(quint32(2), array.data());
        QTest::newRow("two frames at once") << first + second << 2 << 0 << true;
        QTest::newRow("frame and a half") << first + second.left(7) << 1 << 7 << true;
        QTest::newRow("header only") << first.left(3) << 0 << 3 << true;
        QTest::newRow("too long") << first + huge << 1 << 4 << false;
        QTest::newRow("not an object") << array + "[]" << 0 << 6 << false;
        QTest::newRow("not JSON") << first + encodeFrame({}).left(4) + "{x" << 1 << 6 << false;
    }

    void framing()
    {
        QFETCH(QByteArray, stream);
        QFETCH(int, frames);
        QFETCH(int, leftOver);
        QFETCH(bool, valid);
        QByteArray buffer = stream;
        QList<QJsonObject> out;
        QString error;
        QCOMPARE(takeFrames(buffer, out, &error), valid);
        QCOMPARE(out.size(), frames);
        QCOMPARE(buffer.size(), leftOver);
        QCOMPARE(error.isEmpty(), valid);
        if (frames > 0)
            QCOMPARE(out.first().value("id").toInt(), 1);
    }

    void framingByteByByte()
    {
        const QJsonObject payload{{"id", 9}, {"command", QString::fromUtf8("<x>é</x>")}};
        const QByteArray frame = encodeFrame(payload);
        QByteArray buffer;
        QList<QJsonObject> out;
        for (char byte : frame) {
            QVERIFY(out.isEmpty());
            buffer.append(byte);
            QVERIFY(takeFrames(buffer, out, nullptr));
        }
        QCOMPARE(out, QList<QJsonObject>{payload});
        QVERIFY(buffer.isEmpty());
    }

    void tcpRoundTrip()
    {
        TcpAlarmServer tcp(*m_server);
        QVERIFY(tcp.listenOnLoopback(0));
        QTcpSocket socket;
        QByteArray buffer;
        QList<QJsonObject> replies;
        connect(&socket, &QTcpSocket::readyRead, this, [&] {
            buffer += socket.readAll();
            QVERIFY(takeFrames(buffer, replies, nullptr));
        });
        socket.connectToHost(QHostAddress::LocalHost, tcp.serverPort());
        const QString id = m_all.at(0)["AlarmID"];
        const auto request = [](int number, const char* method, const QString& command) {
            return encodeFrame(
                {{"id", number}, {"method", QLatin1String(method)}, {"command", command}});
        };
        socket.write(request(1, "QryAlarmList", queryCommand()) +
                     request(2, "MuteAlarm", muteCommand({id}, true, 60)) +
                     request(3, "GetAlarmInfo", infoCommand(id)) +
                     request(4, "Unknown", QString()));
        QTRY_COMPARE(replies.size(), 3);
        QCOMPARE(replies.at(0).value("id").toInt(), 1);
        QCOMPARE(replies.at(0).value("status").toString(), QStringLiteral("0"));
        // The mute may run before or after the query: only the list itself is compared.
        const QList<AlarmFields> listed =
            elementsOf(replies.at(0).value("reply").toString(), QStringLiteral("Alarm"));
        QCOMPARE(listed.size(), m_all.size());
        QCOMPARE(listed.last(), m_all.last());
        QCOMPARE(replies.at(1).value("id").toInt(), 3);
        QVERIFY(replies.at(1).value("reply").toString().startsWith(
            QStringLiteral("<GetAlarmInfoRes><Alarm><AlarmID>%1</AlarmID>").arg(id)));
        QCOMPARE(replies.at(2).value("id").toInt(), 4);
        QCOMPARE(replies.at(2).value("status").toString(), QStringLiteral("80000002"));
    }

    // A client that sends without reading: the server stops taking its requests while their
    // replies wait unsent, so the client's writes back up instead of the server's memory
    // growing (844 MB after 400 pipelined queries of 5000 alarms); once it reads, every reply
    // comes, in order.
    void pipelinedWithoutReading()
    {
        TcpAlarmServer tcp(*m_server);
        QVERIFY(tcp.listenOnLoopback(0));
        QTcpSocket socket;
        socket.connectToHost(QHostAddress::LocalHost, tcp.serverPort());
        QVERIFY(socket.waitForConnected(5000));
        const QString padding(20000, u' ');
        const int queries = 200;
        const int requests = queries + 2000;
        for (int id = 0; id < requests; ++id) {
            const QString command =
                id < queries ? queryCommand() : "<GetAlarmInfo>" + padding + "</GetAlarmInfo>";
            socket.write(encodeFrame({{"id", id},
                                      {"method", id < queries ? "QryAlarmList" : "GetAlarmInfo"},
                                      {"command", command}}));
        }
        QTest::qWait(2000);
        QVERIFY2(socket.bytesToWrite() > 0, "the server read every request");

        QByteArray buffer;
        QList<QJsonObject> replies;
        connect(&socket, &QTcpSocket::readyRead, this, [&] {
            buffer += socket.readAll();
            QVERIFY(takeFrames(buffer, replies, nullptr));
        });
        QTRY_COMPARE_WITH_TIMEOUT(replies.size(), requests, 120000);
        for (int id = 0; id < requests; ++id)
            QCOMPARE(replies.at(id).value("id").toInt(), id);
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
