#include <AlarmPager.h>
#include <AlarmSearchLimits.h>
#include <AnswerFormat.h>
#include <HostSession.h>
#include <HostTunnelClient.h>
#include <ReferenceHost.h>
#include <TcpFrame.h>

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QJsonArray>
#include <QJsonObject>
#include <QMutex>
#include <QProcess>
#include <QTcpServer>
#include <QTcpSocket>
#include <QtTest>

#include <memory>

using namespace PluginAlarmSearchCommon;
using namespace Qt::StringLiterals;

namespace {

const int kSeedCount = 300;
const int kTimeoutMs = 30000;

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

// Runs a program to its end: exit code, standard output and standard error.
struct Run
{
    int exitCode = -1;
    QByteArray out;
    QByteArray err;
};

Run run(const QString& program, const QStringList& arguments, const QByteArray& input = {})
{
    QProcess process;
    process.start(program, arguments);
    process.write(input);
    process.closeWriteChannel();
    // Generous: sanitizer builds on a busy machine are many times slower.
    if (!process.waitForFinished(600000) || process.exitStatus() != QProcess::NormalExit)
        return {};
    return {process.exitCode(), process.readAllStandardOutput(), process.readAllStandardError()};
}

Run cli(const QStringList& arguments, const QByteArray& input = {})
{
    return run(QStringLiteral(ALARMSEARCH_CLI_EXE),
               QStringList{u"--plugin"_s, QStringLiteral(ALARMSEARCH_PLUGIN_FILE)} + arguments,
               input);
}

QStringList words(const QString& text)
{
    return text.split(u' ', Qt::SkipEmptyParts);
}

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
            u"%1exec \"$0\" --memory --port 0 --seed-count %2"_s
                .arg(maxFiles > 0 ? u"ulimit -n %1 && "_s.arg(maxFiles) : QString())
                .arg(seedCount);
        m_simulator->start(u"/bin/sh"_s, {u"-c"_s, command, QStringLiteral(ALARMSEARCH_SIM_EXE)});
        while (!m_simulator->canReadLine() && m_simulator->waitForReadyRead(10000)) {
        }
        return QString::fromUtf8(m_simulator->readLine()).trimmed().section(u' ', -1);
    }

    HostSession& openHost(const QString& transport)
    {
        ReferenceHost::Options options;
        options.pluginPath = QStringLiteral(ALARMSEARCH_PLUGIN_FILE);
        options.embedded.databasePath = u":memory:"_s;
        options.embedded.seedCount = kSeedCount;
        options.embedded.seedEnd = QDateTime(QDate(2026, 11, 20), QTime(12, 0), QTimeZone::utc());
        if (transport == "tcp"_L1)
            options.serverAddress = startSimulator(kSeedCount);
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
        if (answer.resultCode != "0"_L1)
            qFatal("search failed: %s", qPrintable(answer.resultCode));
        return AnswerFormat::alarms(answer, true);
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

    // The real plug-in through the host against the simulated server, in process and over TCP:
    // each kind of filter the plug-in writes is one the server understands; an update reaches
    // the history and every subscriber.
    void throughThePlugin_data()
    {
        QTest::addColumn<QString>("transport");
        QTest::newRow("embedded") << u"embedded"_s;
        QTest::newRow("tcp") << u"tcp"_s;
    }
    void throughThePlugin()
    {
        QFETCH(QString, transport);
        HostSession& session = openHost(transport);
        const QVariantList all = search(QVariantMap());
        QCOMPARE(all.size(), kSeedCount);
        const QString xml = field(all[0], "XML").trimmed();
        QVERIFY(xml.startsWith(u"<Alarm>"_s) && xml.contains(field(all[0], "AlarmID")));

        // A sub-event, and the unhandled alarms by their own method.
        const auto wanted = [&all](const char* name, const QString& value) {
            QVariantList out;
            std::copy_if(all.begin(), all.end(), std::back_inserter(out),
                         [&](const QVariant& a) { return field(a, name) == value; });
            return out.isEmpty() ? QStringList{u"none"_s} : ids(out);
        };
        const QString motion = u"<Event CameraEvent=\"Motion\">CamEvent</Event>"_s;
        QCOMPARE(ids(search({{ARG_TRIGGER_EVENT_FILTER, motion}})),
                 wanted("SubEvent", u"Motion"_s));
        QCOMPARE(ids(search({{ARG_STATE_FILTER, u"<AlarmStateList><State>Unhandled</State>"
                                                "</AlarmStateList>"_s}},
                            METHOD_QUERY_UNHANDLED_ALARM)),
                 wanted("State", u"Unhandled"_s));

        QMutex mutex;
        QStringList events; // "subscription event data as JSON"
        for (const QString& key : {u"first"_s, u"second"_s, u"gone"_s}) {
            session.subscribe(
                key, EVENT_ALARM_UPDATED, [&, key](const PluginObjBase_EventSignalInfo& info) {
                    QMutexLocker locker(&mutex);
                    events.append(key + u' ' + info.eventName + u' ' +
                                  QString::fromUtf8(QJsonDocument::fromVariant(info.eventData)
                                                        .toJson(QJsonDocument::Compact)));
                });
        }
        session.unsubscribe(u"gone"_s);
        const QString note = u"Cat & dog <again>"_s;
        const PluginAnswer answer =
            call(METHOD_UPDATE_ALARM, {{ARG_ALARM_ID_LIST, words(u"A0000002 A0000001 A9999999"_s)},
                                       {ARG_ALARM_STATUS, u"FalseAlarm"_s},
                                       {ARG_ALARM_COMMENT, note},
                                       {ARG_RELAY_PATH, u"relay/7"_s}});
        QVERIFY(answer.isLast);
        QCOMPARE(answer.resultCode, u"0"_s);
        const auto result = [](const char* id, const char* code) {
            return uR"({"alarmId":"%1","alarmStatus":"FalseAlarm","updateResult":"%2"})"_s.arg(
                QLatin1String(id), QLatin1String(code));
        };
        const QString data =
            uR"( AlarmUpdated {"alarmUpdatedResults":[%1,%2,%3],"relayPath":"relay/7"})"_s.arg(
                result("A0000002", "0"), result("A0000001", "0"), result("A9999999", "1"));
        events.sort();
        QCOMPARE(events, (QStringList{u"first"_s + data, u"second"_s + data}));
        const PluginAnswer history =
            call(METHOD_GET_ALARM_HISTORY, {{ARG_ALARM_ID, u"A0000001"_s}});
        QCOMPARE(history.resultCode, u"0"_s);
        const QVariant last = history.result.toList().constLast();
        QCOMPARE(field(last, "State") + u' ' + field(last, "Note"), u"FalseAlarm "_s + note);
        QCOMPARE(call(METHOD_GET_ALARM_HISTORY_FOR_EXPORT, {{ARG_ALARM_ID, u"A0000001"_s}}).result,
                 history.result);
    }

    // Out of file descriptors, the simulator spun at full load, dropped its clients and died.
    // Now it keeps serving the clients it has, and accepts again once descriptors are free.
    void simulatorOutOfDescriptors()
    {
        const quint16 port = startSimulator(50, 40).section(u':', -1).toUShort(); // 8 clients
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
            return !replies.isEmpty() && replies.first().value("status").toString() == "0"_L1;
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

    // Errors of both programs: the exit code and one line, naming the program (output: the start
    // of stderr, or all of stdout on success).
    void programErrorsAreOneLine_data()
    {
        QTest::addColumn<QString>("program");
        QTest::addColumn<QStringList>("arguments");
        QTest::addColumn<QByteArray>("input");
        QTest::addColumn<int>("exitCode");
        QTest::addColumn<QString>("output");
        quint16 closedPort = 0;
        {
            QTcpServer probe;
            QVERIFY(probe.listen(QHostAddress::LocalHost));
            closedPort = probe.serverPort();
        }
        // A first word "sim" runs the simulator, one that sets ALARMSEARCH_PLUGIN runs the CLI
        // in that environment.
        const auto row = [](const char* name, const QString& arguments, int exitCode,
                            const QString& output, const QByteArray& input = {}) {
            QStringList argv = words(arguments);
            QString program;
            if (argv.first() == "sim"_L1)
                program = QStringLiteral(ALARMSEARCH_SIM_EXE), argv.removeFirst();
            else if (argv.first().startsWith("ALARMSEARCH_PLUGIN="_L1))
                program = u"/usr/bin/env"_s, argv.insert(1, QStringLiteral(ALARMSEARCH_CLI_EXE));
            QTest::newRow(name) << program << argv << input << exitCode << output;
        };
        const auto plugin = [&row](const char* name, const char* file, const char* why) {
            row(name, u"--plugin %1 query"_s.arg(QLatin1String(file)), 1,
                u"alarmsearch: cannot load plug-in %1: %2"_s.arg(QLatin1String(file),
                                                                 QLatin1String(why)));
        };
        plugin("missing plug-in file", "/nonexistent/libX.so", "no such file");
        plugin("no Qt plug-in", FIXTURE_PlainLibrary, "not a Qt plug-in");
        plugin("other interface", FIXTURE_OtherIidPlugin,
               "interface identifier \"com.example.SomeOtherInterface\"");
        plugin("no PluginID", FIXTURE_NoPluginIdPlugin, "no \"PluginID\"");
        plugin("not an IPluginObjectBase", FIXTURE_PlainObjectPlugin,
               "instance of PlainObjectPlugin is no IPluginObjectBase");
        row("plug-in of the environment", u"ALARMSEARCH_PLUGIN=/nonexistent/libY.so query"_s, 1,
            u"alarmsearch: cannot load plug-in /nonexistent/libY.so: no such file"_s);
        const QString memory = u"--memory --seed-count 20 "_s;
        row("version", u"--version"_s, 0, u"alarmsearch 1.0.0\n"_s);
        row("bad option", u"query --bogus"_s, 2, u"alarmsearch: Unknown option 'bogus'"_s);
        row("unknown command", u"frobnicate"_s, 2, u"alarmsearch: unknown command"_s);
        row("bad time", u"query --from soon"_s, 2, u"alarmsearch: bad time \"soon\""_s);
        row("bad JSON line", memory + u"batch"_s, 2, u"alarmsearch: line 2: bad JSON"_s,
            "{\"method\":\"QryAlarmList\",\"args\":{}}\n{\"method\": oops}\n");
        row("batch line past the bound", memory + u"batch"_s, 2,
            u"alarmsearch: line 1: longer than"_s,
            QByteArray(AlarmSearchLimits::MaxRequestLineBytes + 1, ' ') + '\n');
        row("unknown batch method", memory + u"batch"_s, 2,
            u"alarmsearch: line 1: \"method\" must be"_s, "{\"method\":\"ProcessAlarm\"}\n");
        row("unreachable server", u"query --server 127.0.0.1:%1"_s.arg(closedPort), 1,
            u"alarmsearch: cannot reach the alarm server"_s);
        row("update without state", memory + u"update A0000001"_s, 2,
            u"alarmsearch: --state is required"_s);
        // The plug-in's trace line about the failed request stays off standard error.
        row("history of an unknown alarm", memory + u"history NOPE"_s, 1,
            u"alarmsearch: unknown alarm: NOPE\n"_s);
        row("mute with an unknown alarm", memory + u"mute NOPE A0000002 X1"_s, 1,
            u"alarmsearch: unknown alarms: NOPE, X1; nothing muted\n"_s);
        row("update of an unknown alarm", memory + u"update A0000001 NOPE --state handled"_s, 1,
            u"alarmsearch: unknown alarm: NOPE\n"_s);
        row("unknown zone", u"query --tz Mars/Base"_s, 2,
            u"alarmsearch: unknown time zone \"Mars/Base\""_s);
        row("demo with a database", u"demo --db x.db"_s, 2,
            u"alarmsearch: demo runs its own in-memory server"_s);
        row("serve off loopback", u"serve --memory --listen 0.0.0.0:0"_s, 1,
            u"alarmsearch: 0.0.0.0 is not a loopback address: give a users file (--users)"_s);
        row("simulator version", u"sim --version"_s, 0, u"alarmsearch-sim 1.0.0\n"_s);
        row("simulator option", u"sim --bogus"_s, 2,
            u"alarmsearch-sim: Unknown option 'bogus'.; see"_s);
        row("simulator port", u"sim --port 99999"_s, 2,
            u"alarmsearch-sim: --port needs a number from 0 to 65535"_s);
        row("simulator argument", u"sim now"_s, 2,
            u"alarmsearch-sim: unexpected argument \"now\""_s);
    }
    void programErrorsAreOneLine()
    {
        QFETCH(QString, program);
        QFETCH(QStringList, arguments);
        QFETCH(QByteArray, input);
        QFETCH(int, exitCode);
        QFETCH(QString, output);
        const Run done = program.isEmpty() ? cli(arguments, input) : run(program, arguments);
        QCOMPARE(done.exitCode, exitCode);
        const QString text = QString::fromUtf8(exitCode == 0 ? done.out : done.err);
        QCOMPARE(text.count(u'\n'), 1);
        QVERIFY2(text.startsWith(output), qPrintable(text));
        if (output.contains("cannot load plug-in"_L1))
            QVERIFY(
                text.endsWith("; name the plug-in file with --plugin or ALARMSEARCH_PLUGIN\n"_L1));
    }

    // The command-line client end to end on one database of more alarms than a search returns.
    void cliCommandsKeepTheirWord()
    {
        QTemporaryDir dir;
        const QString db = dir.filePath(u"alarms.sqlite"_s);
        const auto onDb = [&](const QString& arguments) {
            Run done =
                cli(QStringList{u"--db"_s, db, u"--seed-count"_s, u"5100"_s} + words(arguments));
            if (done.exitCode != 0)
                qFatal("%s failed: %s", qPrintable(arguments), done.err.constData());
            return done;
        };
        // Help anywhere runs nothing; the first real use seeds the database and says so.
        QVERIFY(onDb(u"update A0000001 --state FalseAlarm --help-all"_s)
                    .out.startsWith("Usage: alarmsearch update"));
        QVERIFY(onDb(u"--help-all"_s).out.startsWith("Usage: alarmsearch"));
        QVERIFY(!QFile::exists(db));
        const Run capped = onDb(u"query --format json"_s);
        QVERIFY2(capped.err.startsWith("created the database " + db.toUtf8()), capped.err.data());
        const QJsonObject answer = QJsonDocument::fromJson(capped.out).object();
        QCOMPARE(answer.value("truncated"_L1).toBool(), true);
        QCOMPARE(answer.value("result"_L1).toObject().value(ARG_QUERY_RESULT).toArray().size(),
                 AlarmSearchLimits::MaxRecords);

        // Every alarm once; the pager's unit test checks the order and gaps.
        QCOMPARE(onDb(u"query --all --format jsonl"_s).out.count('\n'), 5100);

        // The export walks the whole range by default and appears only when complete.
        const QString csv = dir.filePath(u"all.csv"_s);
        QCOMPARE(onDb(u"export --bom -o "_s + csv).err, QByteArray("exported 5100 alarm(s)\n"));
        QFile file(csv);
        QVERIFY(file.open(QIODevice::ReadOnly));
        // The first and the last alarm are in it.
        const QByteArray bytes = file.readAll();
        QVERIFY(bytes.startsWith("\xEF\xBB\xBF"
                                 "AlarmID,") &&
                bytes.contains("\nA0000001,") && bytes.contains("\nA0005100,"));
        // No temporary file is left beside it.
        QCOMPARE(QDir(dir.path()).entryList(QDir::Files),
                 (QStringList{u"alarms.sqlite"_s, u"all.csv"_s}));

        QVERIFY(onDb(u"classes"_s).out.contains("camera    CamEvent: DI, DO, Motion,"));
    }

    void cliBatchAnswersEachLine()
    {
        const Run done =
            cli(words(u"--memory --seed-count 50 batch --events"_s),
                "{\"method\":\"QryUnhandledAlarm\",\"args\":{\"stateFilter\":"
                "\"<AlarmStateList><State>Unhandled</State></AlarmStateList>\"}}\n"
                "\n"
                "{\"method\":\"UpdateAlarm\",\"args\":{\"alarmIdList\":[\"A0000001\"],"
                "\"alarmStatus\":\"Handled\"}}\n"
                "{\"method\":\"MuteAlarm\",\"args\":{\"alarmIdList\":[\"A0000001\"],"
                "\"isMute\":true,\"muteTimeSecond\":60}}\n"
                "{\"method\":\"GetAlarmHistory\",\"args\":{\"alarmId\":\"A0000001\"}}\n");
        QCOMPARE(done.exitCode, 0);
        const QList<QByteArray> lines = done.out.trimmed().split('\n');
        QCOMPARE(lines.size(), 5);
        const auto at = [&lines](int i) { return QJsonDocument::fromJson(lines[i]).object(); };
        QCOMPARE(at(0)["method"_L1].toString(), METHOD_QUERY_UNHANDLED_ALARM);
        QVERIFY(!at(0)["result"_L1][ARG_QUERY_RESULT].toArray().isEmpty());
        QCOMPARE(at(1)["event"_L1].toString(), EVENT_ALARM_UPDATED);
        QCOMPARE(at(2)["resultCode"_L1].toString(), u"0"_s);
        QCOMPARE(at(3)["sent"_L1].toBool(), true);
        QCOMPARE(at(4)["result"_L1].toArray().last()["State"_L1].toString(), u"Handled"_s);
    }
};

QTEST_GUILESS_MAIN(TestIntegration)
#include "tst_integration.moc"
