#include "HostSession.h"

#include "HostTunnelClient.h"

#include <IPluginObjectBase.h>
#include <IResponser.h>

#include <QDeadlineTimer>
#include <QMutex>
#include <QWaitCondition>

#include <memory>

namespace {

// The plug-in answers subscriptions without its responder; the host has nothing to collect.
class SilentResponser : public IResponser
{
public:
    void Respond(bool, const QString&, const QString&, const QVariant&) override {}
};

// Answers of one request, filled on the tunnel's threads. Shared with the request callback so
// that an answer arriving after the caller gave up lands somewhere valid.
struct AnswerCollector
{
    QMutex mutex;
    QWaitCondition changed;
    QList<PluginAnswer> answers;
    bool complete = false;
};

} // namespace

HostSession::HostSession(IPluginObjectBase& plugin, EventHub& eventHub,
                         HostTunnelClient& tunnelClient, const QString& operatorName)
    : m_plugin(plugin), m_eventHub(eventHub), m_tunnelClient(tunnelClient)
{
    // The handle only has to tell clients apart; the session's address does.
    m_sender.clientHandle = this;
    m_sender.clientName = operatorName;
}

HostSession::~HostSession()
{
    QMutexLocker locker(&m_listenerMutex);
    const QStringList keys = m_listenerIds.keys();
    locker.unlock();
    for (const QString& key : keys)
        unsubscribe(key);
}

bool HostSession::call(const QString& method, const QVariant& args, int timeoutMs,
                       QList<PluginAnswer>* answers, QString* errorMessage)
{
    auto collector = std::make_shared<AnswerCollector>();
    m_plugin.Request(
        method, args, m_sender,
        [collector](bool isLast, const QString& resultCode, const QString& message,
                    const QVariant& result) {
            QMutexLocker locker(&collector->mutex);
            collector->answers.append(PluginAnswer{isLast, resultCode, message, result});
            collector->complete = collector->complete || isLast;
            collector->changed.wakeAll();
        });

    QDeadlineTimer deadline(timeoutMs);
    QMutexLocker locker(&collector->mutex);
    while (!collector->complete && collector->changed.wait(&collector->mutex, deadline)) {
    }
    *answers = collector->answers;
    if (!collector->complete) {
        *errorMessage =
            QStringLiteral("no answer to %1 within %2 s").arg(method).arg(timeoutMs / 1000.0);
        return false;
    }
    return true;
}

void HostSession::send(const QString& method, const QVariant& args)
{
    m_plugin.Request(method, args, m_sender,
                     [](bool, const QString&, const QString&, const QVariant&) {});
}

bool HostSession::waitForIdle(int timeoutMs)
{
    return m_tunnelClient.waitForIdle(timeoutMs);
}

bool HostSession::subscribe(const QString& subscriptionKey, const QString& eventName,
                            EventHub::Listener listener, QString* /*errorMessage*/)
{
    unsubscribe(subscriptionKey);
    {
        QMutexLocker locker(&m_listenerMutex);
        m_listenerIds.insert(subscriptionKey,
                             m_eventHub.addListener(subscriptionKey, std::move(listener)));
    }
    SilentResponser responser;
    m_plugin.SubscribeEventBlock(subscriptionKey, eventName, QVariant(), m_sender, responser);
    return true;
}

void HostSession::unsubscribe(const QString& subscriptionKey)
{
    QMutexLocker locker(&m_listenerMutex);
    const auto it = m_listenerIds.find(subscriptionKey);
    if (it == m_listenerIds.end())
        return;
    const int listenerId = it.value();
    m_listenerIds.erase(it);
    locker.unlock();
    SilentResponser responser;
    m_plugin.UnsubscribeEventBlock(subscriptionKey, QVariant(), responser);
    m_eventHub.removeListener(listenerId);
}
