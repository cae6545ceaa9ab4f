#include <AlarmPager.h>
#include <AlarmSearchLimits.h>
#include <AnswerFormat.h>
#include <HostSession.h>
#include <HostTunnelClient.h>
#include <ReferenceHost.h>
#include <TcpFrame.h>

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QJsonObject>
#include <QMutex>
#include <QProcess>
#include <QTcpServer>
#include <QTcpSocket>
#include <QtTest>

#include <memory>

using namespace PluginAlarmSearchCommon;

namespace {

const int kSeedCount = 300;
const int kTimeoutMs = 30000;
const QDateTime kSeedEnd(QDate(2026, 11, 20), QTime(12, 0, 0), QTimeZone::utc());

QString field(const QVariant& alarm, const char* name)
{
    return alarm.toMap().value(QLatin1String(name)).toString();
}

QStringList ids(const QVariantList& alarms)
{
    QStringList out;
    for (const QVariant& alarm : alarms)
        out.append(field(alarm, "AlarmID"));
    return out;
}

// Records the events of one subscription.
class EventRecorder
{
public:
    EventHub::Listener listener()
    {
        return [this](const PluginObjBase_EventSignalInfo& info) {
            QMutexLocker locker(&m_mutex);
            m_events.append({info.eventName, info.eventData});
        };
    }
    QList<QPair<QString, QVariant>> events()
    {
        QMutexLocker locker(&m_mutex);
        return m_events;
    }

private:
    QMutex m_mutex;
    QList<QPair<QString, QVariant>> m_events;
};

} // namespace

class TestIntegration : public QObject
{
    Q_OBJECT

private:
    std::unique_ptr<QProcess> m_simulator;
    std::unique_ptr<ReferenceHost> m_host;

    // Starts the simulator executable on a free port, with at most maxFiles file descriptors
    // when given; returns "127.0.0.1:port".
    QString startSimulator(int seedCount, int maxFiles = 0)
    {
        m_simulator = std::make_unique<QProcess>();
        const QString command =
            QStringLiteral("%1exec \"$0\" --memory --port 0 --seed-count %2")
                .arg(maxFiles > 0 ? QStringLiteral("ulimit -n %1 && ").arg(maxFiles) : QString())
                .arg(seedCount);
        m_simulator->start(QStringLiteral("/bin/sh"),
                           {QStringLiteral("-c"), command, QStringLiteral(ALARMSEARCH_SIM_EXE)});
        if (!m_simulator->waitForStarted(10000))
            return QString();
        while (!m_simulator->canReadLine() && m_simulator->waitForReadyRead(10000)) {
        }
        const QString line = QString::fromUtf8(m_simulator->readLine()).trimmed();
        return line.section(QLatin1Char(' '), -1);
    }

    HostSession& openHost(const QString& transport, int seedCount = kSeedCount)
    {
        ReferenceHost::Options options;
        options.pluginPath = QStringLiteral(ALARMSEARCH_PLUGIN_FILE);
        options.embedded.databasePath = QStringLiteral(":memory:");
        options.embedded.seedCount = seedCount;
        options.embedded.seedEnd = kSeedEnd;
        if (transport == QLatin1String("tcp"))
            options.serverAddress = startSimulator(seedCount);
        m_host = std::make_unique<ReferenceHost>();
        QString error;
        if (!m_host->open(options, &error))
            qFatal("cannot open the host: %s", qPrintable(error));
        return m_host->session();
    }

    PluginAnswer call(const QString& method, const QVariantMap& args)
    {
        QList<PluginAnswer> answers;
        QString error;
        if (!m_host->session().call(method, args, kTimeoutMs, &answers, &error))
            qFatal("%s", qPrintable(error));
        return answers.constLast();
    }

