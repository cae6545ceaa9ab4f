#pragma once

#include <QString>
#include <QVariantList>

#include <optional>

namespace AlarmServerSim {

struct XmlElement;

// The search of a "QryAlarmList" command as an SQL condition over the alarm table.
struct AlarmFilter
{
    QString where;          // SQL condition ("1" when nothing is filtered)
    QVariantList bindings;  // values of the condition's placeholders, in order; one per list
    int limit = 0;          // at most this many alarms
    bool descending = true; // newest first
};

// Reads the command's filters, time bound, record limit (at most AlarmSearchLimits::MaxRecords)
// and order. Each list of the filters is bound as one JSON array, so that any number of names
// stays within SQLite's limit on bound parameters. Fails on a time, time zone or
// record limit that it cannot read.
std::optional<AlarmFilter> alarmFilterFromCommand(const XmlElement& command);

} // namespace AlarmServerSim
