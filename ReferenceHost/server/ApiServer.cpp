#include "ApiServer.h"

#include "ApiRequest.h"
#include "ConsolePages.h"
#include "EventSocket.h"
#include "GuardedTcpServer.h"

#include <AlarmFields.h>
#include <AlarmPager.h>
#include <AlarmSearchLimits.h>
#include <HostSession.h>
#include <HostTunnelClient.h>
#include <PlainJson.h>
#include <ReferenceHost.h>

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QCoreApplication>
#include <QElapsedTimer>
#include <QHttpServer>
#include <QJsonArray>
#include <QJsonDocument>
#include <QSet>
#include <QWebSocket>
#include <QtConcurrent/QtConcurrentRun>

#if QT_VERSION >= QT_VERSION_CHECK(6, 8, 0)
#include <QHttpServerWebSocketUpgradeResponse>
#endif

Q_LOGGING_CATEGORY(lcServe, "alarmsearch.serve")

using namespace PluginAlarmSearchCommon;

// What a handler needs of a request, copied on the server's thread.
struct ApiServer::Call
{
    QString path;
    QString alarmId;
    QByteArray body;
    QByteArray authorization;
    QElapsedTimer started;
};

struct ApiServer::Reply
{
    int status = 200;
    QJsonObject body;
    QString user;
    QByteArray raw; // sent instead of body when set
};

namespace {

using Reply = ApiServer::Reply;

Reply json(int status, const QJsonObject& body)
{
    return Reply{status, body, QString(), QByteArray()};
}

Reply badRequest(const ApiRequest::FieldError& error)
{
    return json(400, {{QStringLiteral("error"), QStringLiteral("bad request")},
                      {QStringLiteral("field"), error.field},
                      {QStringLiteral("problem"), error.problem}});
}

Reply failed(const QString& method, const QString& resultCode)
{
    return json(502, {{QStringLiteral("error"), QStringLiteral("the plug-in or the alarm server "
                                                               "failed")},
                      {QStringLiteral("method"), method},
                      {QStringLiteral("resultCode"), resultCode}});
}

Reply timedOut(const QString& method, const QString& problem)
{
    return json(504, {{QStringLiteral("error"), QStringLiteral("no answer in time")},
                      {QStringLiteral("method"), method},
                      {QStringLiteral("problem"), problem}});
}

QJsonObject answerHead(const QString& method, const QString& resultCode)
{
    return {{QStringLiteral("type"), QStringLiteral("answer")},
            {QStringLiteral("method"), method},
            {QStringLiteral("resultCode"), resultCode}};
}

QByteArray upgradeRequired()
{
    return QJsonDocument(QJsonObject{{QStringLiteral("error"), QStringLiteral("upgrade required")},
                                     {QStringLiteral("problem"),
                                      QStringLiteral("open a WebSocket on this path")}})
        .toJson(QJsonDocument::Compact);
}

QByteArray authorization(const QHttpServerRequest& request)
{
#if QT_VERSION >= QT_VERSION_CHECK(6, 8, 0)
    return request.headers().value(QHttpHeaders::WellKnownHeader::Authorization).toByteArray();
#else
    return request.value(QByteArrayLiteral("authorization"));
#endif
}

QHttpServerResponse toResponse(const Reply& reply)
{
    const QByteArray bytes =
        reply.raw.isNull() ? QJsonDocument(reply.body).toJson(QJsonDocument::Compact) : reply.raw;
    return QHttpServerResponse(QByteArrayLiteral("application/json"), bytes,
                               QHttpServerResponse::StatusCode(reply.status));
}

} // namespace

ApiServer::ApiServer(ReferenceHost& host, QObject* parent)
    : QObject(parent), m_host(host), m_http(std::make_unique<QHttpServer>())
{
    // Requests mostly wait for the plug-in's answer; enough threads to keep both cores busy
    // with many clients.
    m_pool.setMaxThreadCount(qMax(64, QThread::idealThreadCount() * 8));
}

ApiServer::~ApiServer()
{
    stop();
}