    QVariantList search(const QVariantMap& args, const QString& method = METHOD_QUERY_ALARM_LIST)
    {
        const PluginAnswer answer = call(method, args);
        if (answer.resultCode != QLatin1String("0"))
            qFatal("search failed: %s", qPrintable(answer.resultCode));
        return AnswerFormat::alarms(answer, true);
    }

    static void transports()
    {
        QTest::addColumn<QString>("transport");
        QTest::newRow("embedded") << QStringLiteral("embedded");
        QTest::newRow("tcp") << QStringLiteral("tcp");
    }

private slots:
    void cleanup()
    {
        m_host.reset();
        if (m_simulator) {
            m_simulator->kill();
            m_simulator->waitForFinished();
            m_simulator.reset();
        }
    }

    void searchesFilterThroughThePlugin_data() { transports(); }
    void searchesFilterThroughThePlugin()
    {
        QFETCH(QString, transport);
        openHost(transport);
        const QVariantList all = search(QVariantMap());
        QCOMPARE(all.size(), kSeedCount);
        const QStringList allIds = ids(all);
        QCOMPARE(QSet<QString>(allIds.begin(), allIds.end()).size(), kSeedCount);
        for (qsizetype i = 1; i < all.size(); ++i)
            QVERIFY(field(all[i - 1], "ServerTime") >= field(all[i], "ServerTime"));
        QVERIFY(field(all[0], "XML").trimmed().startsWith(QStringLiteral("<Alarm>")));
        QVERIFY(field(all[0], "XML").contains(field(all[0], "AlarmID")));

        // The same filter through both search methods.
        const QVariantMap unhandledArgs{
            {ARG_STATE_FILTER,
             QStringLiteral("<AlarmStateList><State>Unhandled</State></AlarmStateList>")}};
        const QVariantList unhandled = search(unhandledArgs, METHOD_QUERY_UNHANDLED_ALARM);
        QCOMPARE(ids(search(unhandledArgs)), ids(unhandled));
        QVERIFY(!unhandled.isEmpty());
        QStringList expected;
        for (const QVariant& alarm : all) {
            if (field(alarm, "State") == QLatin1String("Unhandled"))
                expected.append(field(alarm, "AlarmID"));
        }
        QCOMPARE(ids(unhandled), expected);

        // A class with a sub-event; a whole class; names by folded substring; exact devices.
        const QVariant& sample = all[0];
        struct Case
        {
            QVariantMap args;
            std::function<bool(const QVariant&)> matches;
        };
        const QString eventClass = field(sample, "EventClass");
        const QString subEventType = field(sample, "SubEventType");
        const QString subEvent = field(sample, "SubEvent");
        const QString nameWord = field(sample, "AlarmName").section(QLatin1Char(' '), -1).toUpper();
        const QString device = field(sample, "DeviceName");
        const QString from = field(all[200], "ServerTime").chopped(1);
        const QString to = field(all[100], "ServerTime").chopped(1);
        const QList<Case> cases{
            {QVariantMap{{ARG_TRIGGER_EVENT_FILTER,
                          subEvent.isEmpty() ? QStringLiteral("<Event>%1</Event>").arg(eventClass)
                                             : QStringLiteral("<Event %1=\"%2\">%3</Event>")
                                                   .arg(subEventType, subEvent, eventClass)}},
             [&](const QVariant& a) {
                 return field(a, "EventClass") == eventClass && field(a, "SubEvent") == subEvent;
             }},
            {QVariantMap{
                 {ARG_TRIGGER_EVENT_FILTER, QStringLiteral("<Event>%1</Event>").arg(eventClass)}},
             [&](const QVariant& a) { return field(a, "EventClass") == eventClass; }},
            {QVariantMap{{ARG_RULES, QVariantList{QVariantMap{
                                         {QStringLiteral("type"), 0},
                                         {QStringLiteral("tagList"), QStringList{nameWord}}}}}},
             [&](const QVariant& a) {
                 return field(a, "AlarmName").contains(nameWord, Qt::CaseInsensitive);
             }},
            {QVariantMap{{ARG_RULES, QVariantList{QVariantMap{
                                         {QStringLiteral("type"), 1},
                                         {QStringLiteral("tagList"), QStringList{device}}}}}},
             [&](const QVariant& a) { return field(a, "DeviceName") == device; }},
            {QVariantMap{{ARG_START_TIME, from}, {ARG_END_TIME, to}},
             [&](const QVariant& a) {
                 const QString time = field(a, "ServerTime").chopped(1);
                 return time >= from && time <= to;
             }},
        };
        for (const Case& c : cases) {
            QStringList wanted;
            for (const QVariant& alarm : all) {
                if (c.matches(alarm))
                    wanted.append(field(alarm, "AlarmID"));
            }
            QVERIFY(!wanted.isEmpty());
            QCOMPARE(ids(search(c.args)), wanted);
        }
    }

