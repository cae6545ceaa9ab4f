#include "ExportWriter.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QStringList>

namespace {

const QStringList kAlarmColumns{
    QStringLiteral("AlarmID"),  QStringLiteral("EventClass"), QStringLiteral("SubEventType"),
    QStringLiteral("SubEvent"), QStringLiteral("AlarmName"),  QStringLiteral("DeviceName"),
    QStringLiteral("State"),    QStringLiteral("ServerTime"), QStringLiteral("Note"),
    QStringLiteral("Muted"),    QStringLiteral("MuteUntil")};
const QStringList kEntryColumns{QStringLiteral("Time"), QStringLiteral("State"),
                                QStringLiteral("Note"), QStringLiteral("User")};

QString csvField(const QString& value)
{
    if (!value.contains(QLatin1Char(',')) && !value.contains(QLatin1Char('"')) &&
        !value.contains(QLatin1Char('\n')) && !value.contains(QLatin1Char('\r')))
        return value;
    QString quoted = value;
    quoted.replace(QLatin1Char('"'), QLatin1String("\"\""));
    return QLatin1Char('"') + quoted + QLatin1Char('"');
}

QString csvRow(const QStringList& fields)
{
    QStringList escaped;
    for (const QString& field : fields)
        escaped.append(csvField(field));
    return escaped.join(QLatin1Char(',')) + QLatin1String("\r\n");
}

QStringList values(const QVariantMap& map, const QStringList& keys)
{
    QStringList out;
    for (const QString& key : keys)
        out.append(map.value(key).toString());
    return out;
}

} // namespace

QByteArray ExportWriter::toCsv(const QList<ExportedAlarm>& alarms)
{
    QStringList header = kAlarmColumns;
    for (const QString& column : kEntryColumns)
        header.append(QStringLiteral("Change") + column);
    QString csv = csvRow(header);
    for (const ExportedAlarm& exported : alarms) {
        const QStringList alarmFields = values(exported.alarm, kAlarmColumns);
        if (exported.history.isEmpty())
            csv += csvRow(alarmFields + QStringList(kEntryColumns.size()));
        for (const QVariant& entry : exported.history)
            csv += csvRow(alarmFields + values(entry.toMap(), kEntryColumns));
    }
    return csv.toUtf8();
}

QByteArray ExportWriter::toJson(const QList<ExportedAlarm>& alarms, bool pretty)
{
    QJsonArray array;
    for (const ExportedAlarm& exported : alarms) {
        QJsonObject object = QJsonObject::fromVariantMap(exported.alarm);
        object.insert(QStringLiteral("history"), QJsonArray::fromVariantList(exported.history));
        array.append(object);
    }
    return QJsonDocument(array).toJson(pretty ? QJsonDocument::Indented : QJsonDocument::Compact);
}
