#pragma once

#include "EventHub.h"

#include <QList>
#include <QString>
#include <QThreadPool>
#include <QVariant>

#include <functional>

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
    // What callAsync hands on: the answers up to the last one, or false and why there are none.
    using AnswerHandler = std::function<void(bool ok, const QList<PluginAnswer>& answers,
                                             const QString& errorMessage)>;
    // Sends a request and returns at once; done is called once, on another thread (or on this
    // one when the request could not be made). By default call runs on Qt's global thread pool.
    virtual void callAsync(const QString& method, const QVariant& args, int timeoutMs,
                           AnswerHandler done)
    {
        QThreadPool::globalInstance()->start([this, method, args, timeoutMs, done] {
            QList<PluginAnswer> answers;
            QString error;
            const bool ok = call(method, args, timeoutMs, &answers, &error);
            done(ok, answers, error);
        });
    }
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
