// The end of an update and event publication; both run on the tunnel's reply threads.

#include "PluginAlarmSearchSrv.h"
#include "stdafx.h"

#include <PluginObjBase_EventInfo.h>

#include <QDateTime>

using namespace PluginAlarmSearchCommon;

void PluginAlarmSearchSrv::handleProcessAlarm(bool ok, bool isLast, const QVariant& result,
                                              const QVariant& reqData,
                                              const HDLR_DO_REQUEST_CB& reqCB)
{
    const QVariantMap request = reqData.toMap();
    const QStringList alarmIds = request.value(ARG_ALARM_ID_LIST).toStringList();
    const QString relayPath = request.value(ARG_RELAY_PATH).toString();

    if (!ok) {
        const QVariantMap answer{{ARG_ALARM_ID_LIST, alarmIds}, {ARG_RELAY_PATH, relayPath}};
        reqCB(isLast, QStringLiteral("-1"), QString(), answer);
        return;
    }

    // The per-alarm outcome reaches the clients through the event, published before the answer.
    const QString alarmStatus = request.value(ARG_ALARM_STATUS).toString();
    const QVariantList outcomes = result.toList();
    QVariantList updated;
    updated.reserve(outcomes.size());
    for (const QVariant& outcome : outcomes) {
        const QVariantMap fields = outcome.toMap();
        updated.append(QVariantMap{
            {ARG_ALARM_ID, fields.value(ARG_ALARM_ID).toString()},
            {ARG_ALARM_STATUS, alarmStatus},
            {ARG_UPDATE_RESULT, fields.value(ARG_UPDATE_RESULT).toString()},
        });
    }
    const QVariantMap eventData{{ARG_ALARM_UPDATED_RESULTS, updated}, {ARG_RELAY_PATH, relayPath}};
    emitEventSignal(EVENT_ALARM_UPDATED, eventData);

    reqCB(isLast, QStringLiteral("0"), QString(), QVariant());
}

void PluginAlarmSearchSrv::emitEventSignal(const QString& eventName,
                                           const QVariant& eventData) const
{
    // Copies taken under the lock; the host is called outside it, so its callback may
    // subscribe or unsubscribe without deadlocking. The keys get a list buffer of their own:
    // Qt decides whether a shared buffer may be changed in place by a relaxed read of its
    // reference count, which does not order this thread's reads before another's writes.
    QStringList keys;
    HDLR_EVENT_SIGNAL_CB eventSignal;
    {
        std::lock_guard lock(m_mutex);
        if (m_lstSubscriptionKeys.isEmpty() || !m_fnEventSignal)
            return;
        keys = m_lstSubscriptionKeys;
        keys.detach();
        eventSignal = m_fnEventSignal;
    }

    const QString pluginId = QString::fromUtf8(PALARMSEARCH_PLUGINID);
    for (const QString& key : std::as_const(keys)) {
        const PluginObjBase_EventSignalInfo info(pluginId, key, QDateTime::currentMSecsSinceEpoch(),
                                                 eventName, &eventData);
        eventSignal(&info);
    }
}
