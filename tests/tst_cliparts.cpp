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
        {u"ServerTime"_s, time.toString(u"yyyy-MM-ddTHH:mm:ss"_s) + QLatin1Char('Z')},
        {u"Muted"_s, u"false"_s}};
}

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
        QTest::addColumn<QString>("expected");
        // Name, text, 'S'tart or 'E'nd bound, zone of naive times, result (empty: rejected).
        const auto row = [](const char* name, const char* text, char bound, const char* zone,
                            const char* expected) {
            QTest::newRow(name) << text << (bound == 'E') << zone << expected;
        };
        const char* berlin = "Europe/Berlin";
        row("Z", "2026-11-01T08:15:30Z", 'E', berlin, "2026-11-01T08:15:30");
        row("offset", "2026-11-01T08:15:30+02:00", 'S', "UTC", "2026-11-01T06:15:30");
        row("offset without colon", "2026-11-01T08:15-0130", 'S', berlin, "2026-11-01T09:45:00");
        row("fraction", "2026-11-01T08:15:30.987Z", 'E', "UTC", "2026-11-01T08:15:30");
        row("blank, minutes, end", "2026-11-01 08:15", 'E', "UTC", "2026-11-01T08:15:59");
        row("naive in zone", "2026-07-01 08:15:30", 'S', berlin, "2026-07-01T06:15:30");
        row("date as end", "2026-11-01", 'E', "UTC", "2026-11-01T23:59:59");
        row("date in zone", "2026-11-01", 'S', berlin, "2026-10-31T23:00:00");
        row("minutes ago", "90m", 'E', "UTC", "2026-11-20T10:30:00");
        row("now", "NOW", 'E', "UTC", "2026-11-20T12:00:00");
        row("unknown unit", "3y", 'S', "UTC", "");
        row("impossible date", "2026-02-30", 'S', "UTC", "");
        row("impossible hour", "2026-11-01T25:00", 'S', "UTC", "");
        row("bad offset", "2026-11-01T08:15+25:00", 'S', "UTC", "");
        row("words", "yesterday", 'S', "UTC", "");
    }

    void times()
    {
        QFETCH(QString, text);
        QFETCH(bool, isEnd);
        QFETCH(QString, zone);
        QFETCH(QString, expected);
        QString time, error;
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

        QueryFilter unhandled;
        unhandled.unhandledOnly = true;
        QVERIFY(QueryArguments::build(unhandled, kNow, &args, &error));
        QCOMPARE(QueryArguments::method(unhandled), METHOD_QUERY_UNHANDLED_ALARM);
        QCOMPARE(args, (QVariantMap{{ARG_STATE_FILTER, u"<AlarmStateList><State>Unhandled</State>"
                                                       "</AlarmStateList>"_s}}));
    }

    void badQueryArguments_data()
    {
        QTest::addColumn<QueryFilter>("filter");
        QTest::addColumn<QString>("error");
        const auto row = [](const char* name, const char* error, void (*set)(QueryFilter&)) {
            QueryFilter filter;
            set(filter);
            QTest::newRow(name) << filter << error;
        };
        row("sub-event of a class without", "StationConn has no sub-events",
            [](QueryFilter& f) { f.events = {u"StationConn:Lost"_s}; });
        row("unknown sub-event",
            "sub-event \"Motion\" of VCA (expected one of LineDetection, FieldDetection",
            [](QueryFilter& f) { f.events = {u"VCA:Motion"_s}; });
        row("unknown group", "unknown event group",
            [](QueryFilter& f) { f.eventGroups = {u"cameras"_s}; });
        row("unhandled with another state", "--unhandled", [](QueryFilter& f) {
            f.unhandledOnly = true;
            f.states = {u"Handled"_s};
        });
        row("from after to", "is after --to", [](QueryFilter& f) {
            f.from = u"2026-11-02"_s;
            f.to = u"2026-11-01"_s;
        });
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
        // A server stand-in with the real one's rules: inclusive end, newest first, at most
        // MaxRecords; misbehaving ones list oldest first (1) or ignore the window (2).
        QVariantList alarms;
        for (int i = 0; i < alarmCount; ++i)
            alarms.append(alarm(i + 1, kNow.addSecs(-(i / perSecond))));
        int searches = 0;
        AlarmPager pager([&](const QVariantMap& args, QVariantList* page, QString*) {
            ++searches;
            const QString end = misbehaviour == 2 ? QString() : args.value(ARG_END_TIME).toString();
            const auto newer = [&end](const QVariant& a) {
                return !end.isEmpty() &&
                       a.toMap().value(u"ServerTime"_s).toString().chopped(1) > end;
            };
            const auto first = std::find_if_not(alarms.cbegin(), alarms.cend(), newer);
            *page = QVariantList(first, first + std::min<qsizetype>(alarms.cend() - first,
                                                                    AlarmSearchLimits::MaxRecords));
            if (misbehaviour == 1)
                std::reverse(page->begin(), page->end());
            return true;
        });
        QVariantList found;
        QString error;
        const auto collect = [&found](const QVariantList& page, QString*) {
            found += page;
            return true;
        };
        const bool ok =
            pager.fetchAll({{ARG_START_TIME, u"2000-01-01T00:00:00"_s}}, collect, &error);
        QCOMPARE(searches, expectedSearches);
        if (misbehaviour) {
            QVERIFY(!ok);
            QCOMPARE(error, u"the server's alarms are not newest first within the searched time "
                            "range; stopped after %1 alarms"_s.arg(misbehaviour == 1 ? 0 : 5000));
            return;
        }
        QVERIFY(ok);
        // Every alarm once, newest first; more than a page in one second ends at the first page.
        const bool oneSecond = perSecond > AlarmSearchLimits::MaxRecords;
        QCOMPARE(found, alarms.mid(0, oneSecond ? AlarmSearchLimits::MaxRecords : alarmCount));
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
        QVERIFY(bytes.startsWith("\xEF\xBB\xBF"));
        const QStringList rows =
            QString::fromUtf8(bytes.mid(3)).split(u"\r\n"_s, Qt::SkipEmptyParts);
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
                QCOMPARE(answer["result"_L1][ARG_QUERY_RESULT].toArray().size(), 2 * pages);
            }
        }
    }

    void tableFitsWidthByDisplayWidth()
    {
        QVariantMap wide = alarm(1, kNow);
        wide.insert(u"AlarmName"_s, u"正門の動き検知 🚨 at the main gate"_s);
        wide.insert(u"Note"_s, u"Cafe\u0301 checked, all fine"_s);
        const QVariantMap plain = alarm(2, kNow.addSecs(-60));
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
        // Name, method, the members of "args", the expected map or the error's start.
        const auto row = [](const char* name, const char* method, const char* args,
                            const QVariantMap& expected, const char* error = "") {
            QTest::newRow(name) << "{\"method\":\"" + QByteArray(method) + "\",\"args\":{" + args +
                                       "}}"
                                << expected << QString::fromUtf8(error);
        };
        const QStringList a1{u"A1"_s};
        row("friendly search", "QryAlarmList",
            R"("stateFilter":["unhandled","false-alarm"],"triggerEventFilter":["camevent:motion",)"
            R"("System"],"startTime":"2026-11-01 08:00","endTime":"24h","all":true)",
            {{ARG_STATE_FILTER, u"<AlarmStateList><State>Unhandled</State>"
                                "<State>FalseAlarm</State></AlarmStateList>"_s},
             {ARG_TRIGGER_EVENT_FILTER, u"<Event CameraEvent=\"Motion\">CamEvent</Event>"_s +
                                            SYSTEM_TRIGGER_EVENT_FILTER_STRING},
             {ARG_START_TIME, u"2026-11-01T08:00:00"_s},
             {ARG_END_TIME, u"2026-11-19T12:00:00"_s}});
        row("raw fragments", "QryUnhandledAlarm",
            R"("stateFilter":"<AlarmStateList/>","rules":[{"type":1,"tagList":["Dock"]}])",
            {{ARG_STATE_FILTER, u"<AlarmStateList/>"_s},
             {ARG_RULES,
              QVariantList{QVariantMap{{u"type"_s, 1}, {u"tagList"_s, QStringList{u"Dock"_s}}}}}});
        row("update", "UpdateAlarm", R"("alarmIdList":"A1","alarmStatus":"handled")",
            {{ARG_ALARM_ID_LIST, a1}, {ARG_ALARM_STATUS, u"Handled"_s}});
        row("mute", "MuteAlarm", R"("alarmIdList":["A1"],"isMute":true,"muteTimeSecond":60)",
            {{ARG_ALARM_ID_LIST, a1}, {ARG_IS_MUTE, true}, {ARG_MUTE_TIME_SECOND, 60}});
        row("unknown key", "QryAlarmList", R"("from":"7d","bogus":1)", {},
            "args.bogus: unknown key for QryAlarmList (expected triggerEventFilter, stateFilter, "
            "startTime, endTime, rules, relayPath, all)");
        QTest::newRow("unknown top key") << QByteArray(R"({"method":"QryAlarmList","argz":{}})")
                                         << QVariantMap() << u"unknown key \"argz\""_s;
        row("all on a history", "GetAlarmHistory", R"("alarmId":"A1","all":true)", {},
            "args.all: unknown key for GetAlarmHistory");
        row("unknown state", "QryAlarmList", R"("stateFilter":"Closed")", {},
            "args.stateFilter: unknown state \"Closed\"");
        row("unknown event", "QryAlarmList", R"("triggerEventFilter":["Bogus"])", {},
            "args.triggerEventFilter: unknown event class \"Bogus\"");
        row("time as number", "QryAlarmList", R"("endTime":5)", {},
            "args.endTime: expected a time text");
        row("mute flag as text", "MuteAlarm", R"("alarmIdList":["A1"],"isMute":"yes")", {},
            "args.isMute: expected true or false");
        row("fractional seconds", "MuteAlarm",
            R"("alarmIdList":["A1"],"isMute":true,"muteTimeSecond":1.5)", {},
            "args.muteTimeSecond: expected a whole number");
        row("ids as number", "UpdateAlarm", R"("alarmIdList":[1],"alarmStatus":"Handled")", {},
            "args.alarmIdList: expected a text or a list of texts");
        row("missing state", "UpdateAlarm", R"("alarmIdList":["A1"])", {},
            "args.alarmStatus: required for UpdateAlarm");
        row("bad rule", "QryAlarmList", R"("rules":[{"type":2,"tagList":[]}])", {},
            "args.rules: expected a list of");
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
