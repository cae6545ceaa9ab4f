#include "EventHub.h"

#include <PluginObjBase_EventInfo.h>

#include <QList>

int EventHub::addListener(const QString& subscriptionKey, Listener listener)
{
    QMutexLocker locker(&m_mutex);
    const int id = m_nextId++;
    m_listeners.insert(id, Entry{subscriptionKey, std::move(listener)});
    return id;
}

void EventHub::removeListener(int listenerId)
{
    QMutexLocker locker(&m_mutex);
    m_listeners.remove(listenerId);
}

void EventHub::publish(const PluginObjBase_EventSignalInfo* info) const
{
    if (!info)
        return;
    // Listeners run unlocked so that they may add or remove listeners themselves.
    QList<Listener> matching;
    {
        QMutexLocker locker(&m_mutex);
        for (const Entry& entry : m_listeners) {
            if (entry.subscriptionKey == info->subscriptionKey)
                matching.append(entry.listener);
        }
    }
    for (const Listener& listener : matching)
        listener(*info);
}
