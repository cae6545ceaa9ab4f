#include "PluginAlarmSearchSrv.h"

#include "ORVOSrvTunnelControl.h"
#include "PluginAlarmSearchSrv_Log.h"
#include "stdafx.h"

#include <IFrameworkTools.h>
#include <RequestSenderInfo.h>

#include <algorithm>
#include <vector>

using namespace PluginAlarmSearchCommon;

namespace {

void ignoreAnswer(bool, const QString&, const QString&, const QVariant&) {}

// The guards the calling thread is visiting, once per visit (visits nest when a callback makes a
// request that is answered at once).
thread_local std::vector<const PluginLifeGuard*> t_visiting;

} // namespace

PluginAlarmSearchSrv* PluginLifeGuard::enter()
{
    std::lock_guard lock(m_mutex);
    if (!m_plugin)
        return nullptr;
    ++m_visits;
    t_visiting.push_back(this);
    return m_plugin;
}

void PluginLifeGuard::leave()
{
    t_visiting.erase(std::find(t_visiting.begin(), t_visiting.end(), this));
    std::lock_guard lock(m_mutex);
    --m_visits;
    m_idle.notify_all();
}

void PluginLifeGuard::retire()
{
    const auto own = std::count(t_visiting.cbegin(), t_visiting.cend(), this);
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
    else if (method == METHOD_GET_ALARM_HISTORY)
        handleGetAlarmHistory(clientID, args, reqCB);
    else if (method == METHOD_UPDATE_ALARM)
        handleUpdateAlarm(clientID, args, reqCB);
    else if (method == METHOD_GET_ALARM_HISTORY_FOR_EXPORT)
        handleGetAlarmHistory(clientID, args, reqCB);
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
