#pragma once

#include <IPluginObjectBase.h>

#include <QSharedPointer>
#include <QStringList>

#include <condition_variable>
#include <mutex>

class ORVOSrvTunnelControl;
class PluginAlarmSearchSrv;

// Lets completions that outlive their request reach the plug-in object only while it exists.
// The plug-in's destructor retires the guard: it waits for the visits running on other threads,
// and no visit starts afterwards. A visit on the destroying thread itself is not waited for, so
// the host may delete the plug-in from inside a callback the plug-in is calling; the visitor
// then touches the object no more after that call.
class PluginLifeGuard
{
public:
    explicit PluginLifeGuard(PluginAlarmSearchSrv* plugin) : m_plugin(plugin) {}

    template <typename Visitor> void visit(Visitor&& visitor)
    {
        const Visit visit(*this);
        if (visit.plugin())
            visitor(visit.plugin());
    }

    void retire();

private:
    // One visit, on the stack of the visiting thread, which keeps a chain of its visits (they
    // nest when a callback makes a request that is answered at once).
    class Visit
    {
    public:
        explicit Visit(PluginLifeGuard& guard);
        ~Visit();
        Visit(const Visit&) = delete;
        Visit& operator=(const Visit&) = delete;

        // The plug-in, or null when the guard was already retired.
        PluginAlarmSearchSrv* plugin() const { return m_plugin; }

    private:
        friend class PluginLifeGuard;

        PluginLifeGuard& m_guard;
        PluginAlarmSearchSrv* m_plugin = nullptr;
        const Visit* m_outer;
    };

    // The calling thread's innermost visit of any guard. A plain pointer: it needs no
    // destructor at thread exit, which would keep the library from being unloaded.
    static thread_local const Visit* t_innermostVisit;

    std::mutex m_mutex;
    std::condition_variable m_idle;
    PluginAlarmSearchSrv* m_plugin;
    int m_visits = 0;
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
                                      const HDLR_DO_REQUEST_CB& reqCB);
    // "UpdateAlarm"; the reply is finished by handleProcessAlarm.
    void handleUpdateAlarm(Qt::HANDLE clientID, const QVariant& reqData,
                           const HDLR_DO_REQUEST_CB& reqCB);
    void handleProcessAlarm(bool ok, bool isLast, const QVariant& result, const QVariant& reqData,
                            const HDLR_DO_REQUEST_CB& reqCB);
    // "GetAlarmHistory" and "GetAlarmHistoryForExport".
    void handleGetAlarmHistory(Qt::HANDLE clientID, const QVariant& reqData,
                               const HDLR_DO_REQUEST_CB& reqCB);
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
