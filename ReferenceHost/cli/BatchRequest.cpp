#include "BatchRequest.h"

#include <EventCatalog.h>
#include <QueryArguments.h>
#include <TimeArgument.h>

#include <PluginAlarmSearchCommon.h>

#include <QJsonArray>

#include <cmath>

using namespace PluginAlarmSearchCommon;

namespace {

const QString kAll = QStringLiteral("all");

// Reads one argument value into what the plug-in expects; false with *error set.
// A null reader stands for times, which need the request's clock and zone.
using Reader = bool (*)(const QJsonValue& value, QVariant* out, QString* error);

struct Key
{
    QString name;
    Reader read;
    bool required;
};

// A text or a list of texts; *items gets them.
bool textOrList(const QJsonValue& value, QStringList* items, QString* error)
{
    if (value.isString()) {
        *items = QStringList{value.toString()};
        return true;
    }
    if (!value.isArray()) {
        *error = QStringLiteral("expected a text or a list of texts");
        return false;
    }
    for (const QJsonValue item : value.toArray()) {
        if (!item.isString()) {
            *error = QStringLiteral("expected a text or a list of texts");
            return false;
        }
        items->append(item.toString());
    }
    return true;
}

bool readText(const QJsonValue& value, QVariant* out, QString* error)
{
    if (!value.isString()) {
        *error = QStringLiteral("expected a text");
        return false;
    }
    *out = value.toString();
    return true;
}

bool readIds(const QJsonValue& value, QVariant* out, QString* error)
{
    QStringList ids;
    if (!textOrList(value, &ids, error))
        return false;
    *out = ids;
    return true;
}

bool readBool(const QJsonValue& value, QVariant* out, QString* error)
{
    if (!value.isBool()) {
        *error = QStringLiteral("expected true or false");
        return false;
    }
    *out = value.toBool();
    return true;
}

bool readSeconds(const QJsonValue& value, QVariant* out, QString* error)
{
    const double seconds = value.toDouble(-1);
    if (!value.isDouble() || seconds < 0 || seconds > 1e9 || seconds != std::floor(seconds)) {
        *error = QStringLiteral("expected a whole number of seconds");
        return false;
    }
    *out = int(seconds);
    return true;
}

bool readState(const QJsonValue& value, QVariant* out, QString* error)
{
    QString state;
    if (!value.isString()) {
        *error = QStringLiteral("expected a state name");
        return false;
    }
    if (!QueryArguments::canonicalState(value.toString(), &state, error))
        return false;
    *out = state;
    return true;
}

// State names (or the raw <AlarmStateList> element).
bool readStateFilter(const QJsonValue& value, QVariant* out, QString* error)
{
    QStringList names;
    if (!textOrList(value, &names, error))
        return false;
    if (names.size() == 1 && names[0].trimmed().startsWith(QLatin1Char('<'))) {
        *out = names[0];
        return true;
    }
    QStringList states;
    for (const QString& name : std::as_const(names)) {
        QString state;
        if (!QueryArguments::canonicalState(name, &state, error))
            return false;
        states.append(state);
    }
    *out = QueryArguments::stateFilter(states);
    return true;
}

// Event names ("CamEvent:Motion"), groups ("camera"), or raw <Event> elements.
bool readEventFilter(const QJsonValue& value, QVariant* out, QString* error)
{
    QStringList names;
    if (!textOrList(value, &names, error))
        return false;
    if (names.size() == 1 && names[0].trimmed().startsWith(QLatin1Char('<'))) {
        *out = names[0];
        return true;
    }
    QString elements;
    for (const QString& name : std::as_const(names)) {
        QString element;
        QString groupError;
        if (!EventCatalog::groupFilter(name, &element, &groupError) &&
            !EventCatalog::element(name, &element, error))
            return false;
        elements += element;
    }
    *out = elements;
    return true;
}

bool readRules(const QJsonValue& value, QVariant* out, QString* error)
{
    QVariantList rules;
    *error = QStringLiteral("expected a list of {\"%1\": %2 or %3, \"%4\": [texts]}")
                 .arg(ARG_RULE_TYPE)
                 .arg(RULE_TYPE_NAME)
                 .arg(RULE_TYPE_DEVICE_NAME)
                 .arg(ARG_RULE_TAG_LIST);
    if (!value.isArray())
        return false;
    for (const QJsonValue rule : value.toArray()) {
        const QJsonObject object = rule.toObject();
        const QJsonValue type = object.value(ARG_RULE_TYPE);
        QStringList tags;
        QString tagError;
        if (!rule.isObject() || object.size() != 2 ||
            (type.toInt(-1) != RULE_TYPE_NAME && type.toInt(-1) != RULE_TYPE_DEVICE_NAME) ||
            !object.value(ARG_RULE_TAG_LIST).isArray() ||
            !textOrList(object.value(ARG_RULE_TAG_LIST), &tags, &tagError))
            return false;
        rules.append(QVariantMap{{ARG_RULE_TYPE, type.toInt()}, {ARG_RULE_TAG_LIST, tags}});
    }
    error->clear();
    *out = rules;
    return true;
}

const QList<Key>& keysOf(const QString& method)
{
    static const Key relayPath{ARG_RELAY_PATH, readText, false};
    static const QList<Key> search{{ARG_TRIGGER_EVENT_FILTER, readEventFilter, false},
                                   {ARG_STATE_FILTER, readStateFilter, false},
                                   {ARG_START_TIME, nullptr, false},
                                   {ARG_END_TIME, nullptr, false},
                                   {ARG_RULES, readRules, false},
                                   relayPath,
                                   {kAll, readBool, false}};
    static const QList<Key> update{{ARG_ALARM_ID_LIST, readIds, true},
                                   {ARG_ALARM_STATUS, readState, true},
                                   {ARG_ALARM_COMMENT, readText, false},
                                   relayPath};
    static const QList<Key> history{{ARG_ALARM_ID, readText, true}, relayPath};
    static const QList<Key> mute{{ARG_ALARM_ID_LIST, readIds, true},
                                 {ARG_IS_MUTE, readBool, true},
                                 {ARG_MUTE_TIME_SECOND, readSeconds, false}};
    if (method == METHOD_QUERY_ALARM_LIST || method == METHOD_QUERY_UNHANDLED_ALARM)
        return search;
    if (method == METHOD_UPDATE_ALARM)
        return update;
    if (method == METHOD_MUTE_ALARM)
        return mute;
    return history;
}

QString keyNames(const QList<Key>& keys)
{
    QStringList names;
    for (const Key& key : keys)
        names.append(key.name);
    return names.join(QLatin1String(", "));
}

} // namespace