    void updatesReachHistoryQueriesAndEverySubscriber_data() { transports(); }
    void updatesReachHistoryQueriesAndEverySubscriber()
    {
        QFETCH(QString, transport);
        HostSession& session = openHost(transport);
        const QVariantList all = search(QVariantMap());
        const QStringList changed{field(all[3], "AlarmID"), field(all[4], "AlarmID")};

        EventRecorder first;
        EventRecorder second;
        EventRecorder gone;
        session.subscribe(QStringLiteral("first"), EVENT_ALARM_UPDATED, first.listener());
        session.subscribe(QStringLiteral("second"), EVENT_ALARM_UPDATED, second.listener());
        session.subscribe(QStringLiteral("gone"), EVENT_ALARM_UPDATED, gone.listener());
        session.unsubscribe(QStringLiteral("gone"));

        const PluginAnswer answer =
            call(METHOD_UPDATE_ALARM,
                 QVariantMap{{ARG_ALARM_ID_LIST, changed + QStringList{QStringLiteral("A9999999")}},
                             {ARG_ALARM_STATUS, QStringLiteral("FalseAlarm")},
                             {ARG_ALARM_COMMENT, QStringLiteral("Cat & dog <again>")},
                             {ARG_RELAY_PATH, QStringLiteral("relay/7")}});
        QVERIFY(answer.isLast);
        QCOMPARE(answer.resultCode, QStringLiteral("0"));
        QVERIFY(answer.result.isNull());

        QVERIFY(gone.events().isEmpty());
        for (EventRecorder* recorder : {&first, &second}) {
            const auto events = recorder->events();
            QCOMPARE(events.size(), 1);
            QCOMPARE(events[0].first, EVENT_ALARM_UPDATED);
            const QVariantMap data = events[0].second.toMap();
            QCOMPARE(data.value(ARG_RELAY_PATH).toString(), QStringLiteral("relay/7"));
            QMap<QString, QString> outcome;
            for (const QVariant& result : data.value(ARG_ALARM_UPDATED_RESULTS).toList()) {
                const QVariantMap entry = result.toMap();
                QCOMPARE(entry.value(ARG_ALARM_STATUS).toString(), QStringLiteral("FalseAlarm"));
                outcome.insert(entry.value(ARG_ALARM_ID).toString(),
                               entry.value(ARG_UPDATE_RESULT).toString());
            }
            QCOMPARE(outcome.value(changed[0]), QStringLiteral("0"));
            QCOMPARE(outcome.value(changed[1]), QStringLiteral("0"));
            QCOMPARE(outcome.value(QStringLiteral("A9999999")), QStringLiteral("1"));
        }

        const PluginAnswer history = call(METHOD_GET_ALARM_HISTORY, {{ARG_ALARM_ID, changed[0]}});
        QCOMPARE(history.resultCode, QStringLiteral("0"));
        const QVariantList entries = history.result.toList();
        QVERIFY(entries.size() >= 2);
        QCOMPARE(field(entries.constLast(), "State"), QStringLiteral("FalseAlarm"));
        QCOMPARE(field(entries.constLast(), "Note"), QStringLiteral("Cat & dog <again>"));
        QCOMPARE(call(METHOD_GET_ALARM_HISTORY_FOR_EXPORT, {{ARG_ALARM_ID, changed[0]}}).result,
                 history.result);

        const QVariantList falseAlarms = search(
            {{ARG_STATE_FILTER,
              QStringLiteral("<AlarmStateList><State>FalseAlarm</State></AlarmStateList>")}});
        QVERIFY(ids(falseAlarms).contains(changed[0]));
        QVERIFY(ids(falseAlarms).contains(changed[1]));
        for (const QVariant& alarm : falseAlarms) {
            if (changed.contains(field(alarm, "AlarmID")))
                QCOMPARE(field(alarm, "Note"), QStringLiteral("Cat & dog <again>"));
        }
    }

