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
    QVariantList bindings;  // values of the condition's placeholders, in order
    int limit = 0;          // at most this many alarms
    bool descending = true; // newest first
};

// The most alarms one search returns.
constexpr int kMaxRecords = 5000;

// Reads the command's filters, time bound, record limit and order. Fails on a time, time zone or
// record limit that it cannot read.
std::optional<AlarmFilter> alarmFilterFromCommand(const XmlElement& command);

} // namespace AlarmServerSim
