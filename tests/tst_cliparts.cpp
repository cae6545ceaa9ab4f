#include <AlarmPager.h>
#include <AlarmSearchLimits.h>
#include <AlarmTable.h>
#include <BatchRequest.h>
#include <ExportWriter.h>
#include <PlainJson.h>
#include <QueryArguments.h>
#include <SearchWriter.h>
#include <TimeArgument.h>

#include <PluginAlarmSearchCommon.h>

#include <QJsonArray>
#include <QJsonObject>
#include <QtTest>

using namespace PluginAlarmSearchCommon;
using namespace Qt::StringLiterals;

namespace {

const QDateTime kNow(QDate(2026, 11, 20), QTime(12, 0, 0), QTimeZone::utc());

QVariantMap alarm(int id, const QDateTime& time)
{
    return QVariantMap{
        {u"AlarmID"_s, u"A%1"_s.arg(id, 7, 10, QLatin1Char('0'))},
        {u"ServerTime"_s, time.toString(u"yyyy-MM-ddTHH:mm:ss"_s) + QLatin1Char('Z')}};
}

// A server stand-in with the real one's search rules: inclusive time bounds, newest first,
// at most AlarmSearchLimits::MaxRecords; ties in time come back in an arbitrary but fixed order.
class FakeAlarmStore
{
public:
    explicit FakeAlarmStore(QList<QVariantMap> alarms) : m_alarms(std::move(alarms))
    {
        std::stable_sort(m_alarms.begin(), m_alarms.end(), [](const auto& a, const auto& b) {
            return a.value(u"ServerTime"_s).toString() > b.value(u"ServerTime"_s).toString();
        });
    }
    bool search(const QVariantMap& args, QVariantList* page, QString*)
    {
        ++searches;
        const QString end = ignoresWindow ? QString() : args.value(ARG_END_TIME).toString();
        page->clear();
        for (const QVariantMap& alarm : std::as_const(m_alarms)) {
            const QString time = alarm.value(u"ServerTime"_s).toString().chopped(1); // drop "Z"
            if (!end.isEmpty() && time > end)
                continue;
            if (page->size() == AlarmSearchLimits::MaxRecords)
                break;
            page->append(alarm);
        }
        if (oldestFirst)
            std::reverse(page->begin(), page->end());
        return true;
    }
    int searches = 0;
    bool oldestFirst = false; // misbehaving servers
    bool ignoresWindow = false;

private:
    QList<QVariantMap> m_alarms;
};

} // namespace

class TestCliParts : public QObject
{
    Q_OBJECT

private slots:
    void times_data()
    {
        QTest::addColumn<QString>("text");
        QTest::addColumn<bool>("isEnd");
        QTest::addColumn<QString>("zone");
        QTest::addColumn<QString>("expected"); // empty: rejected
        const QString utc = u"UTC"_s;
        const QString berlin = u"Europe/Berlin"_s;
        QTest::newRow("full") << "2026-11-01T08:15:30" << false << utc << "2026-11-01T08:15:30";
        QTest::newRow("Z") << "2026-11-01T08:15:30Z" << true << berlin << "2026-11-01T08:15:30";
        QTest::newRow("offset") << "2026-11-01T08:15:30+02:00" << false << utc
                                << "2026-11-01T06:15:30";
        QTest::newRow("offset without colon")
            << "2026-11-01T08:15-0130" << false << berlin << "2026-11-01T09:45:00";
        QTest::newRow("fraction") << "2026-11-01T08:15:30.987Z" << true << utc
                                  << "2026-11-01T08:15:30";
        QTest::newRow("blank, minutes, start")
            << "2026-11-01 08:15" << false << utc << "2026-11-01T08:15:00";
        QTest::newRow("blank, minutes, end")
            << "2026-11-01 08:15" << true << utc << "2026-11-01T08:15:59";
        QTest::newRow("naive in zone")
            << "2026-07-01 08:15:30" << false << berlin << "2026-07-01T06:15:30";
        QTest::newRow("date as start") << "2026-11-01" << false << utc << "2026-11-01T00:00:00";
        QTest::newRow("date as end") << "2026-11-01" << true << utc << "2026-11-01T23:59:59";
        QTest::newRow("date in zone") << "2026-11-01" << false << berlin << "2026-10-31T23:00:00";
        QTest::newRow("hours ago") << "24h" << false << berlin << "2026-11-19T12:00:00";
        QTest::newRow("weeks ago") << "2w" << false << utc << "2026-11-06T12:00:00";
        QTest::newRow("minutes ago") << "90m" << true << utc << "2026-11-20T10:30:00";
        QTest::newRow("now") << "NOW" << true << utc << "2026-11-20T12:00:00";
        QTest::newRow("unknown unit") << "3y" << false << utc << "";
        QTest::newRow("impossible date") << "2026-02-30" << false << utc << "";
        QTest::newRow("impossible hour") << "2026-11-01T25:00" << false << utc << "";
        QTest::newRow("bad offset") << "2026-11-01T08:15+25:00" << false << utc << "";
        QTest::newRow("words") << "yesterday" << false << utc << "";
    }

