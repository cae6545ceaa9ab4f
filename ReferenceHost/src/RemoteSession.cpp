#include "RemoteSession.h"

#include "QueryArguments.h"
#include "RemoteConnection.h"

#include <PluginAlarmSearchCommon.h>

#include <QJsonArray>

using namespace PluginAlarmSearchCommon;

namespace {

QString failureText(const RemoteConnection::Reply& reply)
{
    if (reply.status == 0)
        return reply.error;
    QString text = QStringLiteral("the server answered %1").arg(reply.status);
    for (const char* key : {"error", "field", "problem"}) {
        const QString part = reply.body.value(QLatin1String(key)).toString();
        if (!part.isEmpty())
            text += QStringLiteral(": ") + part;
    }
    return text;
}

} // namespace

RemoteSession::RemoteSession(const QUrl& server, const QString& token, bool keepXml)
    : m_keepXml(keepXml), m_connection(new RemoteConnection(server, token))
{
    m_thread.setObjectName(QStringLiteral("RemoteSession"));
    m_connection->moveToThread(&m_thread);
    m_thread.start();
}

RemoteSession::~RemoteSession()
{
    QMetaObject::invokeMethod(
        m_connection, [this] { m_connection->closeAll(); }, Qt::BlockingQueuedConnection);
    m_thread.quit();
    m_thread.wait();
    delete m_connection;
}

bool RemoteSession::connectToServer(int timeoutMs, QString* errorMessage)
{
    m_timeoutMs = timeoutMs;
    RemoteConnection::Reply reply;
    QMetaObject::invokeMethod(
        m_connection,
        [&] { reply = m_connection->request("GET", QStringLiteral("/api/v1/me"), {}, timeoutMs); },
        Qt::BlockingQueuedConnection);
    m_user = reply.body.value(QLatin1String("user")).toString();
    if (reply.status == 200 && !m_user.isEmpty())
        return true;
    *errorMessage = failureText(reply);
    return false;
}

bool RemoteSession::call(const QString& method, const QVariant& args, int timeoutMs,
                         QList<PluginAnswer>* answers, QString* errorMessage)
{
    const QVariantMap map = args.toMap();
    answers->clear();
    PluginAnswer answer;
    answer.isLast = true;
    if (method == METHOD_QUERY_ALARM_LIST || method == METHOD_QUERY_UNHANDLED_ALARM) {
        if (!searchCall(method, map, timeoutMs, &answer, errorMessage))
            return false;
        answers->append(answer);
        return true;
    }

    QByteArray verb = "POST";
    QString path;
    QJsonObject body;
    if (method == METHOD_UPDATE_ALARM) {
        path = QStringLiteral("/api/v1/alarms/update");
        body = {{QStringLiteral("ids"),
                 QJsonArray::fromStringList(map.value(ARG_ALARM_ID_LIST).toStringList())},
                {QStringLiteral("state"), map.value(ARG_ALARM_STATUS).toString()},
                {QStringLiteral("note"), map.value(ARG_ALARM_COMMENT).toString()}};
    } else if (method == METHOD_GET_ALARM_HISTORY ||
               method == METHOD_GET_ALARM_HISTORY_FOR_EXPORT) {
        verb = "GET";
        path = QStringLiteral("/api/v1/alarms/%1/history")
                   .arg(QString::fromLatin1(
                       QUrl::toPercentEncoding(map.value(ARG_ALARM_ID).toString())));
        if (method == METHOD_GET_ALARM_HISTORY_FOR_EXPORT)
            path += QLatin1String("/export");
    } else {
        *errorMessage = QStringLiteral("%1 is no request method of the server's API").arg(method);
        return false;
    }

    RemoteConnection::Reply reply;
    QMetaObject::invokeMethod(
        m_connection,
        [&] {
            reply = m_connection->request(verb, path, body, timeoutMs);
            if (reply.status == 200 && reply.body.contains(QLatin1String("event")))
                m_connection->deliverOnce(reply.body.value(QLatin1String("event")).toObject());
        },
        Qt::BlockingQueuedConnection);
    answer.resultCode = reply.body.value(QLatin1String("resultCode")).toString();
    if (reply.status == 200 && method == METHOD_UPDATE_ALARM) {
        answer.resultCode = QStringLiteral("0");
    } else if (reply.status == 200) {
        answer.result = reply.body.value(QLatin1String("entries")).toArray().toVariantList();
    } else if (reply.status == 502 && method == METHOD_UPDATE_ALARM) {
        answer.result = QVariantMap{{ARG_ALARM_ID_LIST, map.value(ARG_ALARM_ID_LIST)},
                                    {ARG_RELAY_PATH, QString()}};
    } else if (reply.status != 502) {
        *errorMessage = failureText(reply);
        return false;
    }
    answers->append(answer);
    return true;
}

