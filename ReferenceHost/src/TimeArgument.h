#pragma once

#include <QDateTime>
#include <QString>

// Reads a time given on the command line into the server's form, "yyyy-MM-ddTHH:mm:ss" in UTC.
// Accepted: that form itself (a trailing "Z" is allowed), a date alone ("2026-11-20": its first
// second for a start, its last second for an end), "now", or an age such as "90s", "30m",
// "24h", "7d" or "2w", counted back from now.
class TimeArgument
{
public:
    enum class Bound { Start, End };

    static bool parse(const QString& text, Bound bound, const QDateTime& now, QString* serverTime,
                      QString* errorMessage);
    static QString toServerTime(const QDateTime& time);
};
