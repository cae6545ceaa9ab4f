#pragma once

#include <QList>
#include <QString>
#include <QStringList>
#include <QTimeZone>
#include <QVariantList>

// Alarms as a text table that fits a width, written page by page: the first page fixes the
// column widths (its widest cells, the wide columns narrowed until the line fits), later pages
// keep them, and a cell too wide for its column is cut with "…". Widths are display widths:
// CJK and emoji take two columns, combining marks none.
class AlarmTable
{
public:
    // maxWidth 0: no limit. Times are shown in zone.
    AlarmTable(const QTimeZone& zone, int maxWidth);

    // The lines of a page, with the header before the first page.
    QString page(const QVariantList& alarms);

    // Columns that text takes on a terminal.
    static int displayWidth(const QString& text);
    // text cut to at most width columns, with "…" at the end when cut.
    static QString elide(const QString& text, int width);

private:
    QStringList cells(const QVariantMap& alarm) const;
    QString line(const QStringList& cells) const;

    QTimeZone m_zone;
    int m_maxWidth;
    QStringList m_titles;
    QList<int> m_widths; // empty until the first page
};