    void times()
    {
        QFETCH(QString, text);
        QFETCH(bool, isEnd);
        QFETCH(QString, zone);
        QFETCH(QString, expected);
        QString time;
        QString error;
        const bool ok =
            TimeArgument::parse(text, isEnd ? TimeArgument::Bound::End : TimeArgument::Bound::Start,
                                kNow, TimeArgument::zoneNamed(zone), &time, &error);
        QCOMPARE(ok, !expected.isEmpty());
        QCOMPARE(time, expected);
        if (!ok)
            QVERIFY2(error.contains(TimeArgument::acceptedForms()), qPrintable(error));
    }

    void queryArguments()
    {
        QueryFilter filter;
        filter.events = QStringList{u"camevent:motion"_s, u"VCA:LOITERING"_s, u"ExtIODevice:DI"_s,
                                    u"stationconn"_s};
        filter.states = QStringList{u"handled"_s, u"false-alarm"_s};
        filter.names = QStringList{u"Main Gate"_s};
        filter.devices = QStringList{u"Lobby"_s, u"Dock"_s};
        filter.from = u"2026-11-01"_s;
        QVariantMap args;
        QString error;
        QVERIFY2(QueryArguments::build(filter, kNow, &args, &error), qPrintable(error));
        QCOMPARE(QueryArguments::method(filter), METHOD_QUERY_ALARM_LIST);
        const auto rule = [](int type, const QStringList& tags) {
            return QVariantMap{{u"type"_s, type}, {u"tagList"_s, tags}};
        };
        QCOMPARE(args,
                 (QVariantMap{
                     {ARG_TRIGGER_EVENT_FILTER, u"<Event CameraEvent=\"Motion\">CamEvent</Event>"
                                                "<Event VCAEvent=\"Loitering\">VCA</Event>"
                                                "<Event ExtDeviceEvent=\"DI\">ExtIODevice</Event>"
                                                "<Event>StationConn</Event>"_s},
                     {ARG_STATE_FILTER, u"<AlarmStateList><State>Handled</State>"
                                        "<State>FalseAlarm</State></AlarmStateList>"_s},
                     {ARG_RULES, QVariantList{rule(0, filter.names), rule(1, filter.devices)}},
                     {ARG_START_TIME, u"2026-11-01T00:00:00"_s}}));

        // A client of a remote host sends the terms, from which the server builds the same map.
        QueryFilter terms;
        QVERIFY2(QueryArguments::filterOf(args, &terms, &error), qPrintable(error));
        QVariantMap rebuilt;
        QVERIFY(QueryArguments::build(terms, kNow, &rebuilt, &error));
        QCOMPARE(rebuilt, args);
        QVERIFY(!QueryArguments::filterOf({{ARG_STATE_FILTER, u"<Or/>"_s}}, &terms, &error));

        QueryFilter groups;
        groups.eventGroups = QStringList{u"System"_s, u"external"_s};
        groups.unhandledOnly = true;
        QVERIFY(QueryArguments::build(groups, kNow, &args, &error));
        QCOMPARE(QueryArguments::method(groups), METHOD_QUERY_UNHANDLED_ALARM);
        QCOMPARE(args,
                 (QVariantMap{
                     {ARG_TRIGGER_EVENT_FILTER, SYSTEM_TRIGGER_EVENT_FILTER_STRING +
                                                    EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING},
                     {ARG_STATE_FILTER,
                      u"<AlarmStateList><State>Unhandled</State></AlarmStateList>"_s}}));
    }

