// sdkhost PLUGIN-FILE: loads the plug-in, gives it a tunnel client that answers every request
// with a one-alarm list, serves one client search and prints what the tunnel and the client saw.

#include <IFrameworkTools.h>
#include <IOrvoTunnelClient.h>
#include <IPluginObjectBase.h>
#include <PluginObjBase_EventInfo.h>
#include <RequestSenderInfo.h>

#include <QCoreApplication>
#include <QJsonObject>
#include <QPluginLoader>

#include <cstdio>
#include <utility>

namespace {

// Keeps each request's reply callback and answers it once the request call has returned.
class StubTunnelClient : public IOrvoTunnelClient
{
public:
    bool InsertRequest(const QString& pluginId, void*, int requestKind, const QString& method,
                       InsertRequestInfo& info) override
    {
        std::printf("tunnel: %s %s\n", qPrintable(pluginId), qPrintable(method));
        if (requestKind == RequestWithReply)
            m_pending.append(info.replyCallback);
        return true;
    }

    void answerAll()
    {
        for (const ReplyCallback& reply : std::exchange(m_pending, {}))
            reply(true, QString(), QString(), QStringLiteral("0"),
                  QStringLiteral("<QryAlarmListRes><Alarm><AlarmID>A1</AlarmID></Alarm>"
                                 "</QryAlarmListRes>"),
                  true);
    }

private:
    QList<ReplyCallback> m_pending;
};

class StubFramework : public IFrameworkTools
{
public:
    IOrvoTunnelClient* GetTunnelClient() override { return &tunnel; }
    HDLR_EVENT_SIGNAL_CB& GetEventSignalFunc() override { return m_events; }

    StubTunnelClient tunnel;

private:
    HDLR_EVENT_SIGNAL_CB m_events = [](const PluginObjBase_EventSignalInfo*) {};
};

} // namespace

int main(int argc, char* argv[])
{
    QCoreApplication app(argc, argv);
    if (argc != 2) {
        std::fprintf(stderr, "usage: sdkhost PLUGIN-FILE\n");
        return 2;
    }
    QPluginLoader loader(QString::fromLocal8Bit(argv[1]));
    auto* plugin = qobject_cast<IPluginObjectBase*>(loader.instance());
    if (!plugin) {
        std::fprintf(stderr, "cannot load %s: %s\n", argv[1], qPrintable(loader.errorString()));
        return 1;
    }
    std::printf("plug-in: %s\n", qPrintable(loader.metaData()
                                                .value(QLatin1String("MetaData"))
                                                .toObject()
                                                .value(QLatin1String("PluginID"))
                                                .toString()));

    StubFramework framework;
    plugin->InitialPluginBase(&framework);
    plugin->Request(QStringLiteral("QryAlarmList"), QVariantMap(), RequestSenderInfo(),
                    [](bool isLast, const QString& code, const QString&, const QVariant& result) {
                        QStringList ids;
                        for (const QVariant& alarm :
                             result.toMap().value(QStringLiteral("queryResult")).toList())
                            ids.append(alarm.toMap().value(QStringLiteral("AlarmID")).toString());
                        std::printf("answer: last=%d code=%s alarms=%s\n", isLast, qPrintable(code),
                                    qPrintable(ids.join(QLatin1Char(','))));
                    });
    framework.tunnel.answerAll();
    delete plugin;
    return 0;
}
