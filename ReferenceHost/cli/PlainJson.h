#pragma once

#include <QJsonObject>
#include <QJsonValue>
#include <QString>
#include <QVariant>

class PluginObjBase_EventSignalInfo;
struct PluginAnswer;

// Turns the plug-in's answers and events, whose fields are all texts as the server's XML gives
// them, into typed JSON: flags as booleans, counts and codes that are numbers as numbers, times
// as ISO 8601 in UTC with a "Z" (an empty time is null). The network API and the command-line
// client's JSON output both write through here, so the two never differ. Converting a value
// that is typed already leaves it as it is.
namespace PlainJson {

// A value of an answer or event, converted field by field by the keys of its maps; map entries
// called omittedKey (at any depth) are left out.
QJsonValue value(const QVariant& value, const QString& omittedKey = QString());
// A server time ("yyyy-MM-ddTHH:mm:ss", UTC) or an ISO 8601 time with a zone, as UTC with "Z";
// an empty text is null, and a text that is no time stays as it is.
QJsonValue time(const QString& text);

// {"type": "answer", "method", "isLast", "resultCode", "message", "result"}
QJsonObject answer(const QString& method, const PluginAnswer& answer);
// {"type": "event", "event", "time", "subscriptionKey", "pluginId", "data"}
QJsonObject event(const PluginObjBase_EventSignalInfo& info);

} // namespace PlainJson
