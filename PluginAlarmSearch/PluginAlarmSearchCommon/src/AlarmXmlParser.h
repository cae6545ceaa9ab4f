#pragma once

#include <QList>
#include <QString>

// Cuts an alarm-list reply into one XML text per alarm.
class AlarmXmlParser
{
public:
    // The XML text of every "Alarm" child of the document element, in document order. Text that
    // is not XML gives an empty list; text that breaks off is searched up to the fault.
    static QList<QString> getAlarmList(const QString& replyText);
};
