#include "AnswerFormat.h"

#include "PlainJson.h"

#include <PluginAlarmSearchCommon.h>

#include <QJsonDocument>

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
    if (keepXml)
        return PlainJson::answer(method, answer);
    return PlainJson::answer(method, PluginAnswer{answer.isLast, answer.resultCode, answer.message,
                                                  withoutAlarmXml(answer.result)});
}

QJsonObject AnswerFormat::eventObject(const PluginObjBase_EventSignalInfo& info)
{
    return PlainJson::event(info);
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

QJsonObject AnswerFormat::alarmObject(const QVariantMap& alarm)
{
    return QJsonObject::fromVariantMap(alarm);
}

QByteArray AnswerFormat::jsonText(const QJsonObject& object, bool pretty, int indent)
{
    QByteArray text =
        QJsonDocument(object).toJson(pretty ? QJsonDocument::Indented : QJsonDocument::Compact);
    if (text.endsWith('\n'))
        text.chop(1);
    if (pretty)
        text.replace("\n", "\n" + QByteArray(indent, ' '));
    return text;
}
