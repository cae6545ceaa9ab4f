#include <AlarmPager.h>
#include <ExportWriter.h>
#include <PlainJson.h>
#include <QueryArguments.h>
#include <TimeArgument.h>

#include <PluginAlarmSearchCommon.h>

#include <QJsonArray>
#include <QJsonObject>
#include <QtTest>

using namespace PluginAlarmSearchCommon;

namespace {

const QDateTime kNow(QDate(2026, 11, 20), QTime(12, 0, 0), QTimeZone::utc());

QVariantMap alarm(int id, const QDateTime& time)
{
    return QVariantMap{
        {QStringLiteral("AlarmID"), QStringLiteral("A%1").arg(id, 7, 10, QLatin1Char('0'))},
        {QStringLiteral("ServerTime"),
         time.toString(QStringLiteral("yyyy-MM-ddTHH:mm:ss")) + QLatin1Char('Z')}};
}

// A server stand-in with the real one's search rules: inclusive time bounds, newest first,
// at most kMaxRecords; ties in time come back in an arbitrary but fixed order.
class FakeAlarmStore
{
public:
    explicit FakeAlarmStore(QList<QVariantMap> alarms) : m_alarms(std::move(alarms))
    {
        std::stable_sort(m_alarms.begin(), m_alarms.end(), [](const auto& a, const auto& b) {
            return a.value(QStringLiteral("ServerTime")).toString() >
                   b.value(QStringLiteral("ServerTime")).toString();
        });
    }
    bool search(const QVariantMap& args, QVariantList* page, QString*)
    {
        ++searches;
        const QString end = args.value(ARG_END_TIME).toString();
        page->clear();
        for (const QVariantMap& alarm : std::as_const(m_alarms)) {
            const QString time =
                alarm.value(QStringLiteral("ServerTime")).toString().chopped(1); // drop "Z"
            if (!end.isEmpty() && time > end)
                continue;
            if (page->size() == AlarmPager::kMaxRecords)
                break;
            page->append(alarm);
        }
        return true;
    }
    int searches = 0;

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
        QTest::addColumn<QString>("expected"); // empty: rejected
        QTest::newRow("full") << "2026-11-01T08:15:30" << false << "2026-11-01T08:15:30";
        QTest::newRow("full with Z") << "2026-11-01T08:15:30Z" << true << "2026-11-01T08:15:30";
        QTest::newRow("date as start") << "2026-11-01" << false << "2026-11-01T00:00:00";
        QTest::newRow("date as end") << "2026-11-01" << true << "2026-11-01T23:59:59";
        QTest::newRow("hours ago") << "24h" << false << "2026-11-19T12:00:00";
        QTest::newRow("days ago") << "7d" << false << "2026-11-13T12:00:00";
        QTest::newRow("minutes ago") << "90m" << true << "2026-11-20T10:30:00";
        QTest::newRow("now") << "now" << true << "2026-11-20T12:00:00";
        QTest::newRow("unknown unit") << "3y" << false << "";
        QTest::newRow("impossible date") << "2026-02-30" << false << "";
        QTest::newRow("words") << "yesterday" << false << "";
    }

    void times()
    {
        QFETCH(QString, text);
        QFETCH(bool, isEnd);
        QFETCH(QString, expected);
        QString time;
        QString error;
        const bool ok =
            TimeArgument::parse(text, isEnd ? TimeArgument::Bound::End : TimeArgument::Bound::Start,
                                kNow, &time, &error);
        QCOMPARE(ok, !expected.isEmpty());
        QCOMPARE(time, expected);
        QCOMPARE(error.isEmpty(), ok);
    }

