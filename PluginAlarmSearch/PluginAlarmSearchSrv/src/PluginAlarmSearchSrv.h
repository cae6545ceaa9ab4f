#pragma once

#include <IPluginObjectBase.h>

#include <QSharedPointer>
#include <QStringList>

#include <mutex>
#include <shared_mutex>

class ORVOSrvTunnelControl;
class PluginAlarmSearchSrv;

// Lets completions that outlive their request reach the plug-in object only while it exists.
// A completion holds the guard for as long as it runs; the plug-in's destructor retires the
// guard, waiting for running completions, after which none reaches the object any more.
class PluginLifeGuard
{
public:
    explicit PluginLifeGuard(PluginAlarmSearchSrv* plugin) : m_plugin(plugin) {}

    template <typename Visitor> void visit(Visitor&& visitor)
    {
        std::shared_lock lock(m_mutex);
        if (m_plugin)
            visitor(m_plugin);
    }

    void retire()
    {
        std::unique_lock lock(m_mutex);
        m_plugin = nullptr;
    }

private:
    std::shared_mutex m_mutex;
    PluginAlarmSearchSrv* m_plugin;
};

// The plug-in object the host talks to: starts with the host's services, routes each client
// request to its handler and publishes "AlarmUpdated" to the host's subscriptions.
//
// Host calls may come from several threads, and replies are delivered on the tunnel's threads:
// the members below are read and written under m_mutex, and host callbacks are always called
// outside it.
class PluginAlarmSearchSrv : public IPluginObjectBase
{
    Q_OBJECT
    Q_PLUGIN_METADATA(IID PLUGINSERVER_PLUGIN_IID FILE "PluginAlarmSearchSrv.json")
    Q_INTERFACES(IPluginObjectBase)

public:
    PluginAlarmSearchSrv();
    ~PluginAlarmSearchSrv() override;

    bool InitialPluginBase(IFrameworkTools* tools) override;
    void Request(const QString& method, const QVariant& args, const RequestSenderInfo& sender,
                 HDLR_DO_REQUEST_CB reqCB) override;
    void RequestBlock(const QString& method, const QVariant& args, const RequestSenderInfo& sender,
                      IResponser& responser) override;
    void SubscribeEventBlock(const QString& subscriptionKey, const QString& eventName,
                             const QVariant& args, const RequestSenderInfo& sender,
                             IResponser& responser) override;
    void UnsubscribeEventBlock(const QString& subscriptionKey, const QVariant& args,
                               IResponser& responser) override;

    // "QryUnhandledAlarm" and "QryAlarmList".
    Q_INVOKABLE void handleQueryAlarm(Qt::HANDLE clientID, const QVariant& reqData,
                                      HDLR_DO_REQUEST_CB reqCB);
    // "UpdateAlarm"; the reply is finished by handleProcessAlarm.
    void handleUpdateAlarm(Qt::HANDLE clientID, const QVariant& reqData, HDLR_DO_REQUEST_CB reqCB);
    void handleProcessAlarm(bool ok, bool isLast, const QVariant& result, const QVariant& reqData,
                            HDLR_DO_REQUEST_CB reqCB);
    // "GetAlarmHistory" and "GetAlarmHistoryForExport".
    void handleGetAlarmHistory(Qt::HANDLE clientID, const QVariant& reqData,
                               HDLR_DO_REQUEST_CB reqCB);
    // "MuteAlarm": sent without an answer.
    void handleMuteAlarm(Qt::HANDLE clientID, const QVariant& reqData);

    // Hands one record per subscription key to the host's event-signal callback.
    void emitEventSignal(const QString& eventName, const QVariant& eventData) const;

    // Installs a tunnel control of the caller's making; InitialPluginBase then keeps it.
    void setORVOSrvTunnelCtrl(QSharedPointer<ORVOSrvTunnelControl> tunnelCtrl);

private:
    QSharedPointer<ORVOSrvTunnelControl> tunnelCtrl() const;

    // Destroyed in reverse order: subscription keys, event-signal callback, tunnel control.
    QSharedPointer<ORVOSrvTunnelControl> m_spTunnelCtrl;
    HDLR_EVENT_SIGNAL_CB m_fnEventSignal;
    QStringList m_lstSubscriptionKeys;

    mutable std::mutex m_mutex;
    QSharedPointer<PluginLifeGuard> m_lifeGuard;
};
