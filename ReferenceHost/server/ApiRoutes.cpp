#include "ApiRoutes.h"

#include <PluginAlarmSearchCommon.h>

#include <QFile>

using namespace PluginAlarmSearchCommon;

namespace ApiRoutes {

const QList<Route>& all()
{
    static const QList<Route> routes{
        {Verb::Get, kOpenApiPath, QStringLiteral("getOpenApi"), QString()},
        {Verb::Get, QStringLiteral("/api/v1/me"), QStringLiteral("getMe"), QString()},
        {Verb::Get, kEventsPath, QStringLiteral("openEvents"), QString()},
        {Verb::Post, QStringLiteral("/api/v1/alarms/search"), QStringLiteral("searchAlarms"),
         METHOD_QUERY_ALARM_LIST},
        {Verb::Post, QStringLiteral("/api/v1/alarms/unhandled"),
         QStringLiteral("searchUnhandledAlarms"), METHOD_QUERY_UNHANDLED_ALARM},
        {Verb::Post, QStringLiteral("/api/v1/alarms/update"), QStringLiteral("updateAlarms"),
         METHOD_UPDATE_ALARM},
        {Verb::Get, QStringLiteral("/api/v1/alarms/{alarmId}/history"),
         QStringLiteral("getAlarmHistory"), METHOD_GET_ALARM_HISTORY},
        {Verb::Get, QStringLiteral("/api/v1/alarms/{alarmId}/history/export"),
         QStringLiteral("getAlarmHistoryForExport"), METHOD_GET_ALARM_HISTORY_FOR_EXPORT},
        {Verb::Post, QStringLiteral("/api/v1/alarms/mute"), QStringLiteral("muteAlarms"),
         METHOD_MUTE_ALARM},
        {Verb::Post, QStringLiteral("/api/v1/alarms/unmute"), QStringLiteral("unmuteAlarms"),
         METHOD_MUTE_ALARM},
    };
    return routes;
}

QString verbName(Verb verb)
{
    return verb == Verb::Get ? QStringLiteral("get") : QStringLiteral("post");
}

QByteArray openApiDocument()
{
    QFile file(QStringLiteral(":/api/openapi.json"));
    return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
}

} // namespace ApiRoutes
