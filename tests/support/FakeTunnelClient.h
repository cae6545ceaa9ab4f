#pragma once

#include <IOrvoTunnelClient.h>

#include <QList>
#include <QString>

#include <mutex>
#include <thread>

// A tunnel client that records every request and lets a test deliver replies by hand, on the
// test thread or on threads of its own. It can be told to refuse requests.
class FakeTunnelClient : public IOrvoTunnelClient
{
public:
    struct Record
    {
        QString pluginId;
        void* clientID = nullptr;
        int kind = 0;
        QString method;
        bool urgent = false;
        int timeoutMs = 0;
        QString commandText;
        QString relayPath;
        ReplyCallback replyCallback;
    };

    struct Reply
    {
        bool ok = true;
        QString relayPath;
        QString statusText = QStringLiteral("0");
        QString replyText;
        bool isLast = true;
    };

    bool InsertRequest(const QString& pluginId, void* clientID, int requestKind,
                       const QString& method, InsertRequestInfo& info) override
    {
        std::lock_guard lock(m_mutex);
        m_records.append({pluginId, clientID, requestKind, method, info.urgent, info.timeoutMs,
                          info.commandText, info.relayPath, info.replyCallback});
        return m_accept;
    }

    void setAccept(bool accept)
    {
        std::lock_guard lock(m_mutex);
        m_accept = accept;
    }

    QList<Record> records() const
    {
        std::lock_guard lock(m_mutex);
        return m_records;
    }
    Record last() const
    {
        const QList<Record> all = records();
        return all.value(all.size() - 1);
    }

    // Delivers a reply to the last request on the calling thread.
    void reply(const Reply& r) const { deliver(last(), r); }

    // Delivers a reply to the last request on a new thread and waits for it to finish.
    void replyOnThread(const Reply& r) const
    {
        const Record record = last();
        std::thread([&] { deliver(record, r); }).join();
    }

    static void deliver(const Record& record, const Reply& r)
    {
        record.replyCallback(r.ok, QStringLiteral("ignored"), r.relayPath, r.statusText,
                             r.replyText, r.isLast);
    }

private:
    mutable std::mutex m_mutex;
    QList<Record> m_records;
    bool m_accept = true;
};
