#pragma once

#include "HostSession.h"

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
    // A compact text table: one line per alarm under a header.
    static QString alarmTable(const QVariantList& alarms);
};
