#pragma once

#include <QList>
#include <QPointer>
#include <QTcpServer>

class RequestGuard;

// The listening socket of the HTTP server. Qt HTTP Server 6.4 reads a request's whole body into
// memory before any handler sees it, with no limit; so each connection gets a guard that reads
// the request heads in the byte stream before the HTTP server does and answers a request whose
// body would be larger than the cap with 413 (or a head over 16 KiB with 431, a body of unknown
// length with 411), then closes the connection, so that such a body is never buffered.
class GuardedTcpServer : public QTcpServer
{
    Q_OBJECT

public:
    explicit GuardedTcpServer(qint64 maxBodyBytes, QObject* parent = nullptr);

    // To be called once the HTTP server has been bound to this server: the guards then also
    // see what the HTTP server leaves unread.
    void followHttpServer();

protected:
    void incomingConnection(qintptr socketDescriptor) override;

private:
    qint64 m_maxBodyBytes;
    QList<QPointer<RequestGuard>> m_fresh;
};
