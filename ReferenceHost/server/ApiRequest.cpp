#include "ApiRequest.h"

#include <AlarmSearchLimits.h>
#include <TimeArgument.h>

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>

#include <QJsonArray>
#include <QJsonDocument>

#include <cmath>

using namespace PluginAlarmSearchCommon;

namespace ApiRequest {

namespace {

bool fail(FieldError* error, const QString& field, const QString& problem)
{
    *error = FieldError{field, problem};
    return false;
}

bool onlyKnownFields(const QJsonObject& body, const QStringList& known, FieldError* error)
{
    for (auto it = body.begin(); it != body.end(); ++it) {
        if (!known.contains(it.key()))
            return fail(
                error, it.key(),
                QStringLiteral("unknown field (known: %1)").arg(known.join(QLatin1String(", "))));
    }
    return true;
}

bool text(const QJsonObject& body, const QString& field, int maxLength, QString* out,
          FieldError* error)
{
    const QJsonValue value = body.value(field);
    if (value.isUndefined())
        return true;
    if (!value.isString())
        return fail(error, field, QStringLiteral("must be a string"));
    if (value.toString().size() > maxLength)
        return fail(error, field, QStringLiteral("longer than %1 characters").arg(maxLength));
    *out = value.toString();
    return true;
}

bool textList(const QJsonObject& body, const QString& field, int maxItems, int maxLength,
              QStringList* out, FieldError* error)
{
    const QJsonValue value = body.value(field);
    if (value.isUndefined())
        return true;
    if (!value.isArray())
        return fail(error, field, QStringLiteral("must be an array of strings"));
    const QJsonArray items = value.toArray();
    if (items.size() > maxItems)
        return fail(error, field, QStringLiteral("more than %1 items").arg(maxItems));
    for (qsizetype i = 0; i < items.size(); ++i) {
        const QString item = QStringLiteral("%1[%2]").arg(field).arg(i);
        if (!items[i].isString())
            return fail(error, item, QStringLiteral("must be a string"));
        if (items[i].toString().isEmpty() || items[i].toString().size() > maxLength)
            return fail(error, item, QStringLiteral("must have 1 to %1 characters").arg(maxLength));
        out->append(items[i].toString());
    }
    return true;
}

bool idList(const QJsonObject& body, QStringList* ids, FieldError* error)
{
    if (!body.contains(QLatin1String("ids")))
        return fail(error, QStringLiteral("ids"), QStringLiteral("is required"));
    if (!textList(body, QStringLiteral("ids"), kMaxIds, kMaxIdLength, ids, error))
        return false;
    if (ids->isEmpty())
        return fail(error, QStringLiteral("ids"), QStringLiteral("must name at least one alarm"));
    return true;
}

// Checks the terms of a search one by one, so that a refusal names the field at fault.
bool checkTerms(const QueryFilter& filter, const QDateTime& now, FieldError* error)
{
    QVariantMap args;
    QString problem;
    const auto each = [&](const QString& field, const QStringList& values,
                          QStringList QueryFilter::*member) {
        for (qsizetype i = 0; i < values.size(); ++i) {
            QueryFilter one;
            one.*member = QStringList{values[i]};
            if (!QueryArguments::build(one, now, &args, &problem))
                return fail(error, QStringLiteral("%1[%2]").arg(field).arg(i), problem);
        }
        return true;
    };
    if (!each(QStringLiteral("events"), filter.events, &QueryFilter::events) ||
        !each(QStringLiteral("eventGroups"), filter.eventGroups, &QueryFilter::eventGroups) ||
        !each(QStringLiteral("states"), filter.states, &QueryFilter::states))
        return false;
    QString time;
    if (!filter.from.isEmpty() && !TimeArgument::parse(filter.from, TimeArgument::Bound::Start, now,
                                                       filter.zone, &time, &problem))
        return fail(error, QStringLiteral("from"), problem);
    if (!filter.to.isEmpty() && !TimeArgument::parse(filter.to, TimeArgument::Bound::End, now,
                                                     filter.zone, &time, &problem))
        return fail(error, QStringLiteral("to"), problem);
    return true;
}

} // namespace

bool object(const QByteArray& body, QJsonObject* object, FieldError* error)
{
    if (body.size() > kMaxBodyBytes)
        return fail(error, QStringLiteral("body"),
                    QStringLiteral("larger than %1 bytes").arg(kMaxBodyBytes));
    if (body.trimmed().isEmpty()) {
        *object = QJsonObject();
        return true;
    }
    QJsonParseError parseError;
    const QJsonDocument document = QJsonDocument::fromJson(body, &parseError);
    if (parseError.error != QJsonParseError::NoError)
        return fail(error, QStringLiteral("body"),
                    QStringLiteral("not JSON: %1 at offset %2")
                        .arg(parseError.errorString())
                        .arg(parseError.offset));
    if (!document.isObject())
        return fail(error, QStringLiteral("body"), QStringLiteral("must be a JSON object"));
    *object = document.object();
    return true;
}

bool search(const QJsonObject& body, bool unhandledOnly, const QDateTime& now, Search* search,
            FieldError* error)
{
    QStringList known{QStringLiteral("events"),  QStringLiteral("eventGroups"),
                      QStringLiteral("from"),    QStringLiteral("to"),
                      QStringLiteral("names"),   QStringLiteral("devices"),
                      QStringLiteral("exclude"), QStringLiteral("xml")};
    if (!unhandledOnly)
        known.append(QStringLiteral("states"));
    if (!onlyKnownFields(body, known, error))
        return false;

    QueryFilter filter;
    filter.unhandledOnly = unhandledOnly;
    const QJsonValue xml = body.value(QLatin1String("xml"));
    if (!xml.isUndefined() && !xml.isBool())
        return fail(error, QStringLiteral("xml"), QStringLiteral("must be true or false"));
    if (!textList(body, QStringLiteral("events"), kMaxListItems, kMaxTextLength, &filter.events,
                  error) ||
        !textList(body, QStringLiteral("eventGroups"), 3, kMaxTextLength, &filter.eventGroups,
                  error) ||
        !textList(body, QStringLiteral("states"), int(ALARM_STATES.size()), kMaxTextLength,
                  &filter.states, error) ||
        !text(body, QStringLiteral("from"), kMaxTextLength, &filter.from, error) ||
        !text(body, QStringLiteral("to"), kMaxTextLength, &filter.to, error) ||
        !textList(body, QStringLiteral("names"), kMaxListItems, kMaxTextLength, &filter.names,
                  error) ||
        !textList(body, QStringLiteral("devices"), kMaxListItems, kMaxTextLength, &filter.devices,
                  error) ||
        !textList(body, QStringLiteral("exclude"), AlarmSearchLimits::MaxRecords, kMaxIdLength,
                  &search->exclude, error))
        return false;
    if (!checkTerms(filter, now, error))
        return false;
    QString problem;
    if (!QueryArguments::build(filter, now, &search->args, &problem))
        return fail(error, QStringLiteral("from"), problem);
    search->method = QueryArguments::method(filter);
    search->keepXml = xml.toBool();
    search->body = body;
    return true;
}

bool update(const QJsonObject& body, Update* update, FieldError* error)
{
    if (!onlyKnownFields(body,
                         {QStringLiteral("ids"), QStringLiteral("state"), QStringLiteral("note")},
                         error) ||
        !idList(body, &update->ids, error))
        return false;
    QString state;
    if (!body.contains(QLatin1String("state")))
        return fail(error, QStringLiteral("state"), QStringLiteral("is required"));
    if (!text(body, QStringLiteral("state"), kMaxTextLength, &state, error) ||
        !text(body, QStringLiteral("note"), kMaxNoteLength, &update->note, error))
        return false;
    QString problem;
    if (!QueryArguments::canonicalState(state, &update->state, &problem))
        return fail(error, QStringLiteral("state"), problem);
    return true;
}

bool mute(const QJsonObject& body, bool isMute, Mute* mute, FieldError* error)
{
    QStringList known{QStringLiteral("ids")};
    if (isMute)
        known.append(QStringLiteral("seconds"));
    if (!onlyKnownFields(body, known, error) || !idList(body, &mute->ids, error))
        return false;
    if (!isMute)
        return true;
    const QJsonValue seconds = body.value(QLatin1String("seconds"));
    if (seconds.isUndefined())
        return fail(error, QStringLiteral("seconds"), QStringLiteral("is required"));
    const double value = seconds.toDouble(-1);
    if (!seconds.isDouble() || value < 1 || value > kMaxMuteSeconds || value != std::floor(value))
        return fail(error, QStringLiteral("seconds"),
                    QStringLiteral("must be a whole number from 1 to %1").arg(kMaxMuteSeconds));
    mute->seconds = int(value);
    return true;
}

bool alarmId(const QString& id, FieldError* error)
{
    if (id.isEmpty() || id.size() > kMaxIdLength)
        return fail(error, QStringLiteral("alarmId"),
                    QStringLiteral("must have 1 to %1 characters").arg(kMaxIdLength));
    return true;
}

} // namespace ApiRequest
