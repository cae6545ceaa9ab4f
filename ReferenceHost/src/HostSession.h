#pragma once

#include "EventHub.h"

#include <RequestSenderInfo.h>

#include <QList>
#include <QString>
#include <QStringList>
#include <QVariant>

class IPluginObjectBase;

// One answer of a plug-in to a request, as its request callback delivered it.
struct PluginAnswer
{
    bool isLast = false;
    QString resultCode;
    QString message;
    QVariant result;
};

// A client of a started plug-in: sends requests and waits for their answers, and manages event
// subscriptions. Requests go out on the calling thread; answers and events arrive on the tunnel
// client's threads.
class HostSession
{
public:
    HostSession(IPluginObjectBase& plugin, EventHub& eventHub, const QString& clientName);
    ~HostSession();
    HostSession(const HostSession&) = delete;
    HostSession& operator=(const HostSession&) = delete;

    // Sends a request and collects its answers up to the last one. False with errorMessage set
    // when no last answer came within timeoutMs.
    bool call(const QString& method, const QVariant& args, int timeoutMs,
              QList<PluginAnswer>* answers, QString* errorMessage);
    // Sends a request that gets no answer ("MuteAlarm").
    void send(const QString& method, const QVariant& args);

    // Subscribes to an event under a key of this session; listener gets every record for it.
    void subscribe(const QString& subscriptionKey, const QString& eventName,
                   EventHub::Listener listener);
    void unsubscribe(const QString& subscriptionKey);

private:
    IPluginObjectBase& m_plugin;
    EventHub& m_eventHub;
    RequestSenderInfo m_sender;
    QHash<QString, int> m_listenerIds;
};
