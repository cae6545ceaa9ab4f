#include "ORVOSrvTunnelControl.h"

#include "MessageComposer.h"
#include "PluginAlarmSearchSrv_Log.h"
#include "stdafx.h"

#include <AlarmFields.h>
#include <AlarmXmlParser.h>
#include <XML2Json.h>

#include <optional>

using namespace PluginAlarmSearchCommon;

namespace {

// Wraps a static reply reader into the tunnel's reply callback. The completion is copied into
// every call, so the tunnel may deliver any number of replies, on any thread.
template <typename Completion, typename Reader>
IOrvoTunnelClient::ReplyCallback bindReader(Reader reader, Completion completion)
{
    return [reader, completion = std::move(completion)](
               bool ok, const QString& /*info*/, const QString& relayPath,
               const QString& statusText, const QString& replyText,
               bool isLast) { reader(ok, relayPath, statusText, replyText, isLast, completion); };
}

// A reply is accepted when the exchange succeeded and bit 31 of the status, read as unsigned
// hexadecimal, is clear. A status that does not convert counts as 0.
bool replyAccepted(bool ok, const QString& statusText)
{
    bool converted = false;
    const qulonglong status = statusText.toULongLong(&converted, 16);
    return ok && !(converted && (status & 0x80000000ULL));
}

// Judges a reply's status; writes the reader's failure line when it is rejected.
bool acceptReply(const char* readerName, const char* rejectedFormat, bool ok,
                 const QString& statusText)
{
    if (replyAccepted(ok, statusText))
        return true;
    ALARMSEARCH_TRACE_FAILURE(rejectedFormat, readerName,
                              AlarmSearchTrace::local8Bit(statusText).constData());
    return false;
}

void traceParseFailure(const char* readerName, const QString& replyText)
{
    ALARMSEARCH_TRACE_FAILURE("%s, parse message failed, %s", readerName,
                              AlarmSearchTrace::local8Bit(replyText).constData());
}

// Judges and converts a reply. Writes the reader's failure line and returns nothing when the
// reply was rejected or does not parse; text beyond XML2Json's bounds counts as not parseable.
std::optional<QVariantMap> readReply(const char* readerName, const char* rejectedFormat, bool ok,
                                     const QString& statusText, const QString& replyText)
{
    if (!acceptReply(readerName, rejectedFormat, ok, statusText))
        return std::nullopt;
    const QVariant parsed = AlarmXmlParser::readReply(replyText);
    if (!parsed.isValid() || parsed.isNull()) {
        traceParseFailure(readerName, replyText);
        return std::nullopt;
    }
    return parsed.toMap();
}

} // namespace

ORVOSrvTunnelControl::ORVOSrvTunnelControl(IOrvoTunnelClient* client)
    : m_pTunnelClient(client), m_spMessageComposer(QSharedPointer<MessageComposer>::create())
{
}

void ORVOSrvTunnelControl::setMessageComposer(QSharedPointer<MessageComposer> composer)
{
    m_spMessageComposer = std::move(composer);
}

bool ORVOSrvTunnelControl::sendCommand(void* clientID, const QString& method,
                                       IOrvoTunnelClient::InsertRequestInfo& info)
{
    // The composer gives no command for a request it cannot write.
    if (!m_pTunnelClient || info.commandText.isEmpty())
        return false;
    return m_pTunnelClient->InsertRequest(QString::fromUtf8(PALARMSEARCH_PLUGINID), clientID,
                                          IOrvoTunnelClient::RequestWithReply, method, info);
}

bool ORVOSrvTunnelControl::queryAlarm(void* clientID, const QVariant& args,
                                      QueryAlarmCompletion completion)
{
    const QVariantMap argMap = args.toMap();
    IOrvoTunnelClient::InsertRequestInfo info;
    info.commandText = m_spMessageComposer->composeQueryAlarmListMessage(QVariant(argMap));
    info.replyCallback = bindReader(&ORVOSrvTunnelControl::queryAlarmCB, std::move(completion));
    info.relayPath = argMap.value(ARG_RELAY_PATH).toString();
    return sendCommand(clientID, METHOD_QUERY_ALARM_LIST, info);
}

