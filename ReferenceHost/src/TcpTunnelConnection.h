#pragma once

#include <IOrvoTunnelClient.h>

#include <QByteArray>
#include <QHash>
#include <QObject>
#include <QString>

#include <atomic>

class PendingWork;
class QTcpSocket;
class QTimer;

// The socket side of TcpTunnelClient. Lives on the client's connection thread: every member
// runs there, so reply callbacks are called on that thread.
class TcpTunnelConnection : public QObject
{
    Q_OBJECT

public:
    struct Request
    {
        qint64 id = 0;
        QString method;
        QString command;
        QString operatorName; // who asked; left out of the frame when empty
        QString relayPath;
        int timeoutMs = 0;
        IOrvoTunnelClient::ReplyCallback callback; // empty: no reply expected
    };

    TcpTunnelConnection(PendingWork& pendingWork, std::atomic<bool>& connected);

    bool connectTo(const QString& host, quint16 port, int timeoutMs, QString* errorMessage);
    void send(const Request& request);
    // Answers what is still pending as failed and closes the socket.
    void close();

private:
    struct Pending
    {
        QString relayPath;
        IOrvoTunnelClient::ReplyCallback callback;
        QTimer* timer = nullptr;
    };

    void readFrames();
    void answer(qint64 id, bool ok, const QString& info, const QString& status,
                const QString& reply);
    void failAll(const QString& reason);

    PendingWork& m_pendingWork;
    std::atomic<bool>& m_connected;
    QTcpSocket* m_socket = nullptr;
    QByteArray m_buffer;
    QHash<qint64, Pending> m_pending;
};