    void queryArguments()
    {
        QueryFilter filter;
        filter.events =
            QStringList{QStringLiteral("CamEvent:Motion"), QStringLiteral("VCA:Loitering"),
                        QStringLiteral("ExtIODevice:DI"), QStringLiteral("StationConn")};
        filter.states = QStringList{QStringLiteral("handled"), QStringLiteral("false-alarm")};
        filter.names = QStringList{QStringLiteral("Main Gate")};
        filter.devices = QStringList{QStringLiteral("Lobby"), QStringLiteral("Dock")};
        filter.from = QStringLiteral("2026-11-01");
        QVariantMap args;
        QString error;
        QVERIFY2(QueryArguments::build(filter, kNow, &args, &error), qPrintable(error));
        QCOMPARE(QueryArguments::method(filter), METHOD_QUERY_ALARM_LIST);
        QCOMPARE(args.value(ARG_TRIGGER_EVENT_FILTER).toString(),
                 QStringLiteral("<Event CameraEvent=\"Motion\">CamEvent</Event>"
                                "<Event VCAEvent=\"Loitering\">VCA</Event>"
                                "<Event ExtDeviceEvent=\"DI\">ExtIODevice</Event>"
                                "<Event>StationConn</Event>"));
        QCOMPARE(args.value(ARG_STATE_FILTER).toString(),
                 QStringLiteral("<AlarmStateList><State>Handled</State>"
                                "<State>FalseAlarm</State></AlarmStateList>"));
        const QVariantList rules = args.value(ARG_RULES).toList();
        QCOMPARE(rules.size(), 2);
        QCOMPARE(rules[0].toMap().value(QStringLiteral("type")).toInt(), 0);
        QCOMPARE(rules[0].toMap().value(QStringLiteral("tagList")).toStringList(), filter.names);
        QCOMPARE(rules[1].toMap().value(QStringLiteral("type")).toInt(), 1);
        QCOMPARE(rules[1].toMap().value(QStringLiteral("tagList")).toStringList(), filter.devices);
        QCOMPARE(args.value(ARG_START_TIME).toString(), QStringLiteral("2026-11-01T00:00:00"));
        QVERIFY(!args.contains(ARG_END_TIME));

        // A client of a remote host sends the terms, from which the server builds the same map.
        QueryFilter terms;
        QVERIFY2(QueryArguments::filterOf(args, &terms, &error), qPrintable(error));
        QVariantMap rebuilt;
        QVERIFY(QueryArguments::build(terms, kNow, &rebuilt, &error));
        QCOMPARE(rebuilt, args);
        QVERIFY(!QueryArguments::filterOf({{ARG_STATE_FILTER, QStringLiteral("<Or/>")}}, &terms,
                                          &error));

        QueryFilter groups;
        groups.eventGroups = QStringList{QStringLiteral("System"), QStringLiteral("external")};
        groups.unhandledOnly = true;
        QVERIFY(QueryArguments::build(groups, kNow, &args, &error));
        QCOMPARE(QueryArguments::method(groups), METHOD_QUERY_UNHANDLED_ALARM);
        QCOMPARE(args.value(ARG_TRIGGER_EVENT_FILTER).toString(),
                 SYSTEM_TRIGGER_EVENT_FILTER_STRING + EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING);
        QCOMPARE(args.value(ARG_STATE_FILTER).toString(),
                 QStringLiteral("<AlarmStateList><State>Unhandled</State></AlarmStateList>"));
        QCOMPARE(args.size(), 2);
    }

    void badQueryArguments_data()
    {
        QTest::addColumn<QueryFilter>("filter");
        QTest::addColumn<QString>("error");
        QueryFilter filter;
        filter.events = QStringList{QStringLiteral("StationConn:Lost")};
        QTest::newRow("sub-event of a class without") << filter << "has no sub-events";
        filter = QueryFilter();
        filter.events = QStringList{QStringLiteral(":Motion")};
        QTest::newRow("no class") << filter << "expected CLASS or CLASS:SUBEVENT";
        filter = QueryFilter();
        filter.eventGroups = QStringList{QStringLiteral("cameras")};
        QTest::newRow("unknown group") << filter << "unknown event group";
        filter = QueryFilter();
        filter.states = QStringList{QStringLiteral("Closed")};
        QTest::newRow("unknown state") << filter << "unknown state \"Closed\"";
        filter = QueryFilter();
        filter.unhandledOnly = true;
        filter.states = QStringList{QStringLiteral("Handled")};
        QTest::newRow("unhandled with another state") << filter << "--unhandled";
        filter = QueryFilter();
        filter.from = QStringLiteral("2026-11-02");
        filter.to = QStringLiteral("2026-11-01");
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
        QTest::newRow("below the cap") << 4999 << 1 << 1;
        QTest::newRow("exactly the cap") << 5000 << 1 << 2;
        QTest::newRow("spread out") << 12001 << 1 << 3;
        // Pages end inside a run of alarms sharing one second.
        QTest::newRow("shared seconds") << 12000 << 7 << 3;
    }

