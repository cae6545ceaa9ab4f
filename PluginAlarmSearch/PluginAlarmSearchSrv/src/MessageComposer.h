#pragma once

#include <QList>
#include <QMap>
#include <QString>
#include <QVariant>

// Writes the XML commands sent to the management server: no XML declaration, no white space
// between elements. An empty text means the request cannot be sent: a filter fragment beyond
// the bounds of AlarmSearchLimits, or an alarm ID holding a character XML cannot carry. Holds no
// state; any number of calls may run at once. Its virtual operations are the whole of its vtable,
// in this order, for composers built elsewhere; owners hold it through a QSharedPointer, which
// deletes a derived composer as what it was created as.
class MessageComposer
{
public:
    // "QryAlarmList": trigger events, state filter, name rules and the UTC time bound of the
    // request map in args; newest first, at most AlarmSearchLimits::MaxRecords records.
    virtual QString composeQueryAlarmListMessage(const QVariant& args);
    // "ProcessAlarm": sets state and note of the listed alarms.
    virtual QString composeProcessAlarmMessage(const QList<QString>& ids,
                                               const QMap<QString, QVariant>& status,
                                               const QString& note);
    // "GetAlarmInfo": one alarm with its change log.
    virtual QString composeGetAlarmInfoMessage(const QString& alarmId);
    // "MuteAlarm": mutes (or unmutes) the listed alarms for interval seconds.
    virtual QString composeMuteAlarmMessage(const QList<QString>& ids, bool mute, int interval);

    // The system time zone's offset from UTC, "+HH:MM" or "-HH:MM".
    QString getSystemTimeZone();
};
