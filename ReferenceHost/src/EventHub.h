#pragma once

#include <QHash>
#include <QMutex>
#include <QString>

#include <functional>

class PluginObjBase_EventSignalInfo;

// Hands the records a plug-in publishes to the listeners registered for their subscription key.
// Thread-safe: plug-ins publish on whatever thread their replies arrive on.
class EventHub
{
public:
    // Called on the publishing thread with a record that lives only for the call.
    using Listener = std::function<void(const PluginObjBase_EventSignalInfo& info)>;

    int addListener(const QString& subscriptionKey, Listener listener);
    void removeListener(int listenerId);

    void publish(const PluginObjBase_EventSignalInfo* info) const;

private:
    mutable QMutex m_mutex;
    // By subscription key, so that publishing to one of many keys finds its listeners at once.
    QHash<QString, QHash<int, Listener>> m_listeners;
    QHash<int, QString> m_keys; // subscription key by listener id
    int m_nextId = 1;
};