bool ApiServer::checkAddress(const Options& options, QString* errorMessage)
{
    if (options.usersFile.isEmpty() && !options.address.isLoopback()) {
        *errorMessage = QStringLiteral("%1 is not a loopback address: give a users file "
                                       "(--users) so that operators are known by their tokens")
                            .arg(options.address.toString());
        return false;
    }
    return true;
}

bool ApiServer::listen(const Options& options, QString* errorMessage)
{
    m_options = options;
    if (!options.usersFile.isEmpty() && !m_users.load(options.usersFile, errorMessage))
        return false;
    if (!checkAddress(options, errorMessage))
        return false;
    addRoutes();
    m_tcpServer = new GuardedTcpServer(ApiRequest::kMaxBodyBytes);
    if (!m_tcpServer->listen(options.address, options.port)) {
        *errorMessage = QStringLiteral("cannot listen on %1:%2: %3")
                            .arg(options.address.toString())
                            .arg(options.port)
                            .arg(m_tcpServer->errorString());
        delete m_tcpServer;
        m_tcpServer = nullptr;
        return false;
    }
    static_cast<void>(m_http->bind(m_tcpServer)); // void before Qt 6.8, bool after
    m_tcpServer->followHttpServer();

    m_outcomeKey = QStringLiteral("serve-outcomes-%1").arg(QCoreApplication::applicationPid());
    m_host.session().subscribe(
        m_outcomeKey, EVENT_ALARM_UPDATED, [this](const PluginObjBase_EventSignalInfo& info) {
            recordOutcome(info.eventData.toMap().value(ARG_RELAY_PATH).toString(),
                          PlainJson::event(info));
        });
    return true;
}

QUrl ApiServer::url() const
{
    QUrl url;
    url.setScheme(QStringLiteral("http"));
    url.setHost(m_tcpServer ? m_tcpServer->serverAddress().toString() : QString());
    url.setPort(m_tcpServer ? m_tcpServer->serverPort() : -1);
    return url;
}

void ApiServer::stop()
{
    if (!m_tcpServer)
        return;
    m_tcpServer->close();
    qDeleteAll(findChildren<EventSocket*>());
    m_host.session().unsubscribe(m_outcomeKey);
    m_pool.waitForDone();
    // Hands the last answers to their sockets, then closes the connections; a request read
    // meanwhile is still carried out.
    QCoreApplication::processEvents();
    m_tcpServer = nullptr;
    m_http.reset();
    m_pool.waitForDone();
    // Event deliveries still running on reply threads post to this object.
    m_host.tunnelClient().waitForIdle(m_options.timeoutMs);
    QCoreApplication::processEvents();
}