void ORVOSrvTunnelControl::queryAlarmCB(bool ok, const QString& relayPath,
                                        const QString& statusText, const QString& replyText,
                                        bool isLast, const QueryAlarmCompletion& completion)
{
    const char* const readerName = "queryAlarmCB";
    if (!acceptReply(readerName, "%s, QryAlarmList failed, %s", ok, statusText)) {
        completion(false, isLast, QVariant(), statusText, relayPath);
        return;
    }
    std::optional<QVariantList> alarms = AlarmXmlParser::readAlarmListReply(replyText);
    if (!alarms) {
        traceParseFailure(readerName, replyText);
        completion(false, isLast, QVariant(), statusText, relayPath);
        return;
    }
    completion(true, isLast, QVariant(*alarms), statusText, relayPath);
}

bool ORVOSrvTunnelControl::processAlarm(void* clientID, const QMap<QString, QVariant>& args,
                                        ReplyCompletion completion)
{
    IOrvoTunnelClient::InsertRequestInfo info;
    info.commandText = m_spMessageComposer->composeProcessAlarmMessage(
        args.value(ARG_ALARMINFO_ID_LIST).toStringList(), args.value(ARG_ALARMINFO_STATUS).toMap(),
        args.value(ARG_ALARMINFO_NOTE).toString());
    info.replyCallback = bindReader(&ORVOSrvTunnelControl::processAlarmCB, std::move(completion));
    info.relayPath = args.value(ARG_RELAY_PATH).toString();
    return sendCommand(clientID, METHOD_PROCESS_ALARM, info);
}

void ORVOSrvTunnelControl::processAlarmCB(bool ok, const QString& relayPath,
                                          const QString& statusText, const QString& replyText,
                                          bool isLast, const ReplyCompletion& completion)
{
    const std::optional<QVariantMap> reply =
        readReply("processAlarmCB", "%s, processAlarm failed, %s", ok, statusText, replyText);
    if (!reply) {
        completion(false, isLast, QVariant(), relayPath);
        return;
    }

    const QVariantList entries = XML2Json::transContentAsList(
        reply->value(QStringLiteral("ProcessAlarmRes")).toMap().value(QStringLiteral("Result")));
    QVariantList result;
    result.reserve(entries.size());
    for (const QVariant& entry : entries) {
        const QVariantMap fields = entry.toMap();
        result.append(QVariantMap{
            {ARG_ALARM_ID, fields.value(FIELD_ALARM_ID).toString()},
            {ARG_UPDATE_RESULT, fields.value(FIELD_CODE).toString()},
        });
    }
    completion(true, isLast, QVariant(result), relayPath);
}

bool ORVOSrvTunnelControl::getAlarmInfo(void* clientID, const QString& alarmId,
                                        const QString& relayPath, ReplyCompletion completion)
{
    IOrvoTunnelClient::InsertRequestInfo info;
    info.commandText = m_spMessageComposer->composeGetAlarmInfoMessage(alarmId);
    info.replyCallback = bindReader(&ORVOSrvTunnelControl::getAlarmInfoCB, std::move(completion));
    info.relayPath = relayPath;
    return sendCommand(clientID, METHOD_GET_ALARM_INFO, info);
}

void ORVOSrvTunnelControl::getAlarmInfoCB(bool ok, const QString& relayPath,
                                          const QString& statusText, const QString& replyText,
                                          bool isLast, const ReplyCompletion& completion)
{
    const std::optional<QVariantMap> reply =
        readReply("getAlarmInfoCB", "%s, getAlarmInfo failed, %s", ok, statusText, replyText);
    if (!reply) {
        completion(false, isLast, QVariant(), relayPath);
        return;
    }

    const QVariant entries = reply->value(QStringLiteral("GetAlarmInfoRes"))
                                 .toMap()
                                 .value(QStringLiteral("Alarm"))
                                 .toMap()
                                 .value(QStringLiteral("ChangeLogs"))
                                 .toMap()
                                 .value(QStringLiteral("Entry"));
    completion(true, isLast, QVariant(XML2Json::transContentAsList(entries)), relayPath);
}

void ORVOSrvTunnelControl::muteAlarm(void* clientID, const QList<QString>& ids, bool mute,
                                     int interval)
{
    if (!m_pTunnelClient)
        return;
    IOrvoTunnelClient::InsertRequestInfo info;
    info.commandText = m_spMessageComposer->composeMuteAlarmMessage(ids, mute, interval);
    if (info.commandText.isEmpty())
        return;
    // Fire and forget: the result is not observed and no reply is expected.
    m_pTunnelClient->InsertRequest(QString::fromUtf8(PALARMSEARCH_PLUGINID), clientID,
                                   IOrvoTunnelClient::RequestNoReply, METHOD_MUTE_ALARM, info);
}
