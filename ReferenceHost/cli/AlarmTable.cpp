#include "AlarmTable.h"

#include <AlarmFields.h>

#include <QDateTime>
#include <QVariantMap>

#include <utf8proc.h>

using namespace PluginAlarmSearchCommon;

namespace {

const int kGap = 2;
const QString kEllipsis = QStringLiteral("…");

struct Column
{
    const char* title;
    QStringList keys; // joined with ":" when several are set
    int minimum;      // a column is never narrowed below this
};

const QList<Column>& columns()
{
    static const QList<Column> columns{
        {"ALARM", {FIELD_ALARM_ID}, 8},  {"TIME", {FIELD_SERVER_TIME}, 19},
        {"STATE", {FIELD_STATE}, 5},     {"EVENT", {FIELD_EVENT_CLASS, FIELD_SUB_EVENT}, 5},
        {"NAME", {FIELD_ALARM_NAME}, 6}, {"DEVICE", {FIELD_DEVICE_NAME}, 6},
        {"MUTED", {FIELD_MUTED}, 5},     {"NOTE", {FIELD_NOTE}, 4},
    };
    return columns;
}

int charWidth(char32_t codePoint)
{
    return qMax(0, utf8proc_charwidth(utf8proc_int32_t(codePoint)));
}

// An IANA zone by its name; a fixed offset as UTC+HH:MM, which Qt versions name differently
// (Qt 6.4 "UTC+01", later "UTC+01:00").
QString zoneLabel(const QTimeZone& zone)
{
    if (zone == QTimeZone::utc())
        return QStringLiteral("UTC");
    QString id = QString::fromUtf8(zone.id());
    if (!id.startsWith(QLatin1String("UTC")))
        return id;
    const int offset = zone.offsetFromUtc(QDateTime::currentDateTimeUtc());
    const int minutes = qAbs(offset) / 60;
    return QStringLiteral("UTC%1%2:%3")
        .arg(offset < 0 ? QLatin1Char('-') : QLatin1Char('+'))
        .arg(minutes / 60, 2, 10, QLatin1Char('0'))
        .arg(minutes % 60, 2, 10, QLatin1Char('0'));
}

} // namespace

AlarmTable::AlarmTable(const QTimeZone& zone, int maxWidth) : m_zone(zone), m_maxWidth(maxWidth)
{
    for (const Column& column : columns())
        m_titles.append(QString::fromLatin1(column.title));
    m_titles[1] += QStringLiteral(" (%1)").arg(zoneLabel(zone));
}

int AlarmTable::displayWidth(const QString& text)
{
    int width = 0;
    for (const char32_t codePoint : text.toUcs4())
        width += charWidth(codePoint);
    return width;
}

QString AlarmTable::elide(const QString& text, int width)
{
    if (displayWidth(text) <= width)
        return text;
    QString cut;
    int used = 0;
    for (const char32_t codePoint : text.toUcs4()) {
        const int next = charWidth(codePoint);
        if (used + next > width - 1)
            break;
        cut += QString::fromUcs4(&codePoint, 1);
        used += next;
    }
    return cut + kEllipsis;
}

QStringList AlarmTable::cells(const QVariantMap& alarm) const
{
    QStringList row;
    for (const Column& column : columns()) {
        QStringList parts;
        for (const QString& key : column.keys) {
            const QString value = alarm.value(key).toString();
            if (!value.isEmpty())
                parts.append(value);
        }
        row.append(parts.join(QLatin1Char(':')).simplified());
    }
    const QDateTime time = QDateTime::fromString(row[1], Qt::ISODate);
    if (time.isValid())
        row[1] = time.toTimeZone(m_zone).toString(QStringLiteral("yyyy-MM-dd HH:mm:ss"));
    return row;
}

QString AlarmTable::line(const QStringList& cells) const
{
    QString text;
    for (qsizetype i = 0; i < cells.size(); ++i) {
        const QString cell = elide(cells[i], m_widths[i]);
        text += cell;
        if (i + 1 < cells.size())
            text += QString(m_widths[i] - displayWidth(cell) + kGap, QLatin1Char(' '));
    }
    while (text.endsWith(QLatin1Char(' ')))
        text.chop(1);
    return text + QLatin1Char('\n');
}

QString AlarmTable::page(const QVariantList& alarms)
{
    QList<QStringList> rows;
    for (const QVariant& alarm : alarms)
        rows.append(cells(alarm.toMap()));
    QString text;
    if (m_widths.isEmpty()) {
        for (const QString& title : std::as_const(m_titles))
            m_widths.append(displayWidth(title));
        for (const QStringList& row : std::as_const(rows)) {
            for (qsizetype i = 0; i < row.size(); ++i)
                m_widths[i] = qMax(m_widths[i], displayWidth(row[i]));
        }
        // Narrow the widest column that may still give way until the line fits.
        int total = kGap * int(m_widths.size() - 1);
        for (int width : std::as_const(m_widths))
            total += width;
        while (m_maxWidth > 0 && total > m_maxWidth) {
            qsizetype widest = -1;
            for (qsizetype i = 0; i < m_widths.size(); ++i) {
                if (m_widths[i] > columns()[i].minimum &&
                    (widest < 0 || m_widths[i] > m_widths[widest]))
                    widest = i;
            }
            if (widest < 0)
                break;
            --m_widths[widest];
            --total;
        }
        text += line(m_titles);
    }
    for (const QStringList& row : std::as_const(rows))
        text += line(row);
    return text;
}
