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

namespace {

struct Reply
{
    bool ok = false;
    QString info;
    QString relayPath;
    QString status;
    QString reply;
    bool isLast = false;
    QThread* thread = nullptr;
};

// Collects reply callbacks from any thread.
class ReplySink
{
public:
    IOrvoTunnelClient::ReplyCallback callback()
    {
        return [this](bool ok, const QString& info, const QString& relayPath, const QString& status,
                      const QString& reply, bool isLast) {
            QMutexLocker locker(&m_mutex);
            m_replies.append(
                Reply{ok, info, relayPath, status, reply, isLast, QThread::currentThread()});
        };
    }
    QList<Reply> replies()
    {
        QMutexLocker locker(&m_mutex);
        return m_replies;
    }
    qsizetype count() { return replies().size(); }

private:
    QMutex m_mutex;
    QList<Reply> m_replies;
};

IOrvoTunnelClient::InsertRequestInfo requestInfo(const QString& command, const QString& relayPath,
                                                 IOrvoTunnelClient::ReplyCallback callback,
                                                 int timeoutMs = 15000)
{
    IOrvoTunnelClient::InsertRequestInfo info;
    info.commandText = command;
    info.relayPath = relayPath;
    info.replyCallback = std::move(callback);
    info.timeoutMs = timeoutMs;
    return info;
}

// The server end of one tunnel connection, driven from the test thread.
class FakeServer
{
public:
    FakeServer() { QVERIFY(m_server.listen(QHostAddress::LocalHost)); }
    quint16 port() const { return m_server.serverPort(); }

    bool accept()
    {
        if (!m_server.waitForNewConnection(5000))
            return false;
        m_socket.reset(m_server.nextPendingConnection());
        return true;
    }
    QList<QJsonObject> waitForFrames(qsizetype count)
    {
        while (m_frames.size() < count && m_socket->waitForReadyRead(5000)) {
            m_buffer += m_socket->readAll();
            QString error;
            AlarmServerSim::takeFrames(m_buffer, m_frames, &error);
        }
        return m_frames;
    }
    void reply(qint64 id, const QString& status, const QString& reply)
    {
        m_socket->write(AlarmServerSim::encodeFrame(QJsonObject{{QStringLiteral("id"), id},
                                                                {QStringLiteral("status"), status},
                                                                {QStringLiteral("reply"), reply}}));
        m_socket->waitForBytesWritten(5000);
    }
    void disconnectClient()
    {
        m_socket->disconnectFromHost();
        if (m_socket->state() != QAbstractSocket::UnconnectedState)
            m_socket->waitForDisconnected(5000);
    }

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
    void embeddedRepliesOnPoolThread()
    {
        QMutex mutex;
        QStringList executed;
        ReplySink sink;
        {
            EmbeddedTunnelClient client([&](const QString& method, const QString& command,
                                            const QString&) {
                QMutexLocker locker(&mutex);
                executed.append(method + QLatin1Char('|') + command);
                return AlarmServerSim::CommandReply{QStringLiteral("0"), QStringLiteral("<R/>")};
            });
            auto withReply =
                requestInfo(QStringLiteral("<Q/>"), QStringLiteral("relay/1"), sink.callback());
            QVERIFY(client.InsertRequest(QStringLiteral("P"), this,
                                         IOrvoTunnelClient::RequestWithReply,
                                         QStringLiteral("QryAlarmList"), withReply));
            auto noReply = requestInfo(QStringLiteral("<M/>"), QString(), sink.callback());
            QVERIFY(client.InsertRequest(QStringLiteral("P"), this,
                                         IOrvoTunnelClient::RequestNoReply,
                                         QStringLiteral("MuteAlarm"), noReply));
            QVERIFY(client.waitForIdle(5000));
        }
        executed.sort();
        QCOMPARE(executed, (QStringList{QStringLiteral("MuteAlarm|<M/>"),
                                        QStringLiteral("QryAlarmList|<Q/>")}));
        const QList<Reply> replies = sink.replies();
        QCOMPARE(replies.size(), 1);
        QVERIFY(replies[0].ok);
        QCOMPARE(replies[0].info, QString());
        QCOMPARE(replies[0].relayPath, QStringLiteral("relay/1"));
        QCOMPARE(replies[0].status, QStringLiteral("0"));
        QCOMPARE(replies[0].reply, QStringLiteral("<R/>"));
        QVERIFY(replies[0].isLast);
        QVERIFY(replies[0].thread != QThread::currentThread());
    }

    void embeddedRefusesMalformedRequests_data()
    {
        QTest::addColumn<int>("kind");
        QTest::addColumn<bool>("withCallback");
        QTest::newRow("unknown kind") << 3 << true;
        QTest::newRow("reply kind without callback") << 4 << false;
    }

    void embeddedRefusesMalformedRequests()
    {
        QFETCH(int, kind);
        QFETCH(bool, withCallback);
        int executions = 0;
        ReplySink sink;
        EmbeddedTunnelClient client([&](const QString&, const QString&, const QString&) {
            ++executions;
            return AlarmServerSim::CommandReply();
        });
        auto info =
            requestInfo(QStringLiteral("<Q/>"), QString(),
                        withCallback ? sink.callback() : IOrvoTunnelClient::ReplyCallback());
        QVERIFY(!client.InsertRequest(QStringLiteral("P"), this, kind, QStringLiteral("X"), info));
        QVERIFY(client.waitForIdle(5000));
        QCOMPARE(executions, 0);
    }

