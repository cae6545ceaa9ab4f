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

#include <tuple>

using namespace Qt::StringLiterals;

namespace {

const QString kAliceToken = u"alice-token-0123456789"_s;
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
        if (!arguments.contains(u"--server"_s))
            arguments << u"--memory"_s << u"--seed-count"_s << u"50"_s;
        m_process.setArguments(QStringList{u"serve"_s, u"--listen"_s, u"127.0.0.1:0"_s} +
                               arguments);
        m_process.setProcessChannelMode(QProcess::ForwardedErrorChannel);
        m_process.start();
        while (!m_process.canReadLine() && m_process.waitForReadyRead(60000)) {
        }
        const QString line = QString::fromUtf8(m_process.readLine()).trimmed();
        if (line.startsWith("listening on "_L1))
            url = QUrl(line.mid(13));
    }
    ~Server() { stop(); }
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
        url.setScheme(u"ws"_s);
        url.setPath(ApiRoutes::kEventsPath);
        QNetworkRequest request(url);
        if (!origin.isEmpty())
            request.setRawHeader("Origin", origin.toUtf8());
        connect(&socket, &QWebSocket::connected, this, [this, token] {
            socket.sendTextMessage(u"{\"type\":\"hello\",\"token\":\"%1\"}"_s.arg(token));
        });
        connect(&socket, &QWebSocket::textMessageReceived, this, [this](const QString& text) {
            messages.append(QJsonDocument::fromJson(text.toUtf8()).object());
        });
        socket.open(request);
    }
    QWebSocket socket;
    QList<QJsonObject> messages;
};