    void muteShowsInLaterQueries_data() { transports(); }
    void muteShowsInLaterQueries()
    {
        QFETCH(QString, transport);
        HostSession& session = openHost(transport);
        const QString id = field(search(QVariantMap())[0], "AlarmID");
        const auto muteState = [&] {
            for (const QVariant& alarm : search(QVariantMap())) {
                if (field(alarm, "AlarmID") == id)
                    return field(alarm, "Muted");
            }
            return QString();
        };
        for (bool mute : {true, false}) {
            session.send(METHOD_MUTE_ALARM, QVariantMap{{ARG_ALARM_ID_LIST, QStringList{id}},
                                                        {ARG_IS_MUTE, mute},
                                                        {ARG_MUTE_TIME_SECOND, 600}});
            QVERIFY(m_host->tunnelClient().waitForIdle(kTimeoutMs));
            QCOMPARE(muteState(), mute ? QStringLiteral("true") : QStringLiteral("false"));
        }
    }

    void lostServerAnswersFailure()
    {
        openHost(QStringLiteral("tcp"));
        m_simulator->kill();
        m_simulator->waitForFinished();
        // Refused at once or answered as failed once the loss is noticed; never a hang.
        const PluginAnswer answer = call(METHOD_QUERY_ALARM_LIST, QVariantMap());
        QVERIFY(answer.resultCode != QLatin1String("0"));
        QVERIFY(AnswerFormat::alarms(answer, true).isEmpty());
        QCOMPARE(
            call(METHOD_GET_ALARM_HISTORY, {{ARG_ALARM_ID, QStringLiteral("A0000001")}}).resultCode,
            QStringLiteral("-1"));
        QVERIFY2(m_host->tunnelClient().connectionError().startsWith(
                     QStringLiteral("connection to 127.0.0.1:")),
                 qPrintable(m_host->tunnelClient().connectionError()));
        QVERIFY(m_host->tunnelClient().connectionError().endsWith(QLatin1String(" lost")));
    }

    // Out of file descriptors, the simulator spun at full load, dropped its clients and died.
    // Now it keeps serving the clients it has, and accepts again once descriptors are free.
    void simulatorOutOfDescriptors()
    {
        const QString address = startSimulator(50, 40); // room for 8 clients
        const quint16 port = address.section(QLatin1Char(':'), -1).toUShort();
        QVERIFY(port != 0);
        const auto answered = [](QTcpSocket& socket) {
            socket.write(AlarmServerSim::encodeFrame(
                {{"id", 1},
                 {"method", "GetAlarmInfo"},
                 {"command", "<GetAlarmInfo><AlarmID>A0000001</AlarmID></GetAlarmInfo>"}}));
            QByteArray buffer;
            QList<QJsonObject> replies;
            while (replies.isEmpty() && socket.waitForReadyRead(10000)) {
                buffer += socket.readAll();
                AlarmServerSim::takeFrames(buffer, replies, nullptr);
            }
            return !replies.isEmpty() && replies.first().value("status").toString() == "0";
        };
        std::vector<std::unique_ptr<QTcpSocket>> clients;
        for (int i = 0; i < 60; ++i) {
            clients.push_back(std::make_unique<QTcpSocket>());
            clients.back()->connectToHost(QHostAddress::LocalHost, port);
            QVERIFY(clients.back()->waitForConnected(5000));
        }
        QTest::qWait(500);
        QVERIFY(answered(*clients.front()));
        clients.resize(1);
        // Served once the simulator has seen the others go.
        QTRY_VERIFY_WITH_TIMEOUT(
            [&] {
                QTcpSocket later;
                later.connectToHost(QHostAddress::LocalHost, port);
                return later.waitForConnected(5000) && answered(later);
            }(),
            20000);
        QCOMPARE(m_simulator->state(), QProcess::Running);
    }

