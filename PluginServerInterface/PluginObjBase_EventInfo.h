#pragma once

#include <QString>
#include <QVariant>

// Base record of an event the host hands to its subscribers.
class PluginObjBase_EventInfoBase
{
public:
    PluginObjBase_EventInfoBase(long long time, const QString& name, const QVariant* data)
        : eventTime(time), eventName(name)
    {
        if (data)
            eventData = *data;
    }
    virtual ~PluginObjBase_EventInfoBase() = default;

    long long eventTime = 0; // milliseconds since the Unix epoch (UTC)
    QString eventName;
    QVariant eventData; // null when the record was built without data
};

// An event published by a plug-in for one subscription key.
class PluginObjBase_EventSignalInfo : public PluginObjBase_EventInfoBase
{
public:
    PluginObjBase_EventSignalInfo(const QString& pluginId, const QString& subscriptionKey,
                                  long long time, const QString& name, const QVariant* data)
        : PluginObjBase_EventInfoBase(time, name, data), pluginId(pluginId),
          subscriptionKey(subscriptionKey)
    {
    }

    QString pluginId;
    QString subscriptionKey;
};
