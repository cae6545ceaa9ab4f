#include "AnswerFormat.h"

#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QDateTime>
#include <QJsonDocument>
#include <QJsonValue>
#include <QTimeZone>

using namespace PluginAlarmSearchCommon;

namespace {

const QString kXml = QStringLiteral("XML");

QVariant withoutAlarmXml(const QVariant& result)
{
    QVariantMap map = result.toMap();
    if (result.typeId() != QMetaType::QVariantMap || !map.contains(ARG_QUERY_RESULT))
        return result;
    QVariantList alarms = map.value(ARG_QUERY_RESULT).toList();
    for (QVariant& alarm : alarms) {
        QVariantMap fields = alarm.toMap();
        fields.remove(kXml);
        alarm = fields;
    }
    map.insert(ARG_QUERY_RESULT, alarms);
    return map;
}

} // namespace

QJsonObject AnswerFormat::answerObject(const QString& method, const PluginAnswer& answer,
                                       bool keepXml)
{
    return QJsonObject{
        {QStringLiteral("method"), method},
        {QStringLiteral("isLast"), answer.isLast},
        {QStringLiteral("resultCode"), answer.resultCode},
        {QStringLiteral("message"), answer.message},
        {QStringLiteral("result"),
         QJsonValue::fromVariant(keepXml ? answer.result : withoutAlarmXml(answer.result))},
    };
}

QJsonObject AnswerFormat::eventObject(const PluginObjBase_EventSignalInfo& info)
{
    return QJsonObject{
        {QStringLiteral("event"), info.eventName},
        {QStringLiteral("time"), QDateTime::fromMSecsSinceEpoch(info.eventTime, QTimeZone::utc())
                                     .toString(QStringLiteral("yyyy-MM-ddTHH:mm:ss.zzz'Z'"))},
        {QStringLiteral("subscriptionKey"), info.subscriptionKey},
        {QStringLiteral("pluginId"), info.pluginId},
        {QStringLiteral("data"), QJsonValue::fromVariant(info.eventData)},
    };
}

QByteArray AnswerFormat::jsonLine(const QJsonObject& object, bool pretty)
{
    QByteArray line =
        QJsonDocument(object).toJson(pretty ? QJsonDocument::Indented : QJsonDocument::Compact);
    if (!line.endsWith('\n'))
        line.append('\n');
    return line;
}

QVariantList AnswerFormat::alarms(const PluginAnswer& answer, bool keepXml)
{
    const QVariant result = keepXml ? answer.result : withoutAlarmXml(answer.result);
    return result.toMap().value(ARG_QUERY_RESULT).toList();
}

QString AnswerFormat::alarmTable(const QVariantList& alarms)
{
    struct Column
    {
        QString title;
        QStringList keys; // joined with ":" when several are set
    };
    static const QList<Column> columns{
        {QStringLiteral("ALARM"), {QStringLiteral("AlarmID")}},
        {QStringLiteral("TIME (UTC)"), {QStringLiteral("ServerTime")}},
        {QStringLiteral("STATE"), {QStringLiteral("State")}},
        {QStringLiteral("EVENT"), {QStringLiteral("EventClass"), QStringLiteral("SubEvent")}},
        {QStringLiteral("NAME"), {QStringLiteral("AlarmName")}},
        {QStringLiteral("DEVICE"), {QStringLiteral("DeviceName")}},
        {QStringLiteral("MUTED"), {QStringLiteral("Muted")}},
        {QStringLiteral("NOTE"), {QStringLiteral("Note")}},
    };

    QList<QStringList> rows;
    QStringList header;
    for (const Column& column : columns)
        header.append(column.title);
    rows.append(header);
    for (const QVariant& alarm : alarms) {
        const QVariantMap fields = alarm.toMap();
        QStringList row;
        for (const Column& column : columns) {
            QStringList parts;
            for (const QString& key : column.keys) {
                const QString value = fields.value(key).toString();
                if (!value.isEmpty())
                    parts.append(value);
            }
            row.append(parts.join(QLatin1Char(':')).simplified());
        }
        rows.append(row);
    }

    QList<qsizetype> widths(columns.size(), 0);
    for (const QStringList& row : std::as_const(rows)) {
        for (qsizetype i = 0; i < row.size(); ++i)
            widths[i] = qMax(widths[i], row[i].size());
    }
    QString table;
    for (const QStringList& row : std::as_const(rows)) {
        QString line;
        for (qsizetype i = 0; i < row.size(); ++i)
            line += i + 1 < row.size() ? row[i].leftJustified(widths[i] + 2) : row[i];
        table += line.trimmed() + QLatin1Char('\n');
    }
    return table;
}
