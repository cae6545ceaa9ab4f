#pragma once

#include <QByteArray>
#include <QList>
#include <QTimeZone>
#include <QVariantList>
#include <QVariantMap>

// An alarm of a search together with its change history.
struct ExportedAlarm
{
    QVariantMap alarm;
    QVariantList history; // change-log entries, oldest first
};

// Writes exported alarms one by one as they come: CSV (a header, then one row per change-log
// entry with the alarm's fields repeated; an alarm without history gets one row) or a JSON
// array written incrementally (each alarm with a "history" list).
class ExportWriter
{
public:
    struct Options
    {
        bool json = false;
        bool pretty = false;
        // CSV: cells that a spreadsheet would run as a formula (starting with =, +, -, @, tab or
        // carriage return) get a leading single quote, unless raw.
        bool raw = false;
        bool byteOrderMark = false;        // CSV: UTF-8 byte order mark first
        QTimeZone zone = QTimeZone::utc(); // CSV: times shown in this zone
    };

    explicit ExportWriter(const Options& options) : m_options(options) {}

    QByteArray begin() const;
    QByteArray alarm(const ExportedAlarm& exported);
    QByteArray end() const;

    // The CSV header names, in column order.
    static QStringList csvColumns();
    // A CSV cell: quoted when it holds a separator, quote or line break; guarded unless raw.
    static QString csvField(const QString& value, bool raw);

private:
    Options m_options;
    qint64 m_written = 0;
};
