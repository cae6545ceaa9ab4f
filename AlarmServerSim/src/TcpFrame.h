#pragma once

#include <QByteArray>
#include <QJsonObject>
#include <QList>
#include <QString>

// The loopback TCP framing shared by the TCP server and the host's tunnel client.
namespace AlarmServerSim {

// One frame = 4-byte big-endian payload length + UTF-8 JSON object payload.
// Request payload: {"id": <number>, "method": "QryAlarmList", "command": "<xml>",
//                   "operator": "alice"} (the operator is optional: who made a change)
// Reply payload:   {"id": <number>, "status": "0", "reply": "<xml>"} (none for "MuteAlarm")
constexpr quint32 kMaxFramePayload = 64 * 1024 * 1024;

QByteArray encodeFrame(const QJsonObject& payload);

// Appends complete frames found in buffer to out and removes them from buffer; an incomplete
// frame stays in buffer. False on a malformed frame (too long, or not a JSON object).
bool takeFrames(QByteArray& buffer, QList<QJsonObject>& out, QString* error);

} // namespace AlarmServerSim
