#include "ExportWriter.h"

#include "AnswerFormat.h"

#include <TimeArgument.h>

#include <AlarmFields.h>

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QStringList>

using namespace PluginAlarmSearchCommon;

namespace {

const QStringList kEntryColumns{FIELD_TIME, FIELD_STATE, FIELD_NOTE, FIELD_USER};
const QStringList kTimeColumns{FIELD_SERVER_TIME, FIELD_MUTE_UNTIL, FIELD_TIME};

QStringList values(const QVariantMap& map, const QStringList& keys, const QTimeZone& zone)
{
    // In UTC the server's times are shown as they are.
    const bool shiftTimes = zone.isValid() && zone != QTimeZone::utc();
    QStringList out;
    out.reserve(keys.size());
    for (const QString& key : keys) {
        QString value = map.value(key).toString();
        out.append(shiftTimes && kTimeColumns.contains(key) ? TimeArgument::display(value, zone)
                                                            : std::move(value));
    }
    return out;
}

} // namespace

QStringList ExportWriter::csvColumns()
{
    QStringList header = ALARM_FIELDS;
    for (const QString& column : kEntryColumns)
        header.append(QStringLiteral("Change") + column);
    return header;
}

QString ExportWriter::csvField(const QString& value, bool raw)
{
    static const QString formulaStarts = QStringLiteral("=+-@\t\r");
    QString field = value;
    if (!raw && !field.isEmpty() && formulaStarts.contains(field.front()))
        field.prepend(QLatin1Char('\''));
    if (!field.contains(QLatin1Char(',')) && !field.contains(QLatin1Char('"')) &&
        !field.contains(QLatin1Char('\n')) && !field.contains(QLatin1Char('\r')))
        return field;
    field.replace(QLatin1Char('"'), QLatin1String("\"\""));
    return QLatin1Char('"') + field + QLatin1Char('"');
}

QByteArray ExportWriter::begin() const
{
    if (m_options.json)
        return "[";
    QStringList header;
    for (const QString& column : csvColumns())
        header.append(csvField(column, true));
    return (m_options.byteOrderMark ? QByteArray("\xEF\xBB\xBF") : QByteArray()) +
           header.join(QLatin1Char(',')).toUtf8() + "\r\n";
}

QByteArray ExportWriter::alarm(const ExportedAlarm& exported)
{
    if (m_options.json) {
        QJsonObject object = AnswerFormat::alarmObject(exported.alarm);
        object.insert(QStringLiteral("history"), QJsonArray::fromVariantList(exported.history));
        const QByteArray separator = m_written++ > 0 ? "," : "";
        return separator + (m_options.pretty ? "\n    " : "") +
               AnswerFormat::jsonText(object, m_options.pretty, 4);
    }
    ++m_written;
    // The alarm's cells open each of its rows: written once.
    QString alarmCells;
    for (const QString& value : values(exported.alarm, ALARM_FIELDS, m_options.zone))
        alarmCells.append(csvField(value, m_options.raw)).append(QLatin1Char(','));
    QString csv;
    const auto appendRow = [&](const QStringList& entryValues) {
        csv += alarmCells;
        for (qsizetype i = 0; i < entryValues.size(); ++i) {
            if (i > 0)
                csv += QLatin1Char(',');
            csv += csvField(entryValues[i], m_options.raw);
        }
        csv += QLatin1String("\r\n");
    };
    for (const QVariant& entry : exported.history)
        appendRow(values(entry.toMap(), kEntryColumns, m_options.zone));
    if (exported.history.isEmpty())
        appendRow(QStringList(kEntryColumns.size()));
    return csv.toUtf8();
}

QByteArray ExportWriter::end() const
{
    if (!m_options.json)
        return QByteArray();
    return m_options.pretty && m_written > 0 ? "\n]\n" : "]\n";
}
