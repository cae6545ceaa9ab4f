// Many threads at once: replies of every kind delivered from several threads while subscriptions
// come and go, and a plug-in deleted while its replies are still being delivered.

#include "support/FakeHost.h"

#include <PluginAlarmSearchCommon.h>
#include <PluginAlarmSearchSrv.h>
#include <RequestSenderInfo.h>

#include <QSet>
#include <QtTest>

#include <algorithm>
#include <atomic>
#include <memory>
#include <thread>
#include <vector>

using namespace PluginAlarmSearchCommon;

namespace {

enum class Kind { Query, Update, History };
enum class Outcome { Accepted, Rejected, Unparseable };

// Request i asks for kind i % 3 and gets a reply of outcome (i / 3) % 3, so every pairing occurs.
const auto kindOf = [](int i) { return Kind(i % 3); };
const auto outcomeOf = [](int i) { return Outcome((i / 3) % 3); };

const QString permanentKey = QStringLiteral("permanent");
const QString rejectedStatus = QStringLiteral("80000000");

// Delivers request i's reply, of its kind and outcome.
void deliver(const QList<FakeTunnelClient::Record>& records, int i)
{
    const char* const accepted[] = {
        "<QryAlarmListRes><Alarm><ID>1</ID></Alarm></QryAlarmListRes>",
        "<ProcessAlarmRes><Result><AlarmID>A1</AlarmID><Code>0</Code></Result><Result><AlarmID>A2"
        "</AlarmID><Code>1</Code></Result></ProcessAlarmRes>",
        "<GetAlarmInfoRes><Alarm><ChangeLogs><Entry><Note>n</Note></Entry></ChangeLogs></Alarm>"
        "</GetAlarmInfoRes>"};
    FakeTunnelClient::Reply reply{true, records.at(i).relayPath, "0",
                                  QString::fromUtf8(accepted[int(kindOf(i))]), true};
    if (outcomeOf(i) == Outcome::Rejected)
        reply.statusText = rejectedStatus;
    else if (outcomeOf(i) == Outcome::Unparseable)
        reply.replyText = QStringLiteral("<ProcessAlarmRes><Result>");
    FakeTunnelClient::deliver(records.at(i), reply);
}

// The answer code a reply of this kind and outcome must produce.
QString expectedCode(Kind kind, Outcome outcome)
{
    if (kind == Kind::Query) // the server's status text, whatever became of the reply
        return outcome == Outcome::Rejected ? rejectedStatus : QStringLiteral("0");
    return outcome == Outcome::Accepted ? QStringLiteral("0") : QStringLiteral("-1");
}

// Records what the plug-in hands back, per request; requests are told apart by relay path,
// which is the request's index. Read the fields under the mutex.
struct Tally
{
    explicit Tally(int requests) { answers.resize(requests); }

    HDLR_DO_REQUEST_CB answerSink(int index)
    {
        return [this, index](bool, const QString& code, const QString&, const QVariant&) {
            std::lock_guard lock(mutex);
            answers[index].append(code);
            if (kindOf(index) == Kind::Update && pluginDeleted)
                ++updateAnswersAfterDeletion;
        };
    }

    HDLR_EVENT_SIGNAL_CB eventSink()
    {
        return [this](const PluginObjBase_EventSignalInfo* info) {
            const QVariantMap data = info->eventData.toMap();
            const int index = data.value(ARG_RELAY_PATH).toString().toInt();
            std::lock_guard lock(mutex);
            const bool understoodUpdate =
                kindOf(index) == Kind::Update && outcomeOf(index) == Outcome::Accepted;
            if (!understoodUpdate || !everSubscribed.contains(info->subscriptionKey) ||
                data.value(ARG_ALARM_UPDATED_RESULTS).toList().size() != 2 || pluginDeleted)
                ++badEvents;
            if (info->subscriptionKey == permanentKey)
                permanentEvents.append(index);
        };
    }

    std::mutex mutex;
    QList<QStringList> answers;
    QList<int> permanentEvents;
    int badEvents = 0;
    int updateAnswersAfterDeletion = 0;
    QSet<QString> everSubscribed; // a key enters before it is subscribed
    bool pluginDeleted = false;
};

// A started plug-in whose host events go to the tally, with the given requests pending.
struct Storm
{
    FakeHost host;
    Tally tally;
    std::unique_ptr<PluginAlarmSearchSrv> plugin = std::make_unique<PluginAlarmSearchSrv>();

