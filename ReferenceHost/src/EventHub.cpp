#include "EventHub.h"

#include <PluginObjBase_EventInfo.h>

#include <QList>

int EventHub::addListener(const QString& subscriptionKey, Listener listener)
{
    QMutexLocker locker(&m_mutex);
    const int id = m_nextId++;
    m_listeners[subscriptionKey].emplace(id, std::move(listener));
    m_keys.insert(id, subscriptionKey);
    return id;
}

void EventHub::removeListener(int listenerId)
{
    QMutexLocker locker(&m_mutex);
    const auto key = m_keys.find(listenerId);
    if (key == m_keys.end())
        return;
    const auto listeners = m_listeners.find(key.value());
    listeners->remove(listenerId);
    if (listeners->isEmpty())
        m_listeners.erase(listeners);
    m_keys.erase(key);
}

void EventHub::publish(const PluginObjBase_EventSignalInfo* info) const
{
    if (!info)
        return;
    // Listeners run unlocked so that they may add or remove listeners themselves.
    QList<Listener> matching;
    {
        QMutexLocker locker(&m_mutex);
        matching = m_listeners.value(info->subscriptionKey).values();
    }
    for (const Listener& listener : std::as_const(matching))
        listener(*info);
}
