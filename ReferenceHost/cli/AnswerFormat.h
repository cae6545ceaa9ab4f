#pragma once

#include <HostSession.h>

#include <QByteArray>
#include <QJsonObject>
#include <QVariantList>

class PluginObjBase_EventSignalInfo;

// How the command-line client shows answers, events and alarms.
class AnswerFormat
{
public:
    // PlainJson's answer object. Without keepXml the raw XML text that comes with each alarm of a
    // search is left out.
    static QJsonObject answerObject(const QString& method, const PluginAnswer& answer,
                                    bool keepXml);
    static QJsonObject eventObject(const PluginObjBase_EventSignalInfo& info);
    static QByteArray jsonLine(const QJsonObject& object, bool pretty);

    // The alarms of a search answer ("queryResult"), without their XML unless keepXml.
    static QVariantList alarms(const PluginAnswer& answer, bool keepXml);
    // One alarm of a search as a JSON object: the one place that decides how an alarm's fields
    // look in JSON output, for answers, JSON lines and exports alike.
    static QJsonObject alarmObject(const QVariantMap& alarm);
    // An object written as JSON text, its lines after the first indented by indent spaces when
    // pretty, with no line feed at the end.
    static QByteArray jsonText(const QJsonObject& object, bool pretty, int indent);
};
