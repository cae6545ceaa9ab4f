#pragma once

#include "ClientSession.h"

#include <RequestSenderInfo.h>

#include <QHash>
#include <QMutex>

class HostTunnelClient;
class IPluginObjectBase;

// A client of a plug-in started in this process, acting for one operator: sends requests and
// waits for their answers, and manages event subscriptions. Requests go out on the calling
// thread (any thread); answers and events arrive on the tunnel client's threads. The session's
// address is the client handle the plug-in passes on to the tunnel client with each command.
class HostSession : public ClientSession
{
public:
    HostSession(IPluginObjectBase& plugin, EventHub& eventHub, HostTunnelClient& tunnelClient,
                const QString& operatorName);
    ~HostSession() override;
    HostSession(const HostSession&) = delete;
    HostSession& operator=(const HostSession&) = delete;

    const QString& operatorName() const { return m_sender.clientName; }

    bool call(const QString& method, const QVariant& args, int timeoutMs,
              QList<PluginAnswer>* answers, QString* errorMessage) override;
    void send(const QString& method, const QVariant& args) override;
    bool waitForIdle(int timeoutMs) override;
    bool subscribe(const QString& subscriptionKey, const QString& eventName,
                   EventHub::Listener listener, QString* errorMessage = nullptr) override;
    void unsubscribe(const QString& subscriptionKey) override;

private:
    IPluginObjectBase& m_plugin;
    EventHub& m_eventHub;
    HostTunnelClient& m_tunnelClient;
    RequestSenderInfo m_sender;
    QMutex m_listenerMutex;
    QHash<QString, int> m_listenerIds;
};
