#include "AlarmFilter.h"

#include "AlarmRecord.h"
#include "CommandXml.h"

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
    // Adds the alternatives joined by OR, as one condition; nothing when there are none.
    void addAnyOf(const QStringList& alternatives)
    {
        if (!alternatives.isEmpty())
            m_conditions.append(QLatin1Char('(') + alternatives.join(QLatin1String(" OR ")) +
                                QLatin1Char(')'));
    }
    void add(const QString& condition) { m_conditions.append(condition); }
    void bind(const QVariant& value) { m_bindings.append(value); }

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

// An Event with an attribute names one sub-event of its class; without, the whole class.
void addEvents(ConditionBuilder& builder, const XmlElement& list)
{
    QStringList alternatives;
    for (const XmlElement* event : list.childrenNamed(u"Event")) {
        builder.bind(event->text.trimmed());
        if (event->attributes.isEmpty()) {
            alternatives.append(QStringLiteral("event_class = ?"));
            continue;
        }
        builder.bind(event->attributes.first().first);
        builder.bind(event->attributes.first().second);
        alternatives.append(
            QStringLiteral("(event_class = ? AND sub_event_type = ? AND sub_event = ?)"));
    }
    builder.addAnyOf(alternatives);
}

// Each item adds one alternative "column op ?" bound to the folded item text.
void addFoldedAlternatives(ConditionBuilder& builder, const QList<const XmlElement*>& items,
                           const QString& alternative, bool percentEncoded)
{
    QStringList alternatives;
    for (const XmlElement* item : items) {
        const QString text = item->text.trimmed();
        builder.bind(foldName(percentEncoded ? QUrl::fromPercentEncoding(text.toUtf8()) : text));
        alternatives.append(alternative);
    }
    builder.addAnyOf(alternatives);
}

void addFilters(ConditionBuilder& builder, const XmlElement& filters)
{
    if (const XmlElement* events = filters.child(u"TriggerEventList"))
        addEvents(builder, *events);
    if (const XmlElement* states = filters.child(u"AlarmStateList")) {
        QStringList alternatives;
        for (const XmlElement* state : states->childrenNamed(u"State")) {
            builder.bind(state->text.trimmed());
            alternatives.append(QStringLiteral("state = ?"));
        }
        builder.addAnyOf(alternatives);
    }
    for (const XmlElement* names : filters.childrenNamed(u"NameList"))
        addFoldedAlternatives(builder, names->childrenNamed(u"Name"),
                              QStringLiteral("instr(alarm_name_folded, ?) > 0"), true);
    for (const XmlElement* devices : filters.childrenNamed(u"TriggerDeviceNameList"))
        addFoldedAlternatives(builder, devices->childrenNamed(u"DeviceName"),
                              QStringLiteral("device_name_folded = ?"), false);
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
    filter.limit = kMaxRecords;
    const QString maxRecords = command.childText(u"MaxRec");
    if (!maxRecords.isEmpty()) {
        bool ok = false;
        const int requested = maxRecords.toInt(&ok);
        if (!ok || requested <= 0)
            return std::nullopt;
        filter.limit = qMin(requested, kMaxRecords);
    }
    if (const XmlElement* order = command.child(u"OrderBy"))
        filter.descending = order->childText(u"Descending") != QLatin1String("false");
    filter.where = builder.where();
    filter.bindings = builder.bindings();
    return filter;
}

} // namespace AlarmServerSim
