#pragma once

#include <QDateTime>
#include <QString>
#include <QTimeZone>

// Reads a time given on the command line into the server's form, "yyyy-MM-ddTHH:mm:ss" in UTC,
// and shows the server's times in a chosen zone. Accepted:
// - ISO 8601 with "T" or a blank between date and time, minutes or seconds, optional fractional
//   seconds (dropped) and an optional "Z" or offset ("+01:00", "-0500"): "2026-11-20T08:15:30Z",
//   "2026-11-20 08:15". Without "Z" or an offset the time is read in the given zone. Without
//   seconds an end means the last second of that minute.
// - a date alone ("2026-11-20": its first second in the zone for a start, its last for an end);
// - "now", or an age such as "90s", "30m", "24h", "7d" or "2w", counted back from now.
class TimeArgument
{
public:
    enum class Bound { Start, End };

    static bool parse(const QString& text, Bound bound, const QDateTime& now, const QTimeZone& zone,
                      QString* serverTime, QString* errorMessage);
    static QString toServerTime(const QDateTime& time);
    // A time as the server writes it ("...Z") shown in zone: ISO 8601 with "Z" for UTC, else
    // with the zone's offset. Text that is no time comes back unchanged.
    static QString display(const QString& serverTime, const QTimeZone& zone);
    // The zone a --tz value names: an IANA identifier ("Europe/Berlin"), "UTC" or an offset
    // ("+02:00"). Invalid when it names none.
    static QTimeZone zoneNamed(const QString& name);
    static QString acceptedForms();
};