    void pagerWalksWindowsWithoutGapsOrDuplicates()
    {
        QFETCH(int, alarmCount);
        QFETCH(int, perSecond);
        QFETCH(int, expectedSearches);
        QList<QVariantMap> alarms;
        for (int i = 0; i < alarmCount; ++i)
            alarms.append(alarm(i + 1, kNow.addSecs(-(i / perSecond))));
        FakeAlarmStore store(alarms);
        AlarmPager pager([&store](const QVariantMap& args, QVariantList* page, QString* error) {
            return store.search(args, page, error);
        });
        QVariantList found;
        QString error;
        QVERIFY(pager.fetchAll(QVariantMap{{ARG_START_TIME, QStringLiteral("2000-01-01T00:00:00")}},
                               &found, &error));
        QCOMPARE(found.size(), alarmCount);
        QSet<QString> ids;
        QString previousTime = QStringLiteral("9999");
        for (const QVariant& entry : std::as_const(found)) {
            const QVariantMap fields = entry.toMap();
            ids.insert(fields.value(QStringLiteral("AlarmID")).toString());
            const QString time = fields.value(QStringLiteral("ServerTime")).toString();
            QVERIFY(time <= previousTime);
            previousTime = time;
        }
        QCOMPARE(ids.size(), alarmCount);
        QCOMPARE(store.searches, expectedSearches);
        QCOMPARE(pager.pages(), expectedSearches);
        QVERIFY(pager.warning().isEmpty());
    }

    void pagerStopsWhenOneSecondHoldsMoreThanAPage()
    {
        QList<QVariantMap> alarms;
        for (int i = 0; i < AlarmPager::kMaxRecords + 10; ++i)
            alarms.append(alarm(i + 1, kNow));
        FakeAlarmStore store(alarms);
        AlarmPager pager([&store](const QVariantMap& args, QVariantList* page, QString* error) {
            return store.search(args, page, error);
        });
        QVariantList found;
        QString error;
        QVERIFY(pager.fetchAll(QVariantMap(), &found, &error));
        QCOMPARE(found.size(), AlarmPager::kMaxRecords);
        QVERIFY(pager.warning().contains(QStringLiteral("may be missing")));
    }

    void plainJsonTypesKnownFields()
    {
        const QVariantMap alarm{
            {QStringLiteral("Muted"), QStringLiteral("true")},
            {QStringLiteral("ServerTime"), QStringLiteral("2026-11-20T08:00:00")},
            {QStringLiteral("MuteUntil"), QString()},
            {QStringLiteral("Note"), QStringLiteral("123")},
            {ARG_UPDATE_RESULT, QStringLiteral("1")}};
        const QJsonObject expected{
            {QStringLiteral("Muted"), true},
            {QStringLiteral("ServerTime"), QStringLiteral("2026-11-20T08:00:00Z")},
            {QStringLiteral("MuteUntil"), QJsonValue::Null},
            {QStringLiteral("Note"), QStringLiteral("123")},
            {ARG_UPDATE_RESULT, 1}};
        const QJsonValue plain = PlainJson::value(QVariantList{alarm});
        QCOMPARE(plain, QJsonValue(QJsonArray{expected}));
        // Typed values stay as they are, as when a remote host's answer is printed again.
        QCOMPARE(PlainJson::value(plain.toVariant()), plain);
        QCOMPARE(PlainJson::time(QStringLiteral("2026-11-20T10:00:00+02:00")),
                 QJsonValue(QStringLiteral("2026-11-20T08:00:00Z")));
    }

    void csvQuotesAndRepeatsAlarmFields()
    {
        const QVariantMap fields{{QStringLiteral("AlarmID"), QStringLiteral("A0000001")},
                                 {QStringLiteral("AlarmName"), QStringLiteral("Gate, \"north\"")}};
        const QVariantList history{
            QVariantMap{{QStringLiteral("State"), QStringLiteral("Unhandled")}},
            QVariantMap{{QStringLiteral("State"), QStringLiteral("Handled")},
                        {QStringLiteral("Note"), QStringLiteral("two\nlines")}}};
        const QString csv = QString::fromUtf8(ExportWriter::toCsv(
            {ExportedAlarm{fields, history}, ExportedAlarm{fields, QVariantList()}}));
        const QStringList rows = csv.split(QStringLiteral("\r\n"), Qt::SkipEmptyParts);
        QCOMPARE(rows.size(), 4);
        QVERIFY(rows[0].startsWith(QStringLiteral("AlarmID,EventClass,")));
        QVERIFY(rows[0].endsWith(QStringLiteral(",ChangeTime,ChangeState,ChangeNote,ChangeUser")));
        QCOMPARE(rows[1], QStringLiteral("A0000001,,,,\"Gate, \"\"north\"\"\",,,,,,,,Unhandled,,"));
        QCOMPARE(
            rows[2],
            QStringLiteral("A0000001,,,,\"Gate, \"\"north\"\"\",,,,,,,,Handled,\"two\nlines\","));
        QCOMPARE(rows[3], QStringLiteral("A0000001,,,,\"Gate, \"\"north\"\"\",,,,,,,,,,"));
    }
};

QTEST_GUILESS_MAIN(TestCliParts)
#include "tst_cliparts.moc"
