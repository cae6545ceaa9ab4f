#include "AlarmFilter.h"

#include "CommandXml.h"
#include "FieldFormats.h"

#include <AlarmSearchLimits.h>

#include <QJsonArray>
#include <QJsonDocument>
#include <QRegularExpression>
#include <QUrl>

namespace AlarmServerSim {

namespace {

// "+hh:mm" or "-hh:mm" as seconds ahead of UTC; empty text is UTC.
std::optional<int> parseZoneOffset(const QString& text)
{
    if (text.isEmpty())
        return 0;
    static const QRegularExpression pattern(QStringLiteral("^([+-])(\\d{2}):(\\d{2})$"));
    const QRegularExpressionMatch match = pattern.match(text);
    if (!match.hasMatch())
        return std::nullopt;
    const int seconds = match.captured(2).toInt() * 3600 + match.captured(3).toInt() * 60;
    if (seconds > 14 * 3600)
        return std::nullopt;
    return match.captured(1) == QLatin1String("-") ? -seconds : seconds;
}

// Collects the conditions that all must hold.
class ConditionBuilder
{
public:
    void add(const QString& condition) { m_conditions.append(condition); }
    void bind(const QVariant& value) { m_bindings.append(value); }
    // Adds the condition, which reads the items from json_each(?), bound to them as one JSON
    // array; nothing when there are none.
    void addForAnyOf(const QString& condition, const QJsonArray& items)
    {
        if (items.isEmpty())
            return;
        add(condition);
        bind(QString::fromUtf8(QJsonDocument(items).toJson(QJsonDocument::Compact)));
    }

    QString where() const
    {
        return m_conditions.isEmpty() ? QStringLiteral("1")
                                      : m_conditions.join(QLatin1String(" AND "));
    }
    QVariantList bindings() const { return m_bindings; }

private:
    QStringList m_conditions;
    QVariantList m_bindings;
};

// An Event with an attribute names one sub-event of its class; without, the whole class. Each
// becomes [class] or [class, sub-event type, sub-event].
void addEvents(ConditionBuilder& builder, const XmlElement& list)
{
    QJsonArray events;
    for (const XmlElement* event : list.childrenNamed(u"Event")) {
        QJsonArray item{event->text.trimmed()};
        if (!event->attributes.isEmpty())
            item << event->attributes.first().first << event->attributes.first().second;
        events.append(item);
    }
    builder.addForAnyOf(
        QStringLiteral("EXISTS (SELECT 1 FROM json_each(?) AS e WHERE "
                       "event_class = e.value ->> 0 AND (json_array_length(e.value) = 1 OR "
                       "(sub_event_type = e.value ->> 1 AND sub_event = e.value ->> 2)))"),
        events);
}

// The folded texts of the items.
QJsonArray foldedTexts(const QList<const XmlElement*>& items, bool percentEncoded)
{
    QJsonArray texts;
    for (const XmlElement* item : items) {
        const QString text = item->text.trimmed();
        texts.append(foldName(percentEncoded ? QUrl::fromPercentEncoding(text.toUtf8()) : text));
    }
    return texts;
}

void addFilters(ConditionBuilder& builder, const XmlElement& filters)
{
    if (const XmlElement* events = filters.child(u"TriggerEventList"))
        addEvents(builder, *events);
    if (const XmlElement* states = filters.child(u"AlarmStateList")) {
        QJsonArray names;
        for (const XmlElement* state : states->childrenNamed(u"State"))
            names.append(state->text.trimmed());
        builder.addForAnyOf(QStringLiteral("state IN (SELECT value FROM json_each(?))"), names);
    }
    for (const XmlElement* names : filters.childrenNamed(u"NameList"))
        builder.addForAnyOf(QStringLiteral("EXISTS (SELECT 1 FROM json_each(?) "
                                           "WHERE instr(alarm_name_folded, value) > 0)"),
                            foldedTexts(names->childrenNamed(u"Name"), true));
    for (const XmlElement* devices : filters.childrenNamed(u"TriggerDeviceNameList"))
        builder.addForAnyOf(
            QStringLiteral("device_name_folded IN (SELECT value FROM json_each(?))"),
            foldedTexts(devices->childrenNamed(u"DeviceName"), false));
}

bool addTimeBound(ConditionBuilder& builder, const XmlElement& bound)
{
    const std::optional<int> offset = parseZoneOffset(bound.childText(u"TZ"));
    if (!offset)
        return false;
    const std::pair<QStringView, QString> limits[] = {
        {u"StartTm", QStringLiteral("server_time >= ?")},
        {u"EndTm", QStringLiteral("server_time <= ?")}};
    for (const auto& [tag, condition] : limits) {
        const QString text = bound.childText(tag);
        if (text.isEmpty())
            continue;
        const std::optional<qint64> time = parseTime(text, *offset);
        if (!time)
            return false;
        builder.add(condition);
        builder.bind(*time);
    }
    return true;
}

} // namespace

std::optional<AlarmFilter> alarmFilterFromCommand(const XmlElement& command)
{
    ConditionBuilder builder;
    if (const XmlElement* filters = command.child(u"Filters"))
        addFilters(builder, *filters);
    if (const XmlElement* bound = command.child(u"TmBound")) {
        if (!addTimeBound(builder, *bound))
            return std::nullopt;
    }

    AlarmFilter filter;
    filter.limit = AlarmSearchLimits::MaxRecords;
    const QString maxRecords = command.childText(u"MaxRec");
    if (!maxRecords.isEmpty()) {
        bool ok = false;
        const int requested = maxRecords.toInt(&ok);
        if (!ok || requested <= 0)
            return std::nullopt;
        filter.limit = qMin(requested, AlarmSearchLimits::MaxRecords);
    }
    if (const XmlElement* order = command.child(u"OrderBy"))
        filter.descending = order->childText(u"Descending") != QLatin1String("false");
    filter.where = builder.where();
    filter.bindings = builder.bindings();
    return filter;
}

} // namespace AlarmServerSim
