#pragma once

#include <QString>
#include <QStringList>
#include <QVariantList>

#include <optional>

class QSqlQuery;

// Field formats and helpers shared by the database, the demo data and the replies.
namespace AlarmServerSim {

// "A" followed by the alarm's number in seven digits.
QString formatAlarmId(qint64 number);
// The number of an alarm ID, or nothing for text that is not an alarm ID.
std::optional<qint64> parseAlarmId(const QString& id);

// Seconds since the epoch as yyyy-MM-ddTHH:mm:ssZ (UTC).
QString formatTime(qint64 secondsSinceEpoch);
// Reads yyyy-MM-ddTHH:mm:ss (a trailing "Z" accepted) given in the zone offsetSeconds ahead of
// UTC; returns seconds since the epoch.
std::optional<qint64> parseTime(const QString& text, int offsetSeconds);

// Binds values to the placeholders of the prepared query, in order, and runs it. A null text is
// bound as an empty one.
bool execWith(QSqlQuery& query, const QVariantList& values);

// Names are compared in this folded form (case-insensitive, beyond ASCII too).
inline QString foldName(const QString& name)
{
    return name.toCaseFolded();
}

} // namespace AlarmServerSim