    void recordLimitAndPagination()
    {
        const int seedCount = 2 * AlarmPager::kMaxRecords + 100;
        openHost(QStringLiteral("embedded"), seedCount);
        const QVariantList capped = search(QVariantMap());
        QCOMPARE(capped.size(), AlarmPager::kMaxRecords);

        AlarmPager pager([this](const QVariantMap& args, QVariantList* page, QString*) {
            *page = search(args);
            return true;
        });
        QVariantList all;
        QString error;
        QVERIFY(pager.fetchAll(
            QVariantMap(),
            [&all](const QVariantList& page, QString*) {
                all += page;
                return true;
            },
            &error));
        QCOMPARE(pager.pages(), 3);
        QCOMPARE(all.size(), seedCount);
        QCOMPARE(all.mid(0, capped.size()), capped); // the newest first, as one search gives them
        const QStringList found = ids(all);
        QCOMPARE(QSet<QString>(found.begin(), found.end()).size(), seedCount);
        for (qsizetype i = 1; i < all.size(); ++i)
            QVERIFY(field(all[i - 1], "ServerTime") >= field(all[i], "ServerTime"));
    }

    void cliErrorsAreOneLine_data()
    {
        QTest::addColumn<QStringList>("arguments");
        QTest::addColumn<QByteArray>("input");
        QTest::addColumn<int>("exitCode");
        QTest::addColumn<QString>("message");
        quint16 closedPort = 0;
        {
            QTcpServer probe;
            QVERIFY(probe.listen(QHostAddress::LocalHost));
            closedPort = probe.serverPort();
        }
        const QStringList memory{QStringLiteral("--memory"), QStringLiteral("--seed-count"),
                                 QStringLiteral("20")};
        QTest::newRow("bad option")
            << QStringList{QStringLiteral("query"), QStringLiteral("--bogus")} << QByteArray() << 2
            << "Unknown option 'bogus'";
        QTest::newRow("unknown command")
            << QStringList{QStringLiteral("frobnicate")} << QByteArray() << 2 << "unknown command";
        QTest::newRow("bad time") << QStringList{QStringLiteral("query"), QStringLiteral("--from"),
                                                 QStringLiteral("soon")}
                                  << QByteArray() << 2 << "bad time \"soon\"";
        QTest::newRow("bad JSON line")
            << memory + QStringList{QStringLiteral("batch")}
            << QByteArray("{\"method\":\"QryAlarmList\",\"args\":{}}\n{\"method\": oops}\n") << 2
            << "line 2: bad JSON";
        QTest::newRow("batch line past the bound")
            << memory + QStringList{QStringLiteral("batch")}
            << QByteArray(AlarmSearchLimits::MaxRequestLineBytes + 1, ' ') + '\n'
            << 2 << "line 1: longer than";
        QTest::newRow("unknown batch method")
            << memory + QStringList{QStringLiteral("batch")}
            << QByteArray("{\"method\":\"ProcessAlarm\"}\n") << 2 << "line 1: \"method\" must be";
        QTest::newRow("missing plug-in file")
            << QStringList{QStringLiteral("--plugin"), QStringLiteral("/nonexistent/libX.so"),
                           QStringLiteral("query")}
            << QByteArray() << 1 << "cannot load plug-in /nonexistent/libX.so: no such file";
        QTest::newRow("unreachable server")
            << QStringList{QStringLiteral("query"), QStringLiteral("--server"),
                           QStringLiteral("127.0.0.1:%1").arg(closedPort)}
            << QByteArray() << 1 << "cannot reach the alarm server";
        QTest::newRow("update without state")
            << memory + QStringList{QStringLiteral("update"), QStringLiteral("A0000001")}
            << QByteArray() << 2 << "--state is required";
        // The plug-in's trace line about the failed request stays off standard error.
        QTest::newRow("history of an unknown alarm")
            << memory + QStringList{QStringLiteral("history"), QStringLiteral("NOPE")}
            << QByteArray() << 1 << "unknown alarm: NOPE";
        QTest::newRow("mute with an unknown alarm")
            << memory + QStringList{QStringLiteral("mute"), QStringLiteral("NOPE"),
                                    QStringLiteral("A0000002"), QStringLiteral("X1")}
            << QByteArray() << 1 << "unknown alarms: NOPE, X1; nothing muted";
        QTest::newRow("update of an unknown alarm")
            << memory + QStringList{QStringLiteral("update"), QStringLiteral("A0000001"),
                                    QStringLiteral("NOPE"), QStringLiteral("--state"),
                                    QStringLiteral("handled")}
            << QByteArray() << 1 << "unknown alarm: NOPE";
        QTest::newRow("unknown batch key")
            << memory + QStringList{QStringLiteral("batch")}
            << QByteArray("{\"method\":\"QryAlarmList\",\"args\":{\"bogus\":1}}\n") << 2
            << "line 1: args.bogus: unknown key for QryAlarmList";
        QTest::newRow("unknown event class")
            << QStringList{QStringLiteral("query"), QStringLiteral("--event"),
                           QStringLiteral("Bogus")}
            << QByteArray() << 2 << "unknown event class \"Bogus\"";
        QTest::newRow("unknown zone")
            << QStringList{QStringLiteral("query"), QStringLiteral("--tz"),
                           QStringLiteral("Mars/Base")}
            << QByteArray() << 2 << "unknown time zone \"Mars/Base\"";
        QTest::newRow("demo with a database")
            << QStringList{QStringLiteral("demo"), QStringLiteral("--db"), QStringLiteral("x.db")}
            << QByteArray() << 2 << "demo runs its own in-memory server";
    }

