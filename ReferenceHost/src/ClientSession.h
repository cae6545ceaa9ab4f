#pragma once

#include "EventHub.h"

#include <QList>
#include <QString>
#include <QVariant>

// One answer of a plug-in to a request, as its request callback delivered it.
struct PluginAnswer
{
    bool isLast = false;
    QString resultCode;
    QString message;
    QVariant result;
};

// What a client does with the plug-in, whether the plug-in is loaded in this process
// (HostSession) or held by a running `alarmsearch serve` (RemoteSession). Calls block the
// calling thread; event listeners run on the session's own threads.
class ClientSession
{
public:
    virtual ~ClientSession() = default;

    // Sends a request and collects its answers up to the last one. False with errorMessage set
    // when no last answer came within timeoutMs, or the request could not be made.
    virtual bool call(const QString& method, const QVariant& args, int timeoutMs,
                      QList<PluginAnswer>* answers, QString* errorMessage) = 0;
    // Sends a request that gets no answer ("MuteAlarm").
    virtual void send(const QString& method, const QVariant& args) = 0;
    // Waits until what send handed on has been carried out; false on timeout or failure.
    virtual bool waitForIdle(int timeoutMs) = 0;

    // Subscribes to an event under a key of this session; listener gets every record for it.
    // False with errorMessage set when the subscription could not be made.
    virtual bool subscribe(const QString& subscriptionKey, const QString& eventName,
                           EventHub::Listener listener, QString* errorMessage = nullptr) = 0;
    virtual void unsubscribe(const QString& subscriptionKey) = 0;
};