    explicit Storm(int requests) : tally(requests)
    {
        host.eventSignal = tally.eventSink();
        plugin->InitialPluginBase(&host);
        subscribe(permanentKey);
        const QString methods[] = {METHOD_QUERY_ALARM_LIST, METHOD_UPDATE_ALARM,
                                   METHOD_GET_ALARM_HISTORY};
        for (int i = 0; i < requests; ++i) {
            const QVariantMap args{{ARG_RELAY_PATH, QString::number(i)},
                                   {ARG_ALARM_ID_LIST, QStringList{"A1"}},
                                   {ARG_ALARM_ID, "A1"}};
            plugin->Request(methods[int(kindOf(i))], args, {}, tally.answerSink(i));
        }
    }

    void subscribe(const QString& key)
    {
        {
            std::lock_guard lock(tally.mutex);
            tally.everSubscribed.insert(key);
        }
        UntouchedResponser responser;
        plugin->SubscribeEventBlock(key, EVENT_ALARM_UPDATED, {}, {}, responser);
    }
};

// Runs work(thread) on each of count threads and waits for all of them.
template <typename Work> void onThreads(int count, Work work)
{
    std::vector<std::thread> threads;
    threads.reserve(count);
    for (int t = 0; t < count; ++t)
        threads.emplace_back(work, t);
    for (std::thread& thread : threads)
        thread.join();
}

constexpr int Deliverers = 8;

} // namespace

class TestStorm : public QObject
{
    Q_OBJECT

private slots:
    void repliesWhileSubscriptionsChange()
    {
        constexpr int Requests = 10000;
        Storm storm(Requests);
        const QList<FakeTunnelClient::Record> records = storm.host.tunnel.records();
        QCOMPARE(records.size(), Requests);

        std::atomic<bool> delivering{true};
        std::thread subscriber([&] {
            const QStringList keys{"k0", "k1", "k2", "k3"};
            for (int n = 0; delivering.load(); ++n) {
                storm.subscribe(keys.at(n % 4));
                UntouchedResponser responser;
                storm.plugin->UnsubscribeEventBlock(keys.at((n + 2) % 4), {}, responser);
                storm.plugin->UnsubscribeEventBlock("never subscribed", {}, responser);
            }
        });
        onThreads(Deliverers, [&](int thread) {
            for (int i = thread; i < Requests; i += Deliverers)
                deliver(records, i);
        });
        delivering = false;
        subscriber.join();

        // Every reply produced exactly one answer, with the code its kind and outcome call for.
        // All threads are joined: the tally is read without its lock.
        const Tally& counts = storm.tally;
        const QList<QStringList>& answers = counts.answers;
        QList<int> understoodUpdates;
        for (int i = 0; i < Requests; ++i) {
            QCOMPARE(answers.at(i), QStringList{expectedCode(kindOf(i), outcomeOf(i))});
            if (kindOf(i) == Kind::Update && outcomeOf(i) == Outcome::Accepted)
                understoodUpdates.append(i);
        }
        // Events came only for understood updates, and the key that stayed subscribed throughout
        // saw each of them exactly once.
        QCOMPARE(counts.badEvents, 0);
        QList<int> permanentEvents = counts.permanentEvents;
        std::sort(permanentEvents.begin(), permanentEvents.end());
        QCOMPARE(permanentEvents, understoodUpdates);
    }

    void deletionWithRepliesPending()
    {
        constexpr int Requests = 600;
        Storm storm(Requests);
        const QList<FakeTunnelClient::Record> records = storm.host.tunnel.records();

        // Four threads deliver the replies, the first half before the plug-in is deleted and the
        // rest while or after it goes.
        std::atomic<int> delivered{0};
        std::thread deleter([&] {
            while (delivered.load() < Requests / 2)
                std::this_thread::yield();
            storm.plugin.reset();
            std::lock_guard lock(storm.tally.mutex);
            storm.tally.pluginDeleted = true;
        });
        const auto deliverAll = [&](int thread) {
            for (int i = thread; i < Requests; i += 4, ++delivered)
                deliver(records, i);
        };
        onThreads(4, deliverAll);
        deleter.join();
        onThreads(4, deliverAll); // late replies once more, all after the deletion

        // Queries and history reads need nothing of the plug-in and are answered every time;
        // an update is answered at most once, never after the deletion, and publishes nothing
        // then.
        const Tally& counts = storm.tally;
        const QList<QStringList>& answers = counts.answers;
        for (int i = 0; i < Requests; ++i) {
            if (kindOf(i) == Kind::Update)
                QVERIFY(answers.at(i).size() <= 1);
            else
                QCOMPARE(answers.at(i).size(), 2);
        }
        QCOMPARE(counts.updateAnswersAfterDeletion, 0);
        QCOMPARE(counts.badEvents, 0);
    }
};

QTEST_GUILESS_MAIN(TestStorm)
#include "tst_storm.moc"