void ApiServer::addRoutes()
{
    ConsolePages::addRoutes(*m_http, this);
    for (const ApiRoutes::Route& route : ApiRoutes::all()) {
        const QHttpServerRequest::Method verb = route.verb == ApiRoutes::Verb::Get
                                                    ? QHttpServerRequest::Method::Get
                                                    : QHttpServerRequest::Method::Post;
        const auto dispatch = [this, route](const QHttpServerRequest& request,
                                            const QString& alarmId) {
            Call call{request.url().path(), alarmId, request.body(), authorization(request),
                      QElapsedTimer()};
            call.started.start();
            return QtConcurrent::run(&m_pool, [this, route, call] {
                const Reply reply = handle(route, call);
                qCInfo(lcServe).noquote()
                    << ApiRoutes::verbName(route.verb).toUpper() << call.path << reply.status
                    << (reply.user.isEmpty() ? QStringLiteral("-") : reply.user)
                    << call.started.elapsed() << "ms";
                return toResponse(reply);
            });
        };
        QString pattern = route.path;
#if QT_VERSION < QT_VERSION_CHECK(6, 8, 0)
        if (route.path == ApiRoutes::kEventsPath) {
            // Qt HTTP Server 6.4 hands a WebSocket upgrade request to the routes too, after it
            // upgraded the socket, which must then get no HTTP answer.
            m_http->route(pattern, verb,
                          [](const QHttpServerRequest& request, QHttpServerResponder&& responder) {
                              if (request.value(QByteArrayLiteral("upgrade")).toLower() ==
                                  "websocket")
                                  return;
                              qCInfo(lcServe).noquote() << "GET" << request.url().path() << 426;
                              QHttpServerResponse response(QByteArrayLiteral("application/json"),
                                                           upgradeRequired(),
                                                           QHttpServerResponse::StatusCode(426));
                              ConsolePages::addSecurityHeaders(response);
                              response.write(std::move(responder));
                          });
            continue;
        }
#endif
        if (pattern.contains(QLatin1String("{alarmId}"))) {
            pattern.replace(QLatin1String("{alarmId}"), QLatin1String("<arg>"));
            m_http->route(pattern, verb,
                          [dispatch](const QString& alarmId, const QHttpServerRequest& r) {
                              return dispatch(r, QUrl::fromPercentEncoding(alarmId.toUtf8()));
                          });
        } else {
            m_http->route(pattern, verb, [dispatch](const QHttpServerRequest& r) {
                return dispatch(r, QString());
            });
        }
    }

    const auto notFound = [](const QHttpServerRequest& request, QHttpServerResponder& responder) {
        qCInfo(lcServe).noquote() << request.url().path() << 404;
        QHttpServerResponse response(
            QByteArrayLiteral("application/json"),
            QJsonDocument(QJsonObject{{QStringLiteral("error"), QStringLiteral("not found")},
                                      {QStringLiteral("path"), request.url().path()}})
                .toJson(QJsonDocument::Compact),
            QHttpServerResponse::StatusCode::NotFound);
        ConsolePages::addSecurityHeaders(response);
#if QT_VERSION >= QT_VERSION_CHECK(6, 8, 0)
        responder.sendResponse(response);
#else
        response.write(std::move(responder));
#endif
    };
#if QT_VERSION >= QT_VERSION_CHECK(6, 8, 0)
    m_http->setMissingHandler(
        this, [notFound](const QHttpServerRequest& request, QHttpServerResponder& responder) {
            notFound(request, responder);
        });
    // Newer Qt refuses WebSocket upgrades that no verifier accepts.
    m_http->addWebSocketUpgradeVerifier(this, [](const QHttpServerRequest& request) {
        return request.url().path() == ApiRoutes::kEventsPath
                   ? QHttpServerWebSocketUpgradeResponse::accept()
                   : QHttpServerWebSocketUpgradeResponse::passToNext();
    });
#else
    m_http->setMissingHandler(
        [notFound](const QHttpServerRequest& request, QHttpServerResponder&& responder) {
            notFound(request, responder);
        });
#endif
    connect(m_http.get(), &QAbstractHttpServer::newWebSocketConnection, this,
            &ApiServer::acceptEventSockets);
}

bool ApiServer::originAllowed(const QString& origin) const
{
    if (origin.isEmpty())
        return true; // not a browser
    const QString port = QString::number(m_tcpServer->serverPort());
    QSet<QString> allowed{QStringLiteral("http://127.0.0.1:") + port,
                          QStringLiteral("http://localhost:") + port,
                          QStringLiteral("http://[::1]:") + port};
    allowed.insert(url().toString(QUrl::RemovePath | QUrl::StripTrailingSlash));
    for (const QString& extra : m_options.allowedOrigins)
        allowed.insert(extra);
    return allowed.contains(origin);
}

void ApiServer::acceptEventSockets()
{
    while (m_http->hasPendingWebSocketConnections()) {
        QWebSocket* socket = m_http->nextPendingWebSocketConnection().release();
        if (!socket)
            break;
        const QString key = QStringLiteral("ws-%1").arg(m_nextSocket++);
        auto* events = new EventSocket(
            socket, m_users,
            [this](const QString& user) -> ClientSession& { return m_host.session(user); }, key,
            this);
        const QString path = socket->requestUrl().path();
        const QString origin = socket->origin();
        qCInfo(lcServe).noquote() << "WS" << path << key << "origin"
                                  << (origin.isEmpty() ? QStringLiteral("-") : origin);
        ++m_openEventSockets;
        connect(events, &QObject::destroyed, this, [this] { --m_openEventSockets; });
        if (m_openEventSockets > EventSocket::kMaxSockets)
            events->refuse(EventSocket::TooMany, QStringLiteral("too many subscribers"));
        else if (path != ApiRoutes::kEventsPath)
            events->refuse(EventSocket::UnknownPath, QStringLiteral("unknown path"));
        else if (!originAllowed(origin))
            events->refuse(EventSocket::OriginRefused, QStringLiteral("origin not allowed"));
        else
            connect(events, &EventSocket::subscribed, this,
                    [](const QString& user, const QString& k) {
                        qCInfo(lcServe).noquote() << "WS" << k << "subscribed" << user;
                    });
    }
}

