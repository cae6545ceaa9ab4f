#include <EmbeddedTunnelClient.h>
#include <TcpFrame.h>
#include <TcpTunnelClient.h>

#include <QJsonObject>
#include <QMutex>
#include <QTcpServer>
#include <QTcpSocket>
#include <QThread>
#include <QtTest>

#include <memory>

using namespace Qt::StringLiterals;

namespace {

constexpr int kWithReply = IOrvoTunnelClient::RequestWithReply;
constexpr int kNoReply = IOrvoTunnelClient::RequestNoReply;

// Sends requests and records each reply callback, from any thread, as one line:
// "ok|relay path|status|reply|last|thread" ("failed, why" when ok is false and info explains).
class ReplySink
{
public:
    bool send(IOrvoTunnelClient& client, int kind, const QString& method, const QString& command,
              const QString& relayPath = QString(), int timeoutMs = 15000)
    {
        IOrvoTunnelClient::InsertRequestInfo info;
        info.commandText = command;
        info.relayPath = relayPath;
        info.timeoutMs = timeoutMs;
        info.replyCallback = [this, caller = QThread::currentThread()](
                                 bool ok, const QString& why, const QString& relayPath,
                                 const QString& status, const QString& reply, bool isLast) {
            QMutexLocker locker(&m_mutex);
            m_replies.append(
                QStringList{ok              ? u"ok"_s
                            : why.isEmpty() ? u"failed"_s
                                            : u"failed, why"_s,
                            relayPath, status, reply, isLast ? u"last"_s : u"more"_s,
                            QThread::currentThread() == caller ? u"caller"_s : u"pool"_s}
                    .join(u'|'));
        };
        return client.InsertRequest(u"P"_s, nullptr, kind, method, info);
    }
    QStringList replies()
    {
        QMutexLocker locker(&m_mutex);
        return m_replies;
    }

private:
    QMutex m_mutex;
    QStringList m_replies;
};

// The server end of one tunnel connection, driven from the test thread.
class FakeServer
{
public:
    FakeServer()
    {
        QVERIFY(m_server.listen(QHostAddress::LocalHost));
        QString error;
        QVERIFY2(client.connectToServer(u"127.0.0.1"_s, m_server.serverPort(), 5000, &error),
                 qPrintable(error));
        QVERIFY(m_server.waitForNewConnection(5000));
        m_socket.reset(m_server.nextPendingConnection());
    }
    QList<QJsonObject> waitForFrames(qsizetype count)
    {
        while (m_frames.size() < count && m_socket->waitForReadyRead(5000)) {
            m_buffer += m_socket->readAll();
            AlarmServerSim::takeFrames(m_buffer, m_frames, nullptr);
        }
        return m_frames;
    }
    void reply(const QJsonObject& request, const QString& status, const QString& reply)
    {
        m_socket->write(AlarmServerSim::encodeFrame(
            {{"id", request.value("id")}, {"status", status}, {"reply", reply}}));
        m_socket->waitForBytesWritten(5000);
    }
    void disconnectClient()
    {
        m_socket->disconnectFromHost();
        if (m_socket->state() != QAbstractSocket::UnconnectedState)
            m_socket->waitForDisconnected(5000);
    }

    TcpTunnelClient client;

private:
    QTcpServer m_server;
    std::unique_ptr<QTcpSocket> m_socket;
    QByteArray m_buffer;
    QList<QJsonObject> m_frames;
};

} // namespace

class TestTunnelClients : public QObject
{
    Q_OBJECT

private slots:
    // Commands run on pool threads; malformed requests are refused unrun; destruction waits for
    // the replies still pending.
    void embedded()
    {
        QMutex mutex;
        QStringList executed;
        ReplySink sink;
        {
            EmbeddedTunnelClient client(
                [&](const QString& method, const QString& command, const QString&) {
                    QThread::msleep(20);
                    QMutexLocker locker(&mutex);
                    executed.append(method + u'|' + command);
                    return AlarmServerSim::CommandReply{u"0"_s, u"<R/>"_s};
                });
            for (int i = 0; i < 8; ++i) // more than the pool has threads
                QVERIFY(sink.send(client, kWithReply, u"QryAlarmList"_s, u"<Q/>"_s, u"relay/1"_s));
            QVERIFY(sink.send(client, kNoReply, u"MuteAlarm"_s, u"<M/>"_s));
            QVERIFY(!sink.send(client, 3, u"X"_s, u"<X/>"_s));
            IOrvoTunnelClient::InsertRequestInfo noCallback;
            QVERIFY(!client.InsertRequest(u"P"_s, nullptr, kWithReply, u"X"_s, noCallback));
        }
        executed.sort();
        QCOMPARE(executed,
                 QStringList{u"MuteAlarm|<M/>"_s} + QStringList(8, u"QryAlarmList|<Q/>"_s));
        QCOMPARE(sink.replies(), QStringList(8, u"ok|relay/1|0|<R/>|last|pool"_s));
    }

    // Replies are matched by id; an unanswered request fails after its own timeout; a lost
    // connection fails what is pending and refuses what comes after.
    void tcp()
    {
        FakeServer server;
        ReplySink sink;
        QVERIFY(sink.send(server.client, kWithReply, u"QryAlarmList"_s, u"<A/>"_s, u"r1"_s));
        QVERIFY(sink.send(server.client, kNoReply, u"MuteAlarm"_s, u"<M/>"_s));
        QVERIFY(sink.send(server.client, kWithReply, u"GetAlarmInfo"_s, u"<B/>"_s, u"r2"_s));
        // The frames' contents are the simulator's to read (tst_integration, tcp).
        const QList<QJsonObject> frames = server.waitForFrames(3);
        QCOMPARE(frames.size(), 3);
        // Answered out of order: the second request first.
        server.reply(frames[2], u"0"_s, u"<BRes/>"_s);
        server.reply(frames[0], u"80000001"_s, QString());
        QVERIFY(server.client.waitForIdle(5000));

        QVERIFY(sink.send(server.client, kWithReply, u"QryAlarmList"_s, u"<C/>"_s, QString(), 50));
        QVERIFY(server.client.waitForIdle(10000));
        QVERIFY(sink.send(server.client, kWithReply, u"QryAlarmList"_s, u"<D/>"_s, u"r3"_s));
        QCOMPARE(server.waitForFrames(5).size(), 5);
        server.disconnectClient();
        QVERIFY(server.client.waitForIdle(5000));
        QVERIFY(!sink.send(server.client, kWithReply, u"QryAlarmList"_s, u"<E/>"_s));
        QVERIFY(server.client.connectionError().endsWith(u" lost"_s));
        const QStringList replies = sink.replies();
        QCOMPARE(replies.size(), 4);
        QCOMPARE(replies.mid(0, 2),
                 (QStringList{u"ok|r2|0|<BRes/>|last|pool"_s, u"ok|r1|80000001||last|pool"_s}));
        QVERIFY2(replies[2].startsWith(u"failed"_s), qPrintable(replies[2]));
        QVERIFY2(replies[3].startsWith(u"failed, why|r3||"_s), qPrintable(replies[3]));
        QVERIFY(replies[3].endsWith(u"|last|pool"_s));
    }
};

QTEST_GUILESS_MAIN(TestTunnelClients)
#include "tst_tunnelclients.moc"
