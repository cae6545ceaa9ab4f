#pragma once

#include <IOrvoTunnelClient.h>

#include <QList>
#include <QMap>
#include <QSharedPointer>
#include <QString>
#include <QVariant>

#include <functional>

class MessageComposer;

// The plug-in's road to the management server: has each command composed, hands it to the
// host's tunnel client and turns the reply into variants for the caller's completion.
//
// The reply readers are static: a reply callback holds only its own copy of the completion, so
// the tunnel client may call it from any thread, any number of times, even after this object
// is gone. Its virtual operations are the whole of its vtable, in this order, for controls built
// elsewhere; owners hold it through a QSharedPointer, which deletes a derived control as what it
// was created as.
class ORVOSrvTunnelControl
{
public:
    // reply understood, last-reply flag, alarm maps, server status text, relay path
    using QueryAlarmCompletion =
        std::function<void(bool ok, bool isLast, const QVariant& result, const QString& statusText,
                           const QString& relayPath)>;
    // reply understood, last-reply flag, result, relay path
    using ReplyCompletion =
        std::function<void(bool ok, bool isLast, const QVariant& result, const QString& relayPath)>;

    explicit ORVOSrvTunnelControl(IOrvoTunnelClient* client);

    void setMessageComposer(QSharedPointer<MessageComposer> composer);

    // Hands a command that awaits a reply to the tunnel client; false when it was refused (also
    // when there is no tunnel client).
    bool sendCommand(void* clientID, const QString& method,
                     IOrvoTunnelClient::InsertRequestInfo& info);

    virtual bool queryAlarm(void* clientID, const QVariant& args, QueryAlarmCompletion completion);
    virtual bool processAlarm(void* clientID, const QMap<QString, QVariant>& args,
                              ReplyCompletion completion);
    virtual bool getAlarmInfo(void* clientID, const QString& alarmId, const QString& relayPath,
                              ReplyCompletion completion);
    virtual void muteAlarm(void* clientID, const QList<QString>& ids, bool mute, int interval);

    // Reply readers, reached through the reply callbacks the operations above hand over.
    static void queryAlarmCB(bool ok, const QString& relayPath, const QString& statusText,
                             const QString& replyText, bool isLast,
                             const QueryAlarmCompletion& completion);
    static void processAlarmCB(bool ok, const QString& relayPath, const QString& statusText,
                               const QString& replyText, bool isLast,
                               const ReplyCompletion& completion);
    static void getAlarmInfoCB(bool ok, const QString& relayPath, const QString& statusText,
                               const QString& replyText, bool isLast,
                               const ReplyCompletion& completion);

private:
    IOrvoTunnelClient* m_pTunnelClient;
    QSharedPointer<MessageComposer> m_spMessageComposer;
};
