#pragma once

#include "FakeTunnelClient.h"

#include <ORVOSrvTunnelControl.h>

// What one of the tunnel control's reply readers hands its completion.
struct ReaderOutcome
{
    int calls = 0;
    bool ok = false;
    bool isLast = false;
    QVariant result;
    QString statusText; // the alarm-list reader's only
    QString relayPath;
};

inline ORVOSrvTunnelControl::QueryAlarmCompletion recordQuery(ReaderOutcome& out)
{
    return
        [&out](bool ok, bool isLast, const QVariant& result, const QString& status,
               const QString& relay) { out = {out.calls + 1, ok, isLast, result, status, relay}; };
}

inline ORVOSrvTunnelControl::ReplyCompletion recordReply(ReaderOutcome& out)
{
    return [&out](bool ok, bool isLast, const QVariant& result, const QString& relay) {
        recordQuery(out)(ok, isLast, result, QString(), relay);
    };
}

enum class Reader { Query, Process, Info };

// Runs one reader on a reply, as the tunnel would deliver it.
inline ReaderOutcome readReply(Reader reader, const FakeTunnelClient::Reply& r)
{
    ReaderOutcome out;
    if (reader == Reader::Query)
        ORVOSrvTunnelControl::queryAlarmCB(r.ok, r.relayPath, r.statusText, r.replyText, r.isLast,
                                           recordQuery(out));
    else
        (reader == Reader::Process ? ORVOSrvTunnelControl::processAlarmCB
                                   : ORVOSrvTunnelControl::getAlarmInfoCB)(
            r.ok, r.relayPath, r.statusText, r.replyText, r.isLast, recordReply(out));
    return out;
}