    void cliErrorsAreOneLine()
    {
        QFETCH(QStringList, arguments);
        QFETCH(QByteArray, input);
        QFETCH(int, exitCode);
        QFETCH(QString, message);
        QProcess cli;
        cli.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                  QStringList{QStringLiteral("--plugin"), QStringLiteral(ALARMSEARCH_PLUGIN_FILE)} +
                      arguments);
        QVERIFY(cli.waitForStarted());
        cli.write(input);
        cli.closeWriteChannel();
        QVERIFY(cli.waitForFinished(60000));
        QCOMPARE(cli.exitStatus(), QProcess::NormalExit);
        QCOMPARE(cli.exitCode(), exitCode);
        const QString error = QString::fromUtf8(cli.readAllStandardError());
        QCOMPARE(error.count(QLatin1Char('\n')), 1);
        QVERIFY2(error.startsWith(QStringLiteral("alarmsearch: ")), qPrintable(error));
        QVERIFY2(error.contains(message), qPrintable(error));
    }

    void simulatorNamesBadOptions_data()
    {
        QTest::addColumn<QStringList>("arguments");
        QTest::addColumn<int>("exitCode");
        QTest::addColumn<QString>("output"); // the start of stderr, or of stdout on success
        QTest::newRow("version") << QStringList{QStringLiteral("--version")} << 0
                                 << "alarmsearch-sim 1.0.0\n";
        QTest::newRow("unknown option") << QStringList{QStringLiteral("--bogus")} << 2
                                        << "alarmsearch-sim: Unknown option 'bogus'.; see";
        QTest::newRow("bad port") << QStringList{QStringLiteral("--port"), QStringLiteral("99999")}
                                  << 2 << "alarmsearch-sim: --port needs a number from 0 to 65535";
        QTest::newRow("stray argument") << QStringList{QStringLiteral("now")} << 2
                                        << "alarmsearch-sim: unexpected argument \"now\"";
    }

    void simulatorNamesBadOptions()
    {
        QFETCH(QStringList, arguments);
        QFETCH(int, exitCode);
        QFETCH(QString, output);
        QProcess simulator;
        simulator.start(QStringLiteral(ALARMSEARCH_SIM_EXE), arguments);
        QVERIFY(simulator.waitForFinished(10000));
        QCOMPARE(simulator.exitCode(), exitCode);
        const QString text = QString::fromUtf8(exitCode == 0 ? simulator.readAllStandardOutput()
                                                             : simulator.readAllStandardError());
        QVERIFY2(text.startsWith(output), qPrintable(text));
        QCOMPARE(text.count(QLatin1Char('\n')), 1);
    }

    // The command-line client end to end on one database of more alarms than a search returns.
    void cliCommandsKeepTheirWord()
    {
        QTemporaryDir dir;
        const QString db = dir.filePath(QStringLiteral("alarms.sqlite"));
        const auto run = [&](const QStringList& arguments, QByteArray* err = nullptr) {
            QProcess cli;
            cli.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                      QStringList{QStringLiteral("--plugin"),
                                  QStringLiteral(ALARMSEARCH_PLUGIN_FILE), QStringLiteral("--db"),
                                  db, QStringLiteral("--seed-count"), QStringLiteral("5100")} +
                          arguments);
            cli.closeWriteChannel();
            // Generous: sanitizer builds on a busy machine are many times slower.
            if (!cli.waitForFinished(600000) || cli.exitCode() != 0)
                qFatal("%s failed (exit code %d): %s", qPrintable(arguments.join(u' ')),
                       cli.exitCode(), cli.readAllStandardError().constData());
            if (err)
                *err = cli.readAllStandardError();
            return cli.readAllStandardOutput();
        };
        QByteArray err;
        QCOMPARE(run({QStringLiteral("--version")}), QByteArray("alarmsearch 1.0.0\n"));
        // Help anywhere runs nothing; the first real use seeds the database and says so.
        QVERIFY(
            run({QStringLiteral("update"), QStringLiteral("A0000001"), QStringLiteral("--state"),
                 QStringLiteral("FalseAlarm"), QStringLiteral("--help-all")})
                .startsWith("Usage: alarmsearch update"));
        QVERIFY(run({QStringLiteral("--help-all")}).startsWith("Usage: alarmsearch"));
        QVERIFY(!QFile::exists(db));
        const QJsonObject capped =
            QJsonDocument::fromJson(
                run({QStringLiteral("query"), QStringLiteral("--format"), QStringLiteral("json")},
                    &err))
                .object();
        QVERIFY2(err.startsWith("created the database " + db.toUtf8()), err.constData());
        QCOMPARE(capped.value(QLatin1String("truncated")).toBool(), true);
        QCOMPARE(capped.value(QLatin1String("result"))
                     .toObject()
                     .value(ARG_QUERY_RESULT)
                     .toArray()
                     .size(),
                 AlarmPager::kMaxRecords);

        const QList<QByteArray> lines = run({QStringLiteral("query"), QStringLiteral("--all"),
                                             QStringLiteral("--format"), QStringLiteral("jsonl")})
                                            .split('\n');
        QCOMPARE(lines.size(), 5100 + 1);
        QCOMPARE(
            QJsonDocument::fromJson(lines[0]).object().value(QLatin1String("AlarmID")).toString(),
            QStringLiteral("A0005100"));

        // The export walks the whole range by default and appears only when complete.
        const QString csv = dir.filePath(QStringLiteral("all.csv"));
        run({QStringLiteral("export"), QStringLiteral("--bom"), QStringLiteral("-o"), csv}, &err);
        QCOMPARE(err, QByteArray("exported 5100 alarm(s)\n"));
        QFile file(csv);
        QVERIFY(file.open(QIODevice::ReadOnly));
        const QByteArray bytes = file.readAll();
        QVERIFY(bytes.startsWith("\xEF\xBB\xBF"
                                 "AlarmID,"));
        QSet<QByteArray> ids;
        for (const QByteArray& row : bytes.split('\n'))
            ids.insert(row.left(8));
        QVERIFY(ids.contains("A0000001") && ids.contains("A0005100"));
        // No temporary file is left beside it.
        QCOMPARE(QDir(dir.path()).entryList(QDir::Files),
                 QStringList({QStringLiteral("alarms.sqlite"), QStringLiteral("all.csv")}));

        QVERIFY(run({QStringLiteral("classes")}).contains("camera    CamEvent: DI, DO, Motion,"));
    }

    void cliBatchAnswersEachLine()
    {
        QProcess cli;
        cli.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                  {QStringLiteral("--plugin"), QStringLiteral(ALARMSEARCH_PLUGIN_FILE),
                   QStringLiteral("--memory"), QStringLiteral("--seed-count"), QStringLiteral("50"),
                   QStringLiteral("batch"), QStringLiteral("--events")});
        QVERIFY(cli.waitForStarted());
        cli.write("{\"method\":\"QryUnhandledAlarm\",\"args\":{\"stateFilter\":"
                  "\"<AlarmStateList><State>Unhandled</State></AlarmStateList>\"}}\n"
                  "\n"
                  "{\"method\":\"UpdateAlarm\",\"args\":{\"alarmIdList\":[\"A0000001\"],"
                  "\"alarmStatus\":\"Handled\"}}\n"
                  "{\"method\":\"MuteAlarm\",\"args\":{\"alarmIdList\":[\"A0000001\"],"
                  "\"isMute\":true,\"muteTimeSecond\":60}}\n"
                  "{\"method\":\"GetAlarmHistory\",\"args\":{\"alarmId\":\"A0000001\"}}\n");
        cli.closeWriteChannel();
        QVERIFY(cli.waitForFinished(60000));
        QCOMPARE(cli.exitCode(), 0);
        QList<QJsonObject> lines;
        for (const QByteArray& line : cli.readAllStandardOutput().split('\n')) {
            if (!line.isEmpty())
                lines.append(QJsonDocument::fromJson(line).object());
        }
        QCOMPARE(lines.size(), 5);
        QCOMPARE(lines[0].value(QLatin1String("method")).toString(), METHOD_QUERY_UNHANDLED_ALARM);
        QVERIFY(!lines[0]
                     .value(QLatin1String("result"))
                     .toObject()
                     .value(ARG_QUERY_RESULT)
                     .toArray()
                     .isEmpty());
        QCOMPARE(lines[1].value(QLatin1String("event")).toString(), EVENT_ALARM_UPDATED);
        QCOMPARE(lines[2].value(QLatin1String("method")).toString(), METHOD_UPDATE_ALARM);
        QCOMPARE(lines[2].value(QLatin1String("resultCode")).toString(), QStringLiteral("0"));
        QCOMPARE(lines[3].value(QLatin1String("sent")).toBool(), true);
        const QJsonArray history = lines[4].value(QLatin1String("result")).toArray();
        QCOMPARE(history.last().toObject().value(QLatin1String("State")).toString(),
                 QStringLiteral("Handled"));
    }
};

QTEST_GUILESS_MAIN(TestIntegration)
#include "tst_integration.moc"
