#include "PluginAlarmSearchSrv.h"

#include "ORVOSrvTunnelControl.h"
#include "PluginAlarmSearchSrv_Log.h"
#include "stdafx.h"

#include <IFrameworkTools.h>
#include <RequestSenderInfo.h>

using namespace PluginAlarmSearchCommon;

namespace {

void ignoreAnswer(bool, const QString&, const QString&, const QVariant&) {}

} // namespace

thread_local const PluginLifeGuard::Visit* PluginLifeGuard::t_innermostVisit = nullptr;

PluginLifeGuard::Visit::Visit(PluginLifeGuard& guard) : m_guard(guard), m_outer(t_innermostVisit)
{
    std::lock_guard lock(m_guard.m_mutex);
    if (!m_guard.m_plugin)
        return;
    m_plugin = m_guard.m_plugin;
    ++m_guard.m_visits;
    t_innermostVisit = this;
}

PluginLifeGuard::Visit::~Visit()
{
    if (!m_plugin)
        return;
    t_innermostVisit = m_outer;
    std::lock_guard lock(m_guard.m_mutex);
    --m_guard.m_visits;
    m_guard.m_idle.notify_all();
}

void PluginLifeGuard::retire()
{
    // Visits on this thread (the host deletes the plug-in from inside one) are not waited for.
    int own = 0;
    for (const Visit* visit = t_innermostVisit; visit; visit = visit->m_outer)
        own += &visit->m_guard == this ? 1 : 0;
    std::unique_lock lock(m_mutex);
    m_plugin = nullptr;
    m_idle.wait(lock, [&] { return m_visits == own; });
}

PluginAlarmSearchSrv::PluginAlarmSearchSrv()
    : m_lifeGuard(QSharedPointer<PluginLifeGuard>::create(this))
{
}

PluginAlarmSearchSrv::~PluginAlarmSearchSrv()
{
    EntryLog entryLog(__FILE__, "~PluginAlarmSearchSrv", __LINE__);
    // Replies still pending in the tunnel must not reach this object from now on.
    m_lifeGuard->retire();
}

bool PluginAlarmSearchSrv::InitialPluginBase(IFrameworkTools* tools)
{
    EntryLog entryLog(__FILE__, "InitialPluginBase", __LINE__);
    if (!tools)
        return true; // nothing to start with: requests are answered as not sent
    HDLR_EVENT_SIGNAL_CB eventSignal = tools->GetEventSignalFunc();
    const bool needsTunnelCtrl = tunnelCtrl().isNull();
    // The host's tunnel client is asked for only when no tunnel control is installed yet.
    const auto created =
        needsTunnelCtrl ? QSharedPointer<ORVOSrvTunnelControl>::create(tools->GetTunnelClient())
                        : QSharedPointer<ORVOSrvTunnelControl>();

    std::lock_guard lock(m_mutex);
    m_fnEventSignal = std::move(eventSignal);
    if (!m_spTunnelCtrl)
        m_spTunnelCtrl = created;
    return true;
}

void PluginAlarmSearchSrv::Request(const QString& method, const QVariant& args,
                                   const RequestSenderInfo& sender, HDLR_DO_REQUEST_CB reqCB)
{
    EntryLog entryLog(__FILE__, "Request", __LINE__);
    if (!reqCB)
        reqCB = ignoreAnswer; // a client that wants no answer still has its request served
    Qt::HANDLE clientID = sender.clientHandle;
    if (method == METHOD_QUERY_UNHANDLED_ALARM || method == METHOD_QUERY_ALARM_LIST)
        handleQueryAlarm(clientID, args, reqCB);
    else if (method == METHOD_GET_ALARM_HISTORY || method == METHOD_GET_ALARM_HISTORY_FOR_EXPORT)
        handleGetAlarmHistory(clientID, args, reqCB);
    else if (method == METHOD_UPDATE_ALARM)
        handleUpdateAlarm(clientID, args, reqCB);
    else if (method == METHOD_MUTE_ALARM)
        handleMuteAlarm(clientID, args);
    // Any other method is not ours: it is ignored without an answer.
}

void PluginAlarmSearchSrv::RequestBlock(const QString&, const QVariant&, const RequestSenderInfo&,
                                        IResponser&)
{
    EntryLog entryLog(__FILE__, "RequestBlock", __LINE__);
    // This plug-in serves no blocking requests.
}

void PluginAlarmSearchSrv::SubscribeEventBlock(const QString& subscriptionKey, const QString&,
                                               const QVariant&, const RequestSenderInfo&,
                                               IResponser&)
{
    EntryLog entryLog(__FILE__, "SubscribeEventBlock", __LINE__);
    std::lock_guard lock(m_mutex);
    if (!m_lstSubscriptionKeys.contains(subscriptionKey))
        m_lstSubscriptionKeys.append(subscriptionKey);
}

void PluginAlarmSearchSrv::UnsubscribeEventBlock(const QString& subscriptionKey, const QVariant&,
                                                 IResponser&)
{
    EntryLog entryLog(__FILE__, "UnsubscribeEventBlock", __LINE__);
    std::lock_guard lock(m_mutex);
    m_lstSubscriptionKeys.removeAll(subscriptionKey);
}

void PluginAlarmSearchSrv::setORVOSrvTunnelCtrl(QSharedPointer<ORVOSrvTunnelControl> tunnelCtrl)
{
    std::lock_guard lock(m_mutex);
    m_spTunnelCtrl = std::move(tunnelCtrl);
}

QSharedPointer<ORVOSrvTunnelControl> PluginAlarmSearchSrv::tunnelCtrl() const
{
    std::lock_guard lock(m_mutex);
    return m_spTunnelCtrl;
}