bool RemoteSession::searchCall(const QString& method, const QVariantMap& args, int timeoutMs,
                               PluginAnswer* answer, QString* errorMessage)
{
    QueryFilter filter;
    if (!QueryArguments::filterOf(args, &filter, errorMessage))
        return false;
    const bool unhandled = method == METHOD_QUERY_UNHANDLED_ALARM;
    QJsonObject body{{QStringLiteral("xml"), m_keepXml}};
    const auto put = [&body](const char* field, const QStringList& values) {
        if (!values.isEmpty())
            body.insert(QLatin1String(field), QJsonArray::fromStringList(values));
    };
    put("events", filter.events);
    put("names", filter.names);
    put("devices", filter.devices);
    if (!unhandled)
        put("states", filter.states);
    if (!filter.from.isEmpty())
        body.insert(QStringLiteral("from"), filter.from);
    if (!filter.to.isEmpty())
        body.insert(QStringLiteral("to"), filter.to);
    const QString path = unhandled ? QStringLiteral("/api/v1/alarms/unhandled")
                                   : QStringLiteral("/api/v1/alarms/search");
    RemoteConnection::Reply reply;
    QMetaObject::invokeMethod(
        m_connection, [&] { reply = m_connection->request("POST", path, body, timeoutMs); },
        Qt::BlockingQueuedConnection);
    if (reply.status != 200 && reply.status != 502) {
        *errorMessage = failureText(reply);
        return false;
    }
    answer->resultCode = reply.body.value(QLatin1String("resultCode")).toString();
    answer->result = QVariantMap{
        {ARG_QUERY_RESULT, reply.body.value(QLatin1String("alarms")).toArray().toVariantList()},
        {ARG_RELAY_PATH, QString()}};
    return true;
}

void RemoteSession::send(const QString& method, const QVariant& args)
{
    const QVariantMap map = args.toMap();
    const bool isMute = map.value(ARG_IS_MUTE).toBool();
    QJsonObject body{{QStringLiteral("ids"),
                      QJsonArray::fromStringList(map.value(ARG_ALARM_ID_LIST).toStringList())}};
    if (isMute)
        body.insert(QStringLiteral("seconds"), map.value(ARG_MUTE_TIME_SECOND).toInt());
    const QString path =
        isMute ? QStringLiteral("/api/v1/alarms/mute") : QStringLiteral("/api/v1/alarms/unmute");
    RemoteConnection::Reply reply;
    if (method == METHOD_MUTE_ALARM)
        QMetaObject::invokeMethod(
            m_connection, [&] { reply = m_connection->request("POST", path, body, m_timeoutMs); },
            Qt::BlockingQueuedConnection);
    if (reply.status != 202)
        m_sendFailed = true;
}

bool RemoteSession::waitForIdle(int /*timeoutMs*/)
{
    // send() waits for the server's receipt itself.
    return !m_sendFailed.exchange(false);
}

bool RemoteSession::subscribe(const QString& subscriptionKey, const QString& /*eventName*/,
                              EventHub::Listener listener, QString* errorMessage)
{
    bool subscribed = false;
    QString error;
    QMetaObject::invokeMethod(
        m_connection,
        [&] {
            subscribed =
                m_connection->subscribe(subscriptionKey, std::move(listener), m_timeoutMs, &error);
        },
        Qt::BlockingQueuedConnection);
    if (!subscribed && errorMessage)
        *errorMessage = error;
    return subscribed;
}

void RemoteSession::unsubscribe(const QString& subscriptionKey)
{
    QMetaObject::invokeMethod(
        m_connection, [&] { m_connection->unsubscribe(subscriptionKey); },
        Qt::BlockingQueuedConnection);
}
