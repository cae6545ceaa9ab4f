#pragma once

#include <QTcpServer>
#include <QThreadPool>
#include <QTimer>

namespace AlarmServerSim {

class AlarmServer;

// Serves an AlarmServer on 127.0.0.1 with the framing of TcpFrame.h. Handles several
// connections; commands run on a thread pool, and each connection gets its replies in the order
// of its requests.
//
// Bounded against clients that misbehave: a connection past maxConnections() is closed at once,
// as is one that would leave fewer than ReservedDescriptors file descriptors free for the
// database and the threads;
// a request frame longer than MaxRequestPayload drops its connection; a connection whose
// requests run or whose replies wait unsent beyond MaxRequestsInProgress or MaxUnsentBytes is
// not read from until they drain (the client's writes then block), so a client that sends
// without reading holds a bounded amount of memory. When the process runs out of file
// descriptors all the same, it stops accepting for a while, backing off up to one second, and
// keeps serving the connections it has: its pool threads are started up front and kept, since a
// thread that cannot get descriptors for its event dispatcher aborts the process.
class TcpAlarmServer : public QTcpServer
{
    Q_OBJECT

public:
    static constexpr int DefaultMaxConnections = 32;
    static constexpr qint64 MaxRequestPayload = 4 * 1024 * 1024;
    static constexpr int MaxRequestsInProgress = 4;
    static constexpr qint64 MaxUnsentBytes = 4 * 1024 * 1024;
    static constexpr int ReservedDescriptors = 32;

    explicit TcpAlarmServer(AlarmServer& server, QObject* parent = nullptr);
    ~TcpAlarmServer() override;

    // Listens on 127.0.0.1:port (0: any free port, see serverPort()).
    bool listenOnLoopback(quint16 port);

    int maxConnections() const { return m_maxConnections; }
    void setMaxConnections(int count) { m_maxConnections = count; }

protected:
    void incomingConnection(qintptr socketDescriptor) override;

private:
    void backOffAccepting(QAbstractSocket::SocketError error);
    int connectionLimit() const;

    AlarmServer& m_server;
    QThreadPool m_pool;
    int m_maxConnections = DefaultMaxConnections;
    int m_connections = 0;
    QTimer m_acceptRetry;
    int m_acceptDelayMs = 0;
};

} // namespace AlarmServerSim
