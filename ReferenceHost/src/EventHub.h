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
    struct Entry
    {
        QString subscriptionKey;
        Listener listener;
    };

    mutable QMutex m_mutex;
    QHash<int, Entry> m_listeners;
    int m_nextId = 1;
};
