#pragma once

#include <QTcpServer>
#include <QThreadPool>

namespace AlarmServerSim {

class AlarmServer;

// Serves an AlarmServer on 127.0.0.1 with the framing of TcpFrame.h. Handles several
// connections; commands run on a thread pool, and each connection gets its replies in the order
// of its requests.
class TcpAlarmServer : public QTcpServer
{
    Q_OBJECT

public:
    explicit TcpAlarmServer(AlarmServer& server, QObject* parent = nullptr);
    ~TcpAlarmServer() override;

    // Listens on 127.0.0.1:port (0: any free port, see serverPort()).
    bool listenOnLoopback(quint16 port);

protected:
    void incomingConnection(qintptr socketDescriptor) override;

private:
    AlarmServer& m_server;
    QThreadPool m_pool;
};

} // namespace AlarmServerSim
