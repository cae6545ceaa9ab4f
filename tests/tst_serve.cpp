// `alarmsearch serve` as its clients see it: the real program on an ephemeral loopback port with
// an in-memory simulator, asked over HTTP and WebSocket, and the command-line client against it.
#include <ApiRoutes.h>

#include <QEventLoop>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QProcess>
#include <QRegularExpression>
#include <QSet>
#include <QTemporaryFile>
#include <QTest>
#include <QTimer>
#include <QWebSocket>

namespace {

const QString kAliceToken = QStringLiteral("alice-token-0123456789");
// Generous, for sanitizer builds on a busy machine.
constexpr int kWaitMs = 30000;

struct Reply
{
    int status = 0;
    QJsonObject body;
    QByteArray contentSecurityPolicy;
};

// A running `alarmsearch serve`, stopped with SIGTERM.
class Server
{
public:
    explicit Server(QStringList arguments)
    {
        m_process.setProgram(QStringLiteral(ALARMSEARCH_CLI_EXE));
        if (!arguments.contains(QStringLiteral("--server")))
            arguments << QStringLiteral("--memory") << QStringLiteral("--seed-count")
                      << QStringLiteral("50");
        m_process.setArguments(QStringList{QStringLiteral("serve"), QStringLiteral("--listen"),
                                           QStringLiteral("127.0.0.1:0")} +
                               arguments);
        m_process.setProcessChannelMode(QProcess::ForwardedErrorChannel);
        m_process.start();
        while (!m_process.canReadLine() && m_process.waitForReadyRead(60000)) {
        }
        const QString line = QString::fromUtf8(m_process.readLine()).trimmed();
        if (line.startsWith(QLatin1String("listening on ")))
            url = QUrl(line.mid(13));
    }
    ~Server()
    {
        m_process.terminate();
        m_process.waitForFinished(60000);
    }
    int stop()
    {
        m_process.terminate();
        m_process.waitForFinished(60000);
        return m_process.exitCode();
    }

    QUrl url;

private:
    QProcess m_process;
};

Reply request(const QUrl& base, const QByteArray& verb, const QString& path,
              const QByteArray& body = QByteArray(), const QString& token = QString())
{
    QNetworkAccessManager network;
    QUrl url = base;
    url.setPath(path);
    QNetworkRequest request(url);
    request.setHeader(QNetworkRequest::ContentTypeHeader, QByteArrayLiteral("application/json"));
    if (!token.isEmpty())
        request.setRawHeader("Authorization", "Bearer " + token.toUtf8());
    QNetworkReply* reply = network.sendCustomRequest(request, verb, body);
    QEventLoop loop;
    QObject::connect(reply, &QNetworkReply::finished, &loop, &QEventLoop::quit);
    loop.exec();
    Reply result{reply->attribute(QNetworkRequest::HttpStatusCodeAttribute).toInt(),
                 QJsonDocument::fromJson(reply->readAll()).object(),
                 reply->rawHeader("Content-Security-Policy")};
    delete reply;
    return result;
}

// An event WebSocket: the messages it got, or its close code.
class Events : public QObject
{
public:
    Events(const QUrl& base, const QString& token, const QString& origin = QString())
    {
        QUrl url = base;
        url.setScheme(QStringLiteral("ws"));
        url.setPath(ApiRoutes::kEventsPath);
        QNetworkRequest request(url);
        if (!origin.isEmpty())
            request.setRawHeader("Origin", origin.toUtf8());
        connect(&socket, &QWebSocket::connected, this, [this, token] {
            socket.sendTextMessage(
                QStringLiteral("{\"type\":\"hello\",\"token\":\"%1\"}").arg(token));
        });
        connect(&socket, &QWebSocket::textMessageReceived, this, [this](const QString& text) {
            messages.append(QJsonDocument::fromJson(text.toUtf8()).object());
        });
        socket.open(request);
    }
    QWebSocket socket;
    QList<QJsonObject> messages;
};

QByteArray json(const QJsonObject& object)
{
    return QJsonDocument(object).toJson(QJsonDocument::Compact);
}

} // namespace