    void badQueryArguments_data()
    {
        QTest::addColumn<QueryFilter>("filter");
        QTest::addColumn<QString>("error");
        const auto events = [](const QString& event) {
            QueryFilter filter;
            filter.events = QStringList{event};
            return filter;
        };
        QTest::newRow("sub-event of a class without")
            << events(u"StationConn:Lost"_s) << "StationConn has no sub-events";
        QTest::newRow("no class") << events(u":Motion"_s) << "expected CLASS or CLASS:SUBEVENT";
        QTest::newRow("unknown sub-event")
            << events(u"VCA:Motion"_s)
            << "sub-event \"Motion\" of VCA (expected one of LineDetection, FieldDetection";
        QueryFilter filter;
        filter.eventGroups = QStringList{u"cameras"_s};
        QTest::newRow("unknown group") << filter << "unknown event group";
        filter = QueryFilter();
        filter.unhandledOnly = true;
        filter.states = QStringList{u"Handled"_s};
        QTest::newRow("unhandled with another state") << filter << "--unhandled";
        filter = QueryFilter();
        filter.from = u"2026-11-02"_s;
        filter.to = u"2026-11-01"_s;
        QTest::newRow("from after to") << filter << "is after --to";
    }

    void badQueryArguments()
    {
        QFETCH(QueryFilter, filter);
        QFETCH(QString, error);
        QVariantMap args;
        QString message;
        QVERIFY(!QueryArguments::build(filter, kNow, &args, &message));
        QVERIFY2(message.contains(error), qPrintable(message));
    }

    void pagerWalksWindowsWithoutGapsOrDuplicates_data()
    {
        QTest::addColumn<int>("alarmCount");
        QTest::addColumn<int>("perSecond");
        QTest::addColumn<int>("expectedSearches");
        QTest::addColumn<int>("misbehaviour"); // 1: oldest first, 2: ignores the window
        QTest::newRow("below the cap") << 4999 << 1 << 1 << 0;
        QTest::newRow("exactly the cap") << 5000 << 1 << 2 << 0;
        QTest::newRow("spread out") << 12001 << 1 << 3 << 0;
        // Pages end inside a run of alarms sharing one second.
        QTest::newRow("shared seconds") << 12000 << 7 << 3 << 0;
        // More than a page in one second: the pager stops with a warning.
        QTest::newRow("one second") << 5010 << 5010 << 2 << 0;
        // Such servers used to keep the walk going forever.
        QTest::newRow("oldest first") << 12000 << 1 << 1 << 1;
        QTest::newRow("ignores the window") << 12000 << 1 << 2 << 2;
    }

    void pagerWalksWindowsWithoutGapsOrDuplicates()
    {
        QFETCH(int, alarmCount);
        QFETCH(int, perSecond);
        QFETCH(int, expectedSearches);
        QFETCH(int, misbehaviour);
        QList<QVariantMap> alarms;
        for (int i = 0; i < alarmCount; ++i)
            alarms.append(alarm(i + 1, kNow.addSecs(-(i / perSecond))));
        FakeAlarmStore store(alarms);
        store.oldestFirst = misbehaviour == 1;
        store.ignoresWindow = misbehaviour == 2;
        AlarmPager pager([&store](const QVariantMap& args, QVariantList* page, QString* error) {
            return store.search(args, page, error);
        });
        QVariantList found;
        QString error;
        const bool ok = pager.fetchAll(
            {{ARG_START_TIME, u"2000-01-01T00:00:00"_s}},
            [&found](const QVariantList& page, QString*) {
                found += page;
                return true;
            },
            &error);
        QCOMPARE(store.searches, expectedSearches);
        if (misbehaviour) {
            QVERIFY(!ok);
            QCOMPARE(error, u"the server's alarms are not newest first within the searched time "
                            "range; stopped after %1 alarms"_s.arg(misbehaviour == 1 ? 0 : 5000));
            return;
        }
        QVERIFY(ok);
        const bool oneSecond = perSecond > AlarmSearchLimits::MaxRecords;
        QCOMPARE(found.size(), oneSecond ? AlarmSearchLimits::MaxRecords : alarmCount);
        QSet<QString> ids;
        QString previousTime = u"9999"_s;
        for (const QVariant& entry : std::as_const(found)) {
            const QVariantMap fields = entry.toMap();
            ids.insert(fields.value(u"AlarmID"_s).toString());
            const QString time = fields.value(u"ServerTime"_s).toString();
            QVERIFY(time <= previousTime);
            previousTime = time;
        }
        QCOMPARE(ids.size(), found.size());
        QCOMPARE(pager.warning().contains(u"may be missing"_s), oneSecond);
    }