void ApiServer::recordOutcome(const QString& relayPath, const QJsonObject& event)
{
    QMutexLocker locker(&m_outcomeMutex);
    const auto it = m_outcomes.find(relayPath);
    if (it != m_outcomes.end())
        it.value() = event;
}

ApiServer::Reply ApiServer::handle(const ApiRoutes::Route& route, const Call& call)
{
    if (route.path == ApiRoutes::kOpenApiPath)
        return Reply{200, QJsonObject(), QString(), ApiRoutes::openApiDocument()};

    QString user = UserTokens::kLocalUser;
    if (!m_users.isEmpty()) {
        user = m_users.userOfAuthorization(call.authorization);
        if (user.isEmpty())
            return json(401, {{QStringLiteral("error"), QStringLiteral("unauthorized")},
                              {QStringLiteral("field"), QStringLiteral("Authorization")},
                              {QStringLiteral("problem"),
                               QStringLiteral("send 'Authorization: Bearer TOKEN' with a token "
                                              "of the users file")}});
    }

    Reply reply;
    if (route.path == ApiRoutes::kEventsPath)
        reply = Reply{426, QJsonObject(), QString(), upgradeRequired()};
    else if (route.operationId == QLatin1String("getMe"))
        reply = json(200, {{QStringLiteral("user"), user}});
    else if (route.method == METHOD_QUERY_ALARM_LIST ||
             route.method == METHOD_QUERY_UNHANDLED_ALARM)
        reply = search(call, user, route.method == METHOD_QUERY_UNHANDLED_ALARM);
    else if (route.method == METHOD_UPDATE_ALARM)
        reply = update(call, user);
    else if (route.method == METHOD_MUTE_ALARM)
        reply = mute(call, user, route.operationId == QLatin1String("muteAlarms"));
    else
        reply = history(call, user, route.method);
    reply.user = user;
    return reply;
}

ApiServer::Reply ApiServer::search(const Call& call, const QString& user, bool unhandledOnly)
{
    QJsonObject body;
    ApiRequest::Search search;
    ApiRequest::FieldError error;
    if (!ApiRequest::object(call.body, &body, &error) ||
        !ApiRequest::search(body, unhandledOnly, QDateTime::currentDateTimeUtc(), &search, &error))
        return badRequest(error);

    QList<PluginAnswer> answers;
    QString problem;
    if (!m_host.session(user).call(search.method, search.args, m_options.timeoutMs, &answers,
                                   &problem))
        return timedOut(search.method, problem);
    const PluginAnswer& answer = answers.constLast();
    if (answer.resultCode != QLatin1String("0"))
        return failed(search.method, answer.resultCode);

    const QVariantList page = answer.result.toMap().value(ARG_QUERY_RESULT).toList();
    const QSet<QString> excluded(search.exclude.cbegin(), search.exclude.cend());
    QVariantList alarms;
    for (const QVariant& alarm : page) {
        if (!excluded.contains(alarm.toMap().value(FIELD_ALARM_ID).toString()))
            alarms.append(alarm);
    }

    // A full page may have been cut by the server's limit: the next older page ends at its
    // oldest second, leaving out what this page already had of that second.
    const bool truncated = page.size() >= AlarmSearchLimits::MaxRecords;
    QJsonValue next = QJsonValue::Null;
    if (truncated) {
        const QString oldest = page.constLast().toMap().value(FIELD_SERVER_TIME).toString();
        QJsonArray boundary;
        for (const QVariant& alarm : page) {
            const QVariantMap fields = alarm.toMap();
            if (fields.value(FIELD_SERVER_TIME).toString() == oldest)
                boundary.append(fields.value(FIELD_ALARM_ID).toString());
        }
        QJsonObject nextBody = search.body;
        nextBody.insert(QStringLiteral("to"), PlainJson::time(oldest));
        nextBody.insert(QStringLiteral("exclude"), boundary);
        next = nextBody;
    }
    QJsonObject result = answerHead(search.method, answer.resultCode);
    // The alarms' XML texts are left out as they are converted, not copied out beforehand.
    result.insert(QStringLiteral("alarms"),
                  PlainJson::value(alarms, search.keepXml ? QString() : QStringLiteral("XML")));
    result.insert(QStringLiteral("truncated"), truncated);
    result.insert(QStringLiteral("next"), next);
    return json(200, result);
}

