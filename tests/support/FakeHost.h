#pragma once

#include "FakeTunnelClient.h"

#include <IFrameworkTools.h>
#include <IResponser.h>
#include <PluginObjBase_EventInfo.h>

#include <QList>
#include <QVariant>

#include <mutex>

// The host side a plug-in sees: framework tools around a recording tunnel client, an event sink
// that records every published record, and a responder that must never be used.
class FakeHost : public IFrameworkTools
{
public:
    struct Event
    {
        QString pluginId;
        QString subscriptionKey;
        long long eventTime = 0;
        QString eventName;
        QVariant eventData;
    };

    struct Answer
    {
        bool isLast = false;
        QString resultCode;
        QString message;
        QVariant result;
    };

    FakeHost()
    {
        eventSignal = [this](const PluginObjBase_EventSignalInfo* info) {
            std::lock_guard lock(m_mutex);
            m_events.append({info->pluginId, info->subscriptionKey, info->eventTime,
                             info->eventName, info->eventData});
            m_journal.append(QStringLiteral("event ") + info->subscriptionKey);
        };
    }

    IOrvoTunnelClient* GetTunnelClient() override
    {
        ++tunnelClientAsked;
        return tunnelClient;
    }
    HDLR_EVENT_SIGNAL_CB& GetEventSignalFunc() override { return eventSignal; }

    // A client callback that records its answers.
    HDLR_DO_REQUEST_CB answerSink()
    {
        return [this](bool isLast, const QString& code, const QString& message,
                      const QVariant& result) {
            std::lock_guard lock(m_mutex);
            m_answers.append({isLast, code, message, result});
            m_journal.append(QStringLiteral("answer ") + code);
        };
    }

    QList<Event> events() const { return locked(m_events); }
    QList<Answer> answers() const { return locked(m_answers); }
    // Events and answers in the order they arrived.
    QStringList journal() const { return locked(m_journal); }

    FakeTunnelClient tunnel;
    IOrvoTunnelClient* tunnelClient = &tunnel;
    HDLR_EVENT_SIGNAL_CB eventSignal;
    int tunnelClientAsked = 0;

private:
    template <typename T> T locked(const T& value) const
    {
        std::lock_guard lock(m_mutex);
        return value;
    }

    mutable std::mutex m_mutex;
    QList<Event> m_events;
    QList<Answer> m_answers;
    QStringList m_journal;
};

// A responder the plug-in must leave alone.
class UntouchedResponser : public IResponser
{
public:
    void Respond(bool, const QString&, const QString&, const QVariant&) override { ++calls; }
    int calls = 0;
};