// Runs the command-line client to its end: its exit code, standard output and standard error.
std::tuple<int, QByteArray, QByteArray> cli(const QStringList& arguments)
{
    QProcess process;
    process.start(QStringLiteral(ALARMSEARCH_CLI_EXE), arguments);
    process.closeWriteChannel();
    if (!process.waitForFinished(60000) || process.exitStatus() != QProcess::NormalExit)
        return {-1, {}, {}};
    return {process.exitCode(), process.readAllStandardOutput(), process.readAllStandardError()};
}

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
        // "VERB /path", and the path's end after /api/v1/alarms/ where it has no slash. The console
        // test uses the other routes.
        const auto row = [](const char* name, const char* route, const char* body, int status,
                            const char* field) {
            QString path = QString::fromLatin1(route).section(u' ', 1);
            if (!path.startsWith(u'/'))
                path.prepend(u"/api/v1/alarms/"_s);
            QTest::newRow(name) << QByteArray(route).split(' ').first() << path << QByteArray(body)
                                << status << QString::fromLatin1(field);
        };
        row("history export", "GET /api/v1/alarms/A0000001/history/export", "", 200, "entries");
        row("mute", "POST mute", R"({"ids":["A0000002"],"seconds":60})", 202, "sent");
        row("unmute", "POST unmute", R"({"ids":["A0000002"]})", 202, "sent");
        row("events without upgrade", "GET /api/v1/events", "", 426, "error");
        row("unknown field", "POST search", R"({"colour":"red"})", 400, "colour");
        row("wrong type", "POST search", R"({"states":"Handled"})", 400, "states");
        row("bad item", "POST search", R"({"events":["CamEvent:Motion",":x"]})", 400, "events[1]");
        row("bad time", "POST search", R"({"to":"yesterday"})", 400, "to");
        row("states on unhandled", "POST unhandled", R"({"states":["Handled"]})", 400, "states");
        row("not JSON", "POST search", "{", 400, "body");
        row("missing ids", "POST update", R"({"state":"Handled"})", 400, "ids");
        row("bad seconds", "POST mute", R"({"ids":["A1"],"seconds":1.5})", 400, "seconds");
        row("unknown route", "GET /api/v1/nothing", "", 404, "path");
        row("wrong verb", "GET search", "", 404, "path");
        QTest::newRow("too large") << QByteArray("POST") << u"/api/v1/alarms/search"_s
                                   << QByteArray(70 * 1024, ' ') << 413 << u"body"_s;
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
            QCOMPARE(reply.body.value("field"_L1).toString(), field);
        else
            QVERIFY2(reply.body.contains(field), json(reply.body).constData());
    }

    void plainJson()
    {
        const Reply reply =
            request(m_server->url, "POST", u"/api/v1/alarms/search"_s, R"({"from":"2000-01-01"})");
        const QJsonArray alarms = reply.body.value("alarms"_L1).toArray();
        QCOMPARE(alarms.size(), 50);
        QCOMPARE(reply.body.value("truncated"_L1), QJsonValue(false));
        QCOMPARE(reply.body.value("next"_L1), QJsonValue(QJsonValue::Null));
        const QJsonObject alarm = alarms.first().toObject();
        QVERIFY(alarm.value("Muted"_L1).isBool());
        QVERIFY(!alarm.contains("XML"_L1));
        QVERIFY(QRegularExpression(u"^\\d{4}-\\d\\d-\\d\\dT\\d\\d:\\d\\d:\\d\\dZ$"_s)
                    .match(alarm.value("ServerTime"_L1).toString())
                    .hasMatch());
    }

    // Every documented route exists on the server, and every route of the server is documented.
    void openApiMatchesRoutes()
    {
        const Reply reply = request(m_server->url, "GET", ApiRoutes::kOpenApiPath);
        QCOMPARE(reply.body.value("openapi"_L1).toString().left(2), u"3."_s);
        QSet<QString> documented;
        const QJsonObject paths = reply.body.value("paths"_L1).toObject();
        for (auto path = paths.begin(); path != paths.end(); ++path) {
            const QJsonObject operations = path.value().toObject();
            for (auto op = operations.begin(); op != operations.end(); ++op) {
                documented.insert(op.key() + QLatin1Char(' ') + path.key());
                QString concrete = path.key();
                concrete.replace("{alarmId}"_L1, "A0000003"_L1);
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

    // With a users file, tokens name the operators (the browser test sees the name in a history);
    // without a known token, nothing but the API description is served; a browser from elsewhere
    // is refused.
    void tokensNameOperators()
    {
        QTemporaryFile users;
        QVERIFY(users.open());
        users.write(
            json({{"users", QJsonArray{QJsonObject{{"name", "alice"}, {"token", kAliceToken}}}}}));
        users.close();
        Server server({u"--users"_s, users.fileName()});
        QVERIFY(server.url.isValid());
        QCOMPARE(request(server.url, "GET", u"/api/v1/me"_s).status, 401);
        QCOMPARE(request(server.url, "GET", u"/api/v1/me"_s, {}, u"wrong-token-0123456"_s).status,
                 401);
        QCOMPARE(request(server.url, "GET", ApiRoutes::kOpenApiPath).status, 200);
        Events refused(server.url, u"wrong-token-0123456"_s);
        Events accepted(server.url, kAliceToken);
        Events stranger(server.url, kAliceToken, u"http://evil.example"_s);
        QTRY_COMPARE_WITH_TIMEOUT(int(refused.socket.closeCode()), 4401, kWaitMs);
        QTRY_COMPARE_WITH_TIMEOUT(int(stranger.socket.closeCode()), 4403, kWaitMs);
        QTRY_COMPARE_WITH_TIMEOUT(accepted.messages.size(), 1, kWaitMs);
        QCOMPARE(accepted.messages.first().value("user"_L1).toString(), u"alice"_s);
    }

    // The alarm server failing: the plug-in's result code comes back with 502.
    void serverFailureIs502()
    {
        QProcess simulator;
        simulator.start(QStringLiteral(ALARMSEARCH_SIM_EXE),
                        {u"--memory"_s, u"--seed-count"_s, u"10"_s, u"--port"_s, u"0"_s});
        QVERIFY(simulator.waitForReadyRead(60000));
        const QString address = QString::fromUtf8(simulator.readLine()).trimmed().mid(13);
        Server server({u"--server"_s, address});
        QVERIFY(server.url.isValid());
        simulator.kill();
        simulator.waitForFinished();
        const Reply reply = request(server.url, "GET", u"/api/v1/alarms/A0000001/history"_s);
        QCOMPARE(reply.status, 502);
        QCOMPARE(reply.body.value("resultCode"_L1).toString(), u"-1"_s);
    }

    // `events --host` in one process sees the change `update --host` makes in another.
    void cliAgainstServe()
    {
        const QString host = m_server->url.toString();
        QProcess events;
        events.start(QStringLiteral(ALARMSEARCH_CLI_EXE),
                     {u"events"_s, u"--host"_s, host, u"--count"_s, u"1"_s});
        events.setReadChannel(QProcess::StandardError);
        QVERIFY(events.waitForReadyRead(60000)); // its note that it waits: it is subscribed
        events.setReadChannel(QProcess::StandardOutput);
        const auto [updated, printed, ignored] =
            cli({u"update"_s, u"A0000006"_s, u"--state"_s, u"handled"_s, u"--note"_s,
                 u"from the CLI"_s, u"--host"_s, host});
        QCOMPARE(updated, 0);
        const QList<QByteArray> lines = printed.trimmed().split('\n');
        QCOMPARE(lines.size(), 2); // the event, then the answer
        QCOMPARE(QJsonDocument::fromJson(lines.last()).object().value("type"_L1).toString(),
                 u"answer"_s);

        QVERIFY(events.waitForFinished(60000));
        const QJsonObject event = QJsonDocument::fromJson(events.readAllStandardOutput()).object();
        QCOMPARE(event.value("data"_L1).toObject().value("alarmUpdatedResults"_L1).toArray(),
                 (QJsonArray{QJsonObject{
                     {"alarmId", "A0000006"}, {"alarmStatus", "Handled"}, {"updateResult", 0}}}));

        const QJsonObject last =
            QJsonDocument::fromJson(
                std::get<1>(cli({u"history"_s, u"A0000006"_s, u"--host"_s, host})))
                .object()
                .value("result"_L1)
                .toArray()
                .last()
                .toObject();
        QCOMPARE(last.value("User"_L1).toString() + u'|' + last.value("Note"_L1).toString(),
                 u"local|from the CLI"_s);

        // An unknown alarm is named, and the command fails, as without --host (it crashed).
        for (const QString& command : {u"history NOPE"_s, u"mute NOPE A0000001"_s}) {
            const auto [code, out, err] = cli(command.split(u' ') + QStringList{u"--host"_s, host});
            QCOMPARE(code, 1);
            QVERIFY(err.contains("unknown alarm: NOPE"));
        }
    }

private:
    std::unique_ptr<Server> m_server;
};

QTEST_MAIN(TestServe)
#include "tst_serve.moc"
