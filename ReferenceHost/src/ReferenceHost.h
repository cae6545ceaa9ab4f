#pragma once

#include <AlarmServer.h>

#include <QHash>
#include <QReadWriteLock>
#include <QString>

#include <memory>

class EmbeddedTunnelClient;
class EventHub;
class HostFramework;
class HostSession;
class HostTunnelClient;
class PluginLoader;

// A complete host around one plug-in file: loads the plug-in, gives it a tunnel client (to an
// in-process alarm server or to one reached over TCP), starts it and offers client sessions, one
// per operator; each command carries its session's operator name to the server. Only one
// ReferenceHost per plug-in file may be open at a time: the plug-in instance is one per process.
class ReferenceHost
{
public:
    struct Options
    {
        QString pluginPath;
        QString serverAddress;                         // "host:port"; empty: embedded server
        AlarmServerSim::AlarmServer::Options embedded; // used without serverAddress
        int connectTimeoutMs = 5000;
        QString operatorName = AlarmServerSim::AlarmServer::kDefaultOperator; // of session()
    };

    ReferenceHost();
    ~ReferenceHost();
    ReferenceHost(const ReferenceHost&) = delete;
    ReferenceHost& operator=(const ReferenceHost&) = delete;

    bool open(const Options& options, QString* errorMessage);

    HostSession& session() { return *m_session; }
    // The session of an operator, made on first use; it lives as long as the host. Thread-safe.
    HostSession& session(const QString& operatorName);
    HostTunnelClient& tunnelClient() { return *m_tunnelClient; }

private:
    bool openTunnel(const Options& options, QString* errorMessage);
    QString operatorOf(void* clientHandle) const;

    // The destructor tears down in a fixed order: the session, then the tunnel client, which
    // delivers its last replies while the plug-in and the event hub still live, then the plug-in.
    std::unique_ptr<EventHub> m_eventHub;
    std::unique_ptr<PluginLoader> m_loader;
    std::unique_ptr<AlarmServerSim::AlarmServer> m_server;
    std::unique_ptr<HostTunnelClient> m_tunnelClient;
    std::unique_ptr<HostFramework> m_framework;
    HostSession* m_session = nullptr;
    mutable QReadWriteLock m_sessionsLock;
    QHash<QString, HostSession*> m_sessions; // owned; by operator name
    QHash<void*, QString> m_operators;       // by client handle
};