const QStringList& BatchRequest::methods()
{
    static const QStringList methods{METHOD_QUERY_UNHANDLED_ALARM,
                                     METHOD_QUERY_ALARM_LIST,
                                     METHOD_UPDATE_ALARM,
                                     METHOD_GET_ALARM_HISTORY,
                                     METHOD_GET_ALARM_HISTORY_FOR_EXPORT,
                                     METHOD_MUTE_ALARM};
    return methods;
}

bool BatchRequest::read(const QJsonObject& line, const QDateTime& now, const QTimeZone& zone,
                        BatchRequest* request, QString* errorMessage)
{
    for (auto it = line.begin(); it != line.end(); ++it) {
        if (it.key() != QLatin1String("method") && it.key() != QLatin1String("args")) {
            *errorMessage = QStringLiteral("unknown key \"%1\" (expected \"method\" and \"args\")")
                                .arg(it.key());
            return false;
        }
    }
    request->method = line.value(QLatin1String("method")).toString();
    if (!methods().contains(request->method)) {
        *errorMessage =
            QStringLiteral("\"method\" must be one of %1").arg(methods().join(QLatin1String(", ")));
        return false;
    }
    const QJsonValue args = line.value(QLatin1String("args"));
    if (!args.isObject() && !args.isUndefined()) {
        *errorMessage = QStringLiteral("\"args\" must be an object");
        return false;
    }
    const QJsonObject given = args.toObject();
    const QList<Key>& keys = keysOf(request->method);
    for (auto it = given.begin(); it != given.end(); ++it) {
        const auto key = std::find_if(keys.begin(), keys.end(),
                                      [&](const Key& k) { return k.name == it.key(); });
        if (key == keys.end()) {
            *errorMessage = QStringLiteral("args.%1: unknown key for %2 (expected %3)")
                                .arg(it.key(), request->method, keyNames(keys));
            return false;
        }
        QVariant value;
        QString error;
        bool ok = false;
        if (key->read) {
            ok = key->read(it.value(), &value, &error);
        } else if (it.value().isString()) {
            // Times: any of the command line's forms.
            QString serverTime;
            const auto bound =
                key->name == ARG_START_TIME ? TimeArgument::Bound::Start : TimeArgument::Bound::End;
            ok = TimeArgument::parse(it.value().toString(), bound, now, zone, &serverTime, &error);
            value = serverTime;
        } else {
            error = QStringLiteral("expected a time text");
        }
        if (!ok) {
            *errorMessage = QStringLiteral("args.%1: %2").arg(it.key(), error);
            return false;
        }
        if (key->name == kAll)
            request->all = value.toBool();
        else
            request->args.insert(key->name, value);
    }
    for (const Key& key : keys) {
        if (key.required && !given.contains(key.name)) {
            *errorMessage =
                QStringLiteral("args.%1: required for %2").arg(key.name, request->method);
            return false;
        }
    }
    return true;
}