ApiServer::Reply ApiServer::update(const Call& call, const QString& user)
{
    QJsonObject body;
    ApiRequest::Update update;
    ApiRequest::FieldError error;
    if (!ApiRequest::object(call.body, &body, &error) || !ApiRequest::update(body, &update, &error))
        return badRequest(error);

    // The per-alarm outcome comes with the event the update publishes, which names the
    // update's relay path.
    const QString relayPath = QStringLiteral("api/%1").arg(m_nextRelay++);
    {
        QMutexLocker locker(&m_outcomeMutex);
        m_outcomes.insert(relayPath, QJsonObject());
    }
    QList<PluginAnswer> answers;
    QString problem;
    const bool answered = m_host.session(user).call(METHOD_UPDATE_ALARM,
                                                    QVariantMap{{ARG_ALARM_ID_LIST, update.ids},
                                                                {ARG_ALARM_STATUS, update.state},
                                                                {ARG_ALARM_COMMENT, update.note},
                                                                {ARG_RELAY_PATH, relayPath}},
                                                    m_options.timeoutMs, &answers, &problem);
    QJsonObject event;
    {
        QMutexLocker locker(&m_outcomeMutex);
        event = m_outcomes.take(relayPath);
    }
    if (!answered)
        return timedOut(METHOD_UPDATE_ALARM, problem);
    if (answers.constLast().resultCode != QLatin1String("0"))
        return failed(METHOD_UPDATE_ALARM, answers.constLast().resultCode);

    QJsonObject result = answerHead(METHOD_UPDATE_ALARM, answers.constLast().resultCode);
    result.insert(QStringLiteral("relayPath"), relayPath);
    result.insert(
        QStringLiteral("results"),
        event.value(QLatin1String("data")).toObject().value(ARG_ALARM_UPDATED_RESULTS).toArray());
    if (!event.isEmpty())
        result.insert(QStringLiteral("event"), event);
    return json(200, result);
}

ApiServer::Reply ApiServer::history(const Call& call, const QString& user, const QString& method)
{
    ApiRequest::FieldError error;
    if (!ApiRequest::alarmId(call.alarmId, &error))
        return badRequest(error);
    QList<PluginAnswer> answers;
    QString problem;
    if (!m_host.session(user).call(method, QVariantMap{{ARG_ALARM_ID, call.alarmId}},
                                   m_options.timeoutMs, &answers, &problem))
        return timedOut(method, problem);
    const PluginAnswer& answer = answers.constLast();
    if (answer.resultCode != QLatin1String("0"))
        return failed(method, answer.resultCode);
    QJsonObject result = answerHead(method, answer.resultCode);
    result.insert(QStringLiteral("alarmId"), call.alarmId);
    result.insert(QStringLiteral("entries"), PlainJson::value(answer.result.toList()));
    return json(200, result);
}

ApiServer::Reply ApiServer::mute(const Call& call, const QString& user, bool isMute)
{
    QJsonObject body;
    ApiRequest::Mute mute;
    ApiRequest::FieldError error;
    if (!ApiRequest::object(call.body, &body, &error) ||
        !ApiRequest::mute(body, isMute, &mute, &error))
        return badRequest(error);
    m_host.session(user).send(METHOD_MUTE_ALARM, QVariantMap{{ARG_ALARM_ID_LIST, mute.ids},
                                                             {ARG_IS_MUTE, isMute},
                                                             {ARG_MUTE_TIME_SECOND, mute.seconds}});
    QJsonObject result{{QStringLiteral("type"), QStringLiteral("answer")},
                       {QStringLiteral("method"), METHOD_MUTE_ALARM},
                       {QStringLiteral("sent"), true}};
    return json(202, result);
}