class TestServe : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        m_server = std::make_unique<Server>(QStringList());
        QVERIFY(m_server->url.isValid());
    }
    void cleanupTestCase() { QCOMPARE(m_server->stop(), 0); }

    void routes_data()
    {
        QTest::addColumn<QByteArray>("verb");
        QTest::addColumn<QString>("path");
        QTest::addColumn<QByteArray>("body");
        QTest::addColumn<int>("status");
        QTest::addColumn<QString>("field"); // of a 400, or a key the answer has

        const QString search = QStringLiteral("/api/v1/alarms/search");
        QTest::newRow("me") << QByteArray("GET") << "/api/v1/me" << QByteArray() << 200 << "user";
        QTest::newRow("search") << QByteArray("POST") << search
                                << QByteArray(R"({"states":["handled"],"from":"2000-01-01"})")
                                << 200 << "alarms";
        QTest::newRow("unhandled")
            << QByteArray("POST") << "/api/v1/alarms/unhandled"
            << QByteArray(R"({"eventGroups":["camera","system"]})") << 200 << "alarms";
        QTest::newRow("history") << QByteArray("GET") << "/api/v1/alarms/A0000001/history"
                                 << QByteArray() << 200 << "entries";
        QTest::newRow("history export")
            << QByteArray("GET") << "/api/v1/alarms/A0000001/history/export" << QByteArray() << 200
            << "entries";
        QTest::newRow("mute") << QByteArray("POST") << "/api/v1/alarms/mute"
                              << QByteArray(R"({"ids":["A0000002"],"seconds":60})") << 202
                              << "sent";
        QTest::newRow("unmute") << QByteArray("POST") << "/api/v1/alarms/unmute"
                                << QByteArray(R"({"ids":["A0000002"]})") << 202 << "sent";
        QTest::newRow("events without upgrade")
            << QByteArray("GET") << ApiRoutes::kEventsPath << QByteArray() << 426 << "error";
        QTest::newRow("unknown field")
            << QByteArray("POST") << search << QByteArray(R"({"colour":"red"})") << 400 << "colour";
        QTest::newRow("wrong type") << QByteArray("POST") << search
                                    << QByteArray(R"({"states":"Handled"})") << 400 << "states";
        QTest::newRow("bad item") << QByteArray("POST") << search
                                  << QByteArray(R"({"events":["CamEvent:Motion",":x"]})") << 400
                                  << "events[1]";
        QTest::newRow("bad time") << QByteArray("POST") << search
                                  << QByteArray(R"({"to":"yesterday"})") << 400 << "to";
        QTest::newRow("states on unhandled")
            << QByteArray("POST") << "/api/v1/alarms/unhandled"
            << QByteArray(R"({"states":["Handled"]})") << 400 << "states";
        QTest::newRow("not JSON") << QByteArray("POST") << search << QByteArray("{") << 400
                                  << "body";
        QTest::newRow("missing ids") << QByteArray("POST") << "/api/v1/alarms/update"
                                     << QByteArray(R"({"state":"Handled"})") << 400 << "ids";
        QTest::newRow("bad seconds")
            << QByteArray("POST") << "/api/v1/alarms/mute"
            << QByteArray(R"({"ids":["A1"],"seconds":1.5})") << 400 << "seconds";
        QTest::newRow("too large")
            << QByteArray("POST") << search << QByteArray(70 * 1024, ' ') << 413 << "body";
        QTest::newRow("unknown route")
            << QByteArray("GET") << "/api/v1/nothing" << QByteArray() << 404 << "path";
        QTest::newRow("wrong verb") << QByteArray("GET") << search << QByteArray() << 404 << "path";
    }
    void routes()
    {
        QFETCH(QByteArray, verb);
        QFETCH(QString, path);
        QFETCH(QByteArray, body);
        QFETCH(int, status);
        QFETCH(QString, field);
        const Reply reply = request(m_server->url, verb, path, body);
        QCOMPARE(reply.status, status);
        // Every answer, also one past the routes, keeps a browser from running inline scripts.
        QVERIFY(reply.contentSecurityPolicy.contains("script-src 'self'"));
        if (status == 400 || status == 413)
            QCOMPARE(reply.body.value(QLatin1String("field")).toString(), field);
        else
            QVERIFY2(reply.body.contains(field), json(reply.body).constData());
    }

    void plainJson()
    {
        const Reply reply = request(m_server->url, "POST", QStringLiteral("/api/v1/alarms/search"),
                                    R"({"from":"2000-01-01"})");
        const QJsonArray alarms = reply.body.value(QLatin1String("alarms")).toArray();
        QCOMPARE(alarms.size(), 50);
        QCOMPARE(reply.body.value(QLatin1String("truncated")), QJsonValue(false));
        QCOMPARE(reply.body.value(QLatin1String("next")), QJsonValue(QJsonValue::Null));
        const QJsonObject alarm = alarms.first().toObject();
        QVERIFY(alarm.value(QLatin1String("Muted")).isBool());
        QVERIFY(!alarm.contains(QLatin1String("XML")));
        QVERIFY(QRegularExpression(QStringLiteral("^\\d{4}-\\d\\d-\\d\\dT\\d\\d:\\d\\d:\\d\\dZ$"))
                    .match(alarm.value(QLatin1String("ServerTime")).toString())
                    .hasMatch());
    }

    // Every documented route exists on the server, and every route of the server is documented.
    void openApiMatchesRoutes()
    {
        const Reply reply = request(m_server->url, "GET", ApiRoutes::kOpenApiPath);
        QCOMPARE(reply.body.value(QLatin1String("openapi")).toString().left(2),
                 QStringLiteral("3."));
        QSet<QString> documented;
        const QJsonObject paths = reply.body.value(QLatin1String("paths")).toObject();
        for (auto path = paths.begin(); path != paths.end(); ++path) {
            const QJsonObject operations = path.value().toObject();
            for (auto op = operations.begin(); op != operations.end(); ++op) {
                documented.insert(op.key() + QLatin1Char(' ') + path.key());
                QString concrete = path.key();
                concrete.replace(QLatin1String("{alarmId}"), QLatin1String("A0000003"));
                const int status =
                    request(m_server->url, op.key().toUpper().toLatin1(), concrete, "{}").status;
                QVERIFY2(status != 404 && status != 0, qPrintable(path.key()));
            }
        }
        QSet<QString> routed;
        for (const ApiRoutes::Route& route : ApiRoutes::all())
            routed.insert(ApiRoutes::verbName(route.verb) + QLatin1Char(' ') + route.path);
        QCOMPARE(documented, routed);
    }

    // An update reaches every subscriber, and a browser from elsewhere is refused.
    void eventsReachEverySubscriber()
    {
        Events first(m_server->url, QString());
        Events second(m_server->url, QString());
        Events stranger(m_server->url, QString(), QStringLiteral("http://evil.example"));
        QTRY_COMPARE_WITH_TIMEOUT(first.messages.size(), 1, kWaitMs);
        QTRY_COMPARE_WITH_TIMEOUT(second.messages.size(), 1, kWaitMs);
        QTRY_COMPARE_WITH_TIMEOUT(int(stranger.socket.closeCode()), 4403, kWaitMs);
        QCOMPARE(first.messages.first().value(QLatin1String("type")).toString(),
                 QStringLiteral("subscribed"));

        const Reply update = request(m_server->url, "POST", QStringLiteral("/api/v1/alarms/update"),
                                     R"({"ids":["A0000004","A9999999"],"state":"Processing"})");
        QCOMPARE(update.status, 200);
        const QJsonArray results{
            QJsonObject{
                {"alarmId", "A0000004"}, {"alarmStatus", "Processing"}, {"updateResult", 0}},
            QJsonObject{
                {"alarmId", "A9999999"}, {"alarmStatus", "Processing"}, {"updateResult", 1}}};
        QCOMPARE(update.body.value(QLatin1String("results")).toArray(), results);
        for (Events* events : {&first, &second}) {
            QTRY_COMPARE_WITH_TIMEOUT(events->messages.size(), 2, kWaitMs);
            const QJsonObject event = events->messages.last();
            QCOMPARE(event.value(QLatin1String("type")).toString(), QStringLiteral("event"));
            QCOMPARE(event.value(QLatin1String("data"))
                         .toObject()
                         .value(QLatin1String("alarmUpdatedResults"))
                         .toArray(),
                     results);
        }
    }

    // With a users file, tokens name the operators, and the history shows who changed what.
    void tokensNameOperators()
    {
        QTemporaryFile users;
        QVERIFY(users.open());
        users.write(
            json({{"users", QJsonArray{QJsonObject{{"name", "alice"}, {"token", kAliceToken}}}}}));
        users.close();
        Server server({QStringLiteral("--users"), users.fileName()});
        QVERIFY(server.url.isValid());
        QCOMPARE(request(server.url, "GET", QStringLiteral("/api/v1/me")).status, 401);
        QCOMPARE(request(server.url, "GET", QStringLiteral("/api/v1/me"), {},
                         QStringLiteral("wrong-token-0123456"))
                     .status,
                 401);
        QCOMPARE(request(server.url, "GET", ApiRoutes::kOpenApiPath).status, 200);
        QCOMPARE(request(server.url, "POST", QStringLiteral("/api/v1/alarms/update"),
                         R"({"ids":["A0000005"],"state":"Handled","note":"seen"})", kAliceToken)
                     .status,
                 200);
        const QJsonArray entries =
            request(server.url, "GET", QStringLiteral("/api/v1/alarms/A0000005/history"), {},
                    kAliceToken)
                .body.value(QLatin1String("entries"))
                .toArray();
        QCOMPARE(entries.last().toObject().value(QLatin1String("User")).toString(),
                 QStringLiteral("alice"));

        Events refused(server.url, QStringLiteral("wrong-token-0123456"));
        Events accepted(server.url, kAliceToken);
        QTRY_COMPARE_WITH_TIMEOUT(int(refused.socket.closeCode()), 4401, kWaitMs);
        QTRY_COMPARE_WITH_TIMEOUT(accepted.messages.size(), 1, kWaitMs);
        QCOMPARE(accepted.messages.first().value(QLatin1String("user")).toString(),
                 QStringLiteral("alice"));
    }

    void nonLoopbackNeedsUsers()
    {
        QProcess serve;
        serve.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                    {QStringLiteral("serve"), QStringLiteral("--memory"),
                     QStringLiteral("--listen"), QStringLiteral("0.0.0.0:0")});
        QVERIFY(serve.waitForFinished(60000));
        QCOMPARE(serve.exitCode(), 1);
        QVERIFY(serve.readAllStandardError().contains("loopback"));
    }

    // The alarm server failing: the plug-in's result code comes back with 502.
    void serverFailureIs502()
    {
        QProcess simulator;
        simulator.start(QStringLiteral(ALARMSEARCH_SIM_EXE),
                        {QStringLiteral("--memory"), QStringLiteral("--seed-count"),
                         QStringLiteral("10"), QStringLiteral("--port"), QStringLiteral("0")});
        QVERIFY(simulator.waitForReadyRead(60000));
        const QString address = QString::fromUtf8(simulator.readLine()).trimmed().mid(13);
        Server server({QStringLiteral("--server"), address});
        QVERIFY(server.url.isValid());
        simulator.kill();
        simulator.waitForFinished();
        const Reply reply =
            request(server.url, "GET", QStringLiteral("/api/v1/alarms/A0000001/history"));
        QCOMPARE(reply.status, 502);
        QCOMPARE(reply.body.value(QLatin1String("resultCode")).toString(), QStringLiteral("-1"));
    }

    // `events --host` in one process sees the change `update --host` makes in another.
    void cliAgainstServe()
    {
        const QString host = m_server->url.toString();
        QProcess events;
        events.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                     {QStringLiteral("events"), QStringLiteral("--host"), host,
                      QStringLiteral("--count"), QStringLiteral("1")});
        events.setReadChannel(QProcess::StandardError);
        QVERIFY(events.waitForReadyRead(60000)); // its note that it waits: it is subscribed
        events.setReadChannel(QProcess::StandardOutput);
        QProcess update;
        update.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                     {QStringLiteral("update"), QStringLiteral("A0000006"),
                      QStringLiteral("--state"), QStringLiteral("handled"),
                      QStringLiteral("--note"), QStringLiteral("from the CLI"),
                      QStringLiteral("--host"), host});
        QVERIFY(update.waitForFinished(60000));
        QCOMPARE(update.exitCode(), 0);
        const QList<QByteArray> printed = update.readAllStandardOutput().trimmed().split('\n');
        QCOMPARE(printed.size(), 2); // the event, then the answer
        QCOMPARE(QJsonDocument::fromJson(printed.last())
                     .object()
                     .value(QLatin1String("type"))
                     .toString(),
                 QStringLiteral("answer"));

        QVERIFY(events.waitForFinished(60000));
        const QJsonObject event = QJsonDocument::fromJson(events.readAllStandardOutput()).object();
        QCOMPARE(event.value(QLatin1String("data"))
                     .toObject()
                     .value(QLatin1String("alarmUpdatedResults"))
                     .toArray(),
                 (QJsonArray{QJsonObject{
                     {"alarmId", "A0000006"}, {"alarmStatus", "Handled"}, {"updateResult", 0}}}));

        QProcess history;
        history.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                      {QStringLiteral("history"), QStringLiteral("A0000006"),
                       QStringLiteral("--host"), host});
        QVERIFY(history.waitForFinished(60000));
        const QJsonArray entries = QJsonDocument::fromJson(history.readAllStandardOutput())
                                       .object()
                                       .value(QLatin1String("result"))
                                       .toArray();
        QCOMPARE(entries.last().toObject().value(QLatin1String("User")).toString(),
                 QStringLiteral("local"));
        QCOMPARE(entries.last().toObject().value(QLatin1String("Note")).toString(),
                 QStringLiteral("from the CLI"));
    }

    // An unknown alarm is named, and the command fails, as without --host.
    void cliNamesUnknownAlarms_data()
    {
        QTest::addColumn<QStringList>("arguments");
        QTest::newRow("history") << QStringList{QStringLiteral("history"), QStringLiteral("NOPE")};
        QTest::newRow("mute") << QStringList{QStringLiteral("mute"), QStringLiteral("NOPE"),
                                             QStringLiteral("A0000001")};
    }

    void cliNamesUnknownAlarms()
    {
        QFETCH(QStringList, arguments);
        QProcess cli;
        cli.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                  arguments + QStringList{QStringLiteral("--host"), m_server->url.toString()});
        QVERIFY(cli.waitForFinished(60000));
        QCOMPARE(cli.exitStatus(), QProcess::NormalExit);
        QCOMPARE(cli.exitCode(), 1);
        QVERIFY(cli.readAllStandardError().contains("unknown alarm: NOPE"));
    }

private:
    std::unique_ptr<Server> m_server;
};

QTEST_MAIN(TestServe)
#include "tst_serve.moc"