    // Muted and ServerTime are typed by the serve test; these no other test reads.
    void plainJsonTypesKnownFields()
    {
        const QJsonValue plain =
            PlainJson::value(QVariantList{QVariantMap{{u"MuteUntil"_s, QString()},
                                                      {u"Time"_s, u"2026-11-20T10:00:00+02:00"_s},
                                                      {ARG_UPDATE_RESULT, u"1"_s}}});
        QCOMPARE(plain, QJsonValue(QJsonArray{QJsonObject{{u"MuteUntil"_s, QJsonValue::Null},
                                                          {u"Time"_s, u"2026-11-20T08:00:00Z"_s},
                                                          {ARG_UPDATE_RESULT, 1}}}));
        // Typed values stay as they are, as when a remote host's answer is printed again.
        QCOMPARE(PlainJson::value(plain.toVariant()), plain);
    }

    void csvQuotesGuardsAndRepeatsAlarmFields()
    {
        const QVariantMap fields{{u"AlarmID"_s, u"A0000001"_s},
                                 {u"AlarmName"_s, u"Gate, \"north\""_s},
                                 {u"ServerTime"_s, u"2026-11-20T08:00:00Z"_s},
                                 {u"Note"_s, u"=HYPERLINK(\"x\")"_s}};
        const QVariantList history{
            QVariantMap{{u"State"_s, u"Unhandled"_s}},
            QVariantMap{{u"State"_s, u"Handled"_s}, {u"Note"_s, u"two\nlines"_s}}};
        ExportWriter::Options options;
        options.byteOrderMark = true;
        options.zone = TimeArgument::zoneNamed(u"+01:00"_s);
        ExportWriter writer(options);
        const QByteArray bytes = writer.begin() + writer.alarm(ExportedAlarm{fields, history}) +
                                 writer.alarm(ExportedAlarm{fields, QVariantList()}) + writer.end();
        QVERIFY(bytes.startsWith("\xEF\xBB\xBF"
                                 "AlarmID,"));
        const QString csv = QString::fromUtf8(bytes.mid(3));
        const QStringList rows = csv.split(u"\r\n"_s, Qt::SkipEmptyParts);
        QCOMPARE(rows.size(), 4);
        QCOMPARE(rows[0], ExportWriter::csvColumns().join(u','));
        const QString alarm = QStringLiteral("A0000001,,,,\"Gate, \"\"north\"\"\",,,"
                                             "2026-11-20T09:00:00+01:00,"
                                             "\"'=HYPERLINK(\"\"x\"\")\",,,");
        QCOMPARE(rows[1], alarm + u",Unhandled,,"_s);
        QCOMPARE(rows[2], alarm + u",Handled,\"two\nlines\","_s);
        QCOMPARE(rows[3], alarm + u",,,"_s);

        // A leading =, +, -, @, tab or carriage return is guarded, unless raw.
        const QStringList values{u"=1+2"_s, u"+1"_s,  u"-1"_s, u"@SUM(A1)"_s,
                                 u"\tx"_s,  u"a=b"_s, u""_s};
        for (const QString& value : values) {
            const bool guarded = !value.isEmpty() && u"=+-@\t"_s.contains(value.front());
            QCOMPARE(ExportWriter::csvField(value, false), guarded ? u'\'' + value : value);
            QCOMPARE(ExportWriter::csvField(value, true), value);
        }
        QCOMPARE(ExportWriter::csvField(u"\rx"_s, false), u"\"'\rx\""_s);
        QCOMPARE(ExportWriter::csvField(u"\rx"_s, true), u"\"\rx\""_s);
    }

