#pragma once

#include "PluginServerTypes.h"

#include <QObject>
#include <QString>
#include <QVariant>

class IFrameworkTools;
class IResponser;
struct RequestSenderInfo;

#define PLUGINSERVER_PLUGIN_IID "com.KELMARO.PluginServer.PluginInterface"

// What every plug-in of the host plug-in server implements. The host takes the instance from
// the library's Qt plug-in entry point, casts it with qobject_cast and starts it with
// InitialPluginBase.
class IPluginObjectBase : public QObject
{
public:
    using QObject::QObject;

    virtual bool InitialPluginBase(IFrameworkTools* tools) = 0;
    virtual void Request(const QString& method, const QVariant& args,
                         const RequestSenderInfo& sender, HDLR_DO_REQUEST_CB reqCB) = 0;
    virtual void RequestBlock(const QString& method, const QVariant& args,
                              const RequestSenderInfo& sender, IResponser& responser) = 0;
    virtual void SubscribeEventBlock(const QString& subscriptionKey, const QString& eventName,
                                     const QVariant& args, const RequestSenderInfo& sender,
                                     IResponser& responser) = 0;
    virtual void UnsubscribeEventBlock(const QString& subscriptionKey, const QVariant& args,
                                       IResponser& responser) = 0;

    virtual void ServerBroadcastingMessage(const QString&, const QString&, const QVariant&) {}
    virtual void AllPluginLoaded() {}
    virtual void ClientConnected(void*) {}
    virtual void ClientDisconnected(void*) {}
    virtual QVariant GetContextForReload() { return QVariant(); }
    virtual void RestoreContextAfterReolad(const QVariant&) {}
};

Q_DECLARE_INTERFACE(IPluginObjectBase, PLUGINSERVER_PLUGIN_IID)