    void embeddedDestructionWaitsForPendingReplies()
    {
        ReplySink sink;
        {
            EmbeddedTunnelClient client([](const QString&, const QString&, const QString&) {
                QThread::msleep(20);
                return AlarmServerSim::CommandReply{QStringLiteral("0"), QString()};
            });
            for (int i = 0; i < 8; ++i) {
                auto info = requestInfo(QString(), QString(), sink.callback());
                QVERIFY(
                    client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("X"), info));
            }
        }
        QCOMPARE(sink.count(), 8);
    }

    void tcpMatchesRepliesById()
    {
        FakeServer server;
        TcpTunnelClient client;
        QString error;
        QVERIFY2(client.connectToServer(QStringLiteral("127.0.0.1"), server.port(), 5000, &error),
                 qPrintable(error));
        QVERIFY(server.accept());
        ReplySink sink;
        auto first = requestInfo(QStringLiteral("<A/>"), QStringLiteral("r1"), sink.callback());
        auto mute = requestInfo(QStringLiteral("<M/>"), QString(), sink.callback());
        auto second = requestInfo(QStringLiteral("<B/>"), QStringLiteral("r2"), sink.callback());
        QVERIFY(client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("QryAlarmList"),
                                     first));
        QVERIFY(
            client.InsertRequest(QStringLiteral("P"), this, 2, QStringLiteral("MuteAlarm"), mute));
        QVERIFY(client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("GetAlarmInfo"),
                                     second));
        const QList<QJsonObject> frames = server.waitForFrames(3);
        QCOMPARE(frames.size(), 3);
        QCOMPARE(frames[0].value(QLatin1String("method")).toString(),
                 QStringLiteral("QryAlarmList"));
        QCOMPARE(frames[0].value(QLatin1String("command")).toString(), QStringLiteral("<A/>"));
        QCOMPARE(frames[1].value(QLatin1String("method")).toString(), QStringLiteral("MuteAlarm"));
        QCOMPARE(frames[2].value(QLatin1String("command")).toString(), QStringLiteral("<B/>"));

        // Answer out of order: the second request first.
        server.reply(frames[2].value(QLatin1String("id")).toInteger(), QStringLiteral("0"),
                     QStringLiteral("<BRes/>"));
        server.reply(frames[0].value(QLatin1String("id")).toInteger(), QStringLiteral("80000001"),
                     QString());
        QVERIFY(client.waitForIdle(5000));
        const QList<Reply> replies = sink.replies();
        QCOMPARE(replies.size(), 2);
        QCOMPARE(replies[0].relayPath, QStringLiteral("r2"));
        QCOMPARE(replies[0].reply, QStringLiteral("<BRes/>"));
        QCOMPARE(replies[1].relayPath, QStringLiteral("r1"));
        QCOMPARE(replies[1].status, QStringLiteral("80000001"));
        for (const Reply& reply : replies) {
            QVERIFY(reply.ok);
            QVERIFY(reply.isLast);
            QVERIFY(reply.thread != QThread::currentThread());
        }
    }

    void tcpFailsPendingAndRefusesAfterDisconnect()
    {
        FakeServer server;
        TcpTunnelClient client;
        QString error;
        QVERIFY(client.connectToServer(QStringLiteral("127.0.0.1"), server.port(), 5000, &error));
        QVERIFY(server.accept());
        ReplySink sink;
        auto info = requestInfo(QStringLiteral("<A/>"), QStringLiteral("r1"), sink.callback());
        QVERIFY(client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("QryAlarmList"),
                                     info));
        QCOMPARE(server.waitForFrames(1).size(), 1);
        server.disconnectClient();
        QVERIFY(client.waitForIdle(5000));
        const QList<Reply> replies = sink.replies();
        QCOMPARE(replies.size(), 1);
        QVERIFY(!replies[0].ok);
        QVERIFY(!replies[0].info.isEmpty());
        QCOMPARE(replies[0].relayPath, QStringLiteral("r1"));
        QVERIFY(replies[0].isLast);

        auto refused = requestInfo(QStringLiteral("<A/>"), QString(), sink.callback());
        QVERIFY(!client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("QryAlarmList"),
                                      refused));
        QCOMPARE(sink.count(), 1);
    }

    void tcpAnswersUnansweredRequestAsFailedAfterItsTimeout()
    {
        FakeServer server;
        TcpTunnelClient client;
        QString error;
        QVERIFY(client.connectToServer(QStringLiteral("127.0.0.1"), server.port(), 5000, &error));
        QVERIFY(server.accept());
        ReplySink sink;
        auto info = requestInfo(QStringLiteral("<A/>"), QString(), sink.callback(), 50);
        QVERIFY(client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("QryAlarmList"),
                                     info));
        QVERIFY(client.waitForIdle(10000));
        QCOMPARE(sink.count(), 1);
        QVERIFY(!sink.replies()[0].ok);
    }

    void tcpConnectFailureIsReported()
    {
        quint16 closedPort = 0;
        {
            QTcpServer probe;
            QVERIFY(probe.listen(QHostAddress::LocalHost));
            closedPort = probe.serverPort();
        }
        TcpTunnelClient client;
        QString error;
        QVERIFY(!client.connectToServer(QStringLiteral("127.0.0.1"), closedPort, 5000, &error));
        QVERIFY2(error.startsWith(QStringLiteral("cannot reach the alarm server at 127.0.0.1:")),
                 qPrintable(error));
        ReplySink sink;
        auto info = requestInfo(QString(), QString(), sink.callback());
        QVERIFY(!client.InsertRequest(QStringLiteral("P"), this, 4, QStringLiteral("X"), info));
    }
};

QTEST_GUILESS_MAIN(TestTunnelClients)
#include "tst_tunnelclients.moc"
