#pragma once

#include <QByteArray>
#include <QList>
#include <QVariantList>
#include <QVariantMap>

// An alarm of a search together with its change history.
struct ExportedAlarm
{
    QVariantMap alarm;
    QVariantList history; // change-log entries, oldest first
};

// Writes exported alarms as CSV (one row per change-log entry, the alarm's fields repeated; an
// alarm without history gets one row) or as a JSON array (each alarm with a "history" list).
class ExportWriter
{
public:
    static QByteArray toCsv(const QList<ExportedAlarm>& alarms);
    static QByteArray toJson(const QList<ExportedAlarm>& alarms, bool pretty);
};