    // Compact and indented, with and without alarms: one JSON answer.
    void searchWriterStreamsOneAnswer()
    {
        for (const bool pretty : {false, true}) {
            for (const int pages : {0, 2}) {
                SearchWriter writer(
                    {SearchWriter::Format::Json, METHOD_QUERY_UNHANDLED_ALARM, pretty});
                QByteArray out;
                for (int i = 0; i < pages; ++i)
                    out += writer.page({alarm(2 * i + 1, kNow), alarm(2 * i + 2, kNow)});
                const QJsonObject answer =
                    QJsonDocument::fromJson(out + writer.finish(true)).object();
                QCOMPARE(answer.value("method"_L1).toString(), METHOD_QUERY_UNHANDLED_ALARM);
                QCOMPARE(answer.value("truncated"_L1).toBool(), true);
                QCOMPARE(answer["result"_L1][ARG_QUERY_RESULT].toArray().size(), 2 * pages);
            }
        }
    }

    void tableFitsWidthByDisplayWidth()
    {
        QVariantMap wide = alarm(1, kNow);
        wide.insert(u"AlarmName"_s, u"正門の動き検知 🚨 at the main gate"_s);
        wide.insert(u"Note"_s, u"Cafe\u0301 checked, all fine"_s);
        QVariantMap plain = alarm(2, kNow.addSecs(-60));
        plain.insert(u"AlarmName"_s, u"Motion"_s);
        for (QVariantMap* fields : {&wide, &plain})
            fields->insert(u"Muted"_s, u"false"_s);
        QCOMPARE(AlarmTable::displayWidth(u"正門🚨e\u0301"_s), 7);
        AlarmTable table(TimeArgument::zoneNamed(u"+01:00"_s), 72);
        const QStringList lines =
            table.page({wide, plain}).split(QLatin1Char('\n'), Qt::SkipEmptyParts);
        QCOMPARE(lines.size(), 3);
        QVERIFY2(lines[0].startsWith(u"ALARM     TIME (UTC+01:00)     "_s), qPrintable(lines[0]));
        QVERIFY2(lines[2].startsWith(u"A0000002  2026-11-20 12:59:00  "_s), qPrintable(lines[2]));
        QVERIFY(lines[1].contains(u"…"_s));
        // MUTED starts at the same display column in every line, wide characters or not.
        const auto mutedColumn = [](const QString& line, const char* text) {
            return AlarmTable::displayWidth(line.left(line.indexOf(QLatin1String(text))));
        };
        for (const QString& line : lines)
            QVERIFY2(AlarmTable::displayWidth(line) <= 72, qPrintable(line));
        QCOMPARE(mutedColumn(lines[1], "false"), mutedColumn(lines[0], "MUTED"));
        QCOMPARE(mutedColumn(lines[2], "false"), mutedColumn(lines[0], "MUTED"));
    }

