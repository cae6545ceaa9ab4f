#include "ReferenceHost.h"

#include "EmbeddedTunnelClient.h"
#include "EventHub.h"
#include "HostFramework.h"
#include "HostSession.h"
#include "PluginLoader.h"
#include "TcpTunnelClient.h"

#include <IPluginObjectBase.h>

ReferenceHost::ReferenceHost() = default;

ReferenceHost::~ReferenceHost()
{
    qDeleteAll(m_sessions);
    m_sessions.clear();
    m_framework.reset();
    m_tunnelClient.reset();
    m_server.reset();
    m_loader.reset();
}

bool ReferenceHost::open(const Options& options, QString* errorMessage)
{
    m_eventHub = std::make_unique<EventHub>();
    m_loader = std::make_unique<PluginLoader>();
    if (!m_loader->load(options.pluginPath, errorMessage))
        return false;
    if (!openTunnel(options, errorMessage))
        return false;
    m_tunnelClient->setOperatorLookup([this](void* clientID) { return operatorOf(clientID); });
    m_framework = std::make_unique<HostFramework>(m_tunnelClient.get(), *m_eventHub);
    if (!m_loader->plugin()->InitialPluginBase(m_framework.get())) {
        *errorMessage = QStringLiteral("the plug-in refused to start");
        return false;
    }
    m_session = &session(options.operatorName);
    return true;
}

HostSession& ReferenceHost::session(const QString& operatorName)
{
    {
        QReadLocker locker(&m_sessionsLock);
        if (HostSession* session = m_sessions.value(operatorName))
            return *session;
    }
    QWriteLocker locker(&m_sessionsLock);
    HostSession*& session = m_sessions[operatorName];
    if (!session) {
        session = new HostSession(*m_loader->plugin(), *m_eventHub, *m_tunnelClient, operatorName);
        m_operators.insert(session, operatorName);
    }
    return *session;
}

QString ReferenceHost::operatorOf(void* clientHandle) const
{
    QReadLocker locker(&m_sessionsLock);
    return m_operators.value(clientHandle);
}

bool ReferenceHost::openTunnel(const Options& options, QString* errorMessage)
{
    if (options.serverAddress.isEmpty()) {
        m_server = std::make_unique<AlarmServerSim::AlarmServer>();
        if (!m_server->open(options.embedded, errorMessage))
            return false;
        AlarmServerSim::AlarmServer* server = m_server.get();
        m_tunnelClient = std::make_unique<EmbeddedTunnelClient>(
            [server](const QString& method, const QString& command, const QString& operatorName) {
                return server->execute(method, command, operatorName);
            });
        return true;
    }

    const qsizetype colon = options.serverAddress.lastIndexOf(QLatin1Char(':'));
    bool portOk = false;
    const uint port = options.serverAddress.mid(colon + 1).toUInt(&portOk);
    const QString host =
        colon > 0 ? options.serverAddress.left(colon) : QStringLiteral("127.0.0.1");
    if (!portOk || port == 0 || port > 65535) {
        *errorMessage = QStringLiteral("bad server address \"%1\", expected HOST:PORT")
                            .arg(options.serverAddress);
        return false;
    }
    auto client = std::make_unique<TcpTunnelClient>();
    if (!client->connectToServer(host, quint16(port), options.connectTimeoutMs, errorMessage))
        return false;
    m_tunnelClient = std::move(client);
    return true;
}
