// Request handlers: each reads the client's arguments, starts one exchange through the tunnel
// control and answers the client from its completion (or at once when nothing could be sent).

#include "ORVOSrvTunnelControl.h"
#include "PluginAlarmSearchSrv.h"
#include "PluginAlarmSearchSrv_Log.h"
#include "stdafx.h"

using namespace PluginAlarmSearchCommon;

namespace {

// The answer to a request that could not be handed to the tunnel.
void answerNotSent(const HDLR_DO_REQUEST_CB& reqCB)
{
    reqCB(true, QStringLiteral("-1"), QString(), QVariant());
}

} // namespace

void PluginAlarmSearchSrv::handleQueryAlarm(Qt::HANDLE clientID, const QVariant& reqData,
                                            const HDLR_DO_REQUEST_CB& reqCB)
{
    auto completion = [reqCB](bool /*ok*/, bool isLast, const QVariant& result,
                              const QString& statusText, const QString& relayPath) {
        // A failed reply has the same shape: the status text and an empty list tell it apart.
        const QVariantMap answer{
            {ARG_QUERY_RESULT, result.toList()},
            {ARG_RELAY_PATH, relayPath},
        };
        reqCB(isLast, statusText, QString(), answer);
    };

    const QSharedPointer<ORVOSrvTunnelControl> tunnel = tunnelCtrl();
    if (!tunnel || !tunnel->queryAlarm(clientID, reqData, std::move(completion))) {
        ALARMSEARCH_TRACE_FAILURE("%s, call queryAlarm failed", "handleQueryAlarm");
        answerNotSent(reqCB);
    }
}

void PluginAlarmSearchSrv::handleUpdateAlarm(Qt::HANDLE clientID, const QVariant& reqData,
                                             const HDLR_DO_REQUEST_CB& reqCB)
{
    const QVariantMap request = reqData.toMap();
    const QVariantMap processArgs{
        {ARG_ALARMINFO_ID_LIST, request.value(ARG_ALARM_ID_LIST).toStringList()},
        {ARG_ALARMINFO_STATUS,
         QVariantMap{{ARG_ALARM_STATUS, request.value(ARG_ALARM_STATUS).toString()}}},
        {ARG_ALARMINFO_NOTE, request.value(ARG_ALARM_COMMENT).toString()},
        {ARG_RELAY_PATH, request.value(ARG_RELAY_PATH).toString()},
    };

    // The completion reaches this object through the life guard only: a reply delivered after
    // the plug-in is gone is dropped, and the client gets no answer from a plug-in that no
    // longer exists. The answer and the event carry the request's own relay path.
    auto completion = [guard = m_lifeGuard, reqData, reqCB](bool ok, bool isLast,
                                                            const QVariant& result,
                                                            const QString& /*relayPath*/) {
        guard->visit([&](PluginAlarmSearchSrv* plugin) {
            plugin->handleProcessAlarm(ok, isLast, result, reqData, reqCB);
        });
    };

    const QSharedPointer<ORVOSrvTunnelControl> tunnel = tunnelCtrl();
    if (!tunnel || !tunnel->processAlarm(clientID, processArgs, std::move(completion))) {
        ALARMSEARCH_TRACE_FAILURE("%s, call processAlarm failed", "handleUpdateAlarm");
        answerNotSent(reqCB);
    }
}

void PluginAlarmSearchSrv::handleGetAlarmHistory(Qt::HANDLE clientID, const QVariant& reqData,
                                                 const HDLR_DO_REQUEST_CB& reqCB)
{
    const QVariantMap request = reqData.toMap();
    auto completion = [reqCB](bool ok, bool isLast, const QVariant& result,
                              const QString& /*relayPath*/) {
        reqCB(isLast, ok ? QStringLiteral("0") : QStringLiteral("-1"), QString(), result);
    };

    const QSharedPointer<ORVOSrvTunnelControl> tunnel = tunnelCtrl();
    if (!tunnel ||
        !tunnel->getAlarmInfo(clientID, request.value(ARG_ALARM_ID).toString(),
                              request.value(ARG_RELAY_PATH).toString(), std::move(completion))) {
        ALARMSEARCH_TRACE_FAILURE("%s, call getAlarmInfo failed", "handleGetAlarmHistory");
        answerNotSent(reqCB);
    }
}

void PluginAlarmSearchSrv::handleMuteAlarm(Qt::HANDLE clientID, const QVariant& reqData)
{
    const QVariantMap request = reqData.toMap();
    if (const QSharedPointer<ORVOSrvTunnelControl> tunnel = tunnelCtrl()) {
        tunnel->muteAlarm(clientID, request.value(ARG_ALARM_ID_LIST).toStringList(),
                          request.value(ARG_IS_MUTE).toBool(),
                          request.value(ARG_MUTE_TIME_SECOND).toInt());
    }
}