    void batchRequests_data()
    {
        QTest::addColumn<QByteArray>("line");
        QTest::addColumn<QVariantMap>("args"); // expected; empty with an error
        QTest::addColumn<QString>("error");
        const auto row = [](const char* name, const char* line, const QVariantMap& args,
                            const char* error = "") {
            QTest::newRow(name) << QByteArray(line) << args << QString::fromUtf8(error);
        };
        row("friendly search",
            R"({"method":"QryAlarmList","args":{"stateFilter":["unhandled","false-alarm"],)"
            R"("triggerEventFilter":["camevent:motion","system"],"startTime":"2026-11-01 08:00",)"
            R"("endTime":"24h","all":true}})",
            {{ARG_STATE_FILTER, QStringLiteral("<AlarmStateList><State>Unhandled</State>"
                                               "<State>FalseAlarm</State></AlarmStateList>")},
             {ARG_TRIGGER_EVENT_FILTER, QStringLiteral("<Event CameraEvent=\"Motion\">CamEvent"
                                                       "</Event>") +
                                            SYSTEM_TRIGGER_EVENT_FILTER_STRING},
             {ARG_START_TIME, u"2026-11-01T08:00:00"_s},
             {ARG_END_TIME, u"2026-11-19T12:00:00"_s}});
        row("raw fragments",
            R"({"method":"QryUnhandledAlarm","args":{"stateFilter":"<AlarmStateList/>",)"
            R"("rules":[{"type":1,"tagList":["Dock"]}]}})",
            {{ARG_STATE_FILTER, u"<AlarmStateList/>"_s},
             {ARG_RULES,
              QVariantList{QVariantMap{{u"type"_s, 1}, {u"tagList"_s, QStringList{u"Dock"_s}}}}}});
        row("update",
            R"({"method":"UpdateAlarm","args":{"alarmIdList":"A1","alarmStatus":"handled"}})",
            {{ARG_ALARM_ID_LIST, QStringList{u"A1"_s}}, {ARG_ALARM_STATUS, u"Handled"_s}});
        row("mute",
            R"({"method":"MuteAlarm","args":{"alarmIdList":["A1"],"isMute":true,"muteTimeSecond":60}})",
            {{ARG_ALARM_ID_LIST, QStringList{u"A1"_s}},
             {ARG_IS_MUTE, true},
             {ARG_MUTE_TIME_SECOND, 60}});
        row("unknown key", R"({"method":"QryAlarmList","args":{"from":"7d","bogus":1}})", {},
            "args.bogus: unknown key for QryAlarmList (expected triggerEventFilter, stateFilter, "
            "startTime, endTime, rules, relayPath, all)");
        row("unknown top key", R"({"method":"QryAlarmList","argz":{}})", {},
            "unknown key \"argz\"");
        row("all on a history",
            R"({"method":"GetAlarmHistory","args":{"alarmId":"A1","all":true}})", {},
            "args.all: unknown key for GetAlarmHistory");
        row("unknown state", R"({"method":"QryAlarmList","args":{"stateFilter":"Closed"}})", {},
            "args.stateFilter: unknown state \"Closed\"");
        row("unknown event", R"({"method":"QryAlarmList","args":{"triggerEventFilter":["Bogus"]}})",
            {}, "args.triggerEventFilter: unknown event class \"Bogus\"");
        row("time as number", R"({"method":"QryAlarmList","args":{"endTime":5}})", {},
            "args.endTime: expected a time text");
        row("mute flag as text",
            R"({"method":"MuteAlarm","args":{"alarmIdList":["A1"],"isMute":"yes"}})", {},
            "args.isMute: expected true or false");
        row("fractional seconds",
            R"({"method":"MuteAlarm","args":{"alarmIdList":["A1"],"isMute":true,"muteTimeSecond":1.5}})",
            {}, "args.muteTimeSecond: expected a whole number");
        row("ids as number",
            R"({"method":"UpdateAlarm","args":{"alarmIdList":[1],"alarmStatus":"Handled"}})", {},
            "args.alarmIdList: expected a text or a list of texts");
        row("missing state", R"({"method":"UpdateAlarm","args":{"alarmIdList":["A1"]}})", {},
            "args.alarmStatus: required for UpdateAlarm");
        row("bad rule", R"({"method":"QryAlarmList","args":{"rules":[{"type":2,"tagList":[]}]}})",
            {}, "args.rules: expected a list of");
    }

    void batchRequests()
    {
        QFETCH(QByteArray, line);
        QFETCH(QVariantMap, args);
        QFETCH(QString, error);
        BatchRequest request;
        QString message;
        const bool ok = BatchRequest::read(QJsonDocument::fromJson(line).object(), kNow,
                                           QTimeZone::utc(), &request, &message);
        QVERIFY2(ok == error.isEmpty(), qPrintable(message));
        if (ok) {
            QCOMPARE(request.args, args);
            QCOMPARE(request.all, line.contains("\"all\":true"));
        } else {
            QVERIFY2(message.startsWith(error), qPrintable(message));
        }
    }
};

QTEST_GUILESS_MAIN(TestCliParts)
#include "tst_cliparts.moc"
