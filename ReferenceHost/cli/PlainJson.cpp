#include "PlainJson.h"

#include <HostSession.h>

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>
#include <PluginObjBase_EventInfo.h>

#include <QDateTime>
#include <QJsonArray>
#include <QTimeZone>

using namespace PluginAlarmSearchCommon;

namespace {

enum class Kind { Boolean, Integer, Time };

// The fields whose texts stand for something other than text: the alarm fields and change-log
// entries of the server's replies, and the per-alarm outcome of an update.
Kind const* kindOf(const QString& key)
{
    static const QHash<QString, Kind> kinds{
        {FIELD_MUTED, Kind::Boolean},          {FIELD_SERVER_TIME, Kind::Time},
        {FIELD_MUTE_UNTIL, Kind::Time},        {FIELD_TIME, Kind::Time},
        {ARG_UPDATE_RESULT, Kind::Integer},    {ARG_IS_MUTE, Kind::Boolean},
        {ARG_MUTE_TIME_SECOND, Kind::Integer},
    };
    const auto it = kinds.constFind(key);
    return it == kinds.constEnd() ? nullptr : &it.value();
}

QJsonValue typed(Kind kind, const QVariant& field)
{
    if (field.typeId() != QMetaType::QString)
        return QJsonValue::fromVariant(field);
    const QString text = field.toString();
    switch (kind) {
    case Kind::Boolean:
        if (text == QLatin1String("true") || text == QLatin1String("false"))
            return text == QLatin1String("true");
        break;
    case Kind::Integer: {
        bool ok = false;
        const qint64 number = text.toLongLong(&ok);
        if (ok)
            return number;
        break;
    }
    case Kind::Time:
        return PlainJson::time(text);
    }
    return text;
}

} // namespace

namespace PlainJson {

QJsonValue time(const QString& text)
{
    if (text.isEmpty())
        return QJsonValue::Null;
    QDateTime parsed = QDateTime::fromString(text, Qt::ISODateWithMs);
    if (!parsed.isValid())
        return text;
    // The server writes its times in UTC without saying so.
    if (parsed.timeSpec() == Qt::LocalTime)
        parsed.setTimeZone(QTimeZone::utc());
    parsed = parsed.toUTC();
    return parsed.toString(parsed.time().msec() ? Qt::ISODateWithMs : Qt::ISODate);
}

QJsonValue value(const QVariant& value, const QString& omittedKey)
{
    switch (value.typeId()) {
    case QMetaType::QVariantMap: {
        const QVariantMap map = value.toMap();
        QJsonObject object;
        for (auto it = map.constBegin(); it != map.constEnd(); ++it) {
            if (it.key() == omittedKey)
                continue;
            const Kind* kind = kindOf(it.key());
            object.insert(it.key(), kind ? typed(*kind, it.value())
                                         : PlainJson::value(it.value(), omittedKey));
        }
        return object;
    }
    case QMetaType::QVariantList:
    case QMetaType::QStringList: {
        QJsonArray array;
        for (const QVariant& item : value.toList())
            array.append(PlainJson::value(item, omittedKey));
        return array;
    }
    default:
        return QJsonValue::fromVariant(value);
    }
}

QJsonObject answer(const QString& method, const PluginAnswer& answer)
{
    return QJsonObject{
        {QStringLiteral("type"), QStringLiteral("answer")},
        {QStringLiteral("method"), method},
        {QStringLiteral("isLast"), answer.isLast},
        {QStringLiteral("resultCode"), answer.resultCode},
        {QStringLiteral("message"), answer.message},
        {QStringLiteral("result"), value(answer.result)},
    };
}

QJsonObject event(const PluginObjBase_EventSignalInfo& info)
{
    return QJsonObject{
        {QStringLiteral("type"), QStringLiteral("event")},
        {QStringLiteral("event"), info.eventName},
        {QStringLiteral("time"),
         QDateTime::fromMSecsSinceEpoch(info.eventTime).toUTC().toString(Qt::ISODateWithMs)},
        {QStringLiteral("subscriptionKey"), info.subscriptionKey},
        {QStringLiteral("pluginId"), info.pluginId},
        {QStringLiteral("data"), value(info.eventData)},
    };
}

} // namespace PlainJson
