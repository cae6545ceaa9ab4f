#include "QueryArguments.h"

#include "EventCatalog.h"
#include "TimeArgument.h"

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>

#include <QRegularExpression>

using namespace PluginAlarmSearchCommon;

QString QueryArguments::stateChoices()
{
    return ALARM_STATES.mid(0, ALARM_STATES.size() - 1).join(QLatin1String(", ")) +
           QLatin1String(" or ") + ALARM_STATES.constLast();
}

QString QueryArguments::method(const QueryFilter& filter)
{
    return filter.unhandledOnly ? METHOD_QUERY_UNHANDLED_ALARM : METHOD_QUERY_ALARM_LIST;
}

bool QueryArguments::canonicalState(const QString& text, QString* state, QString* errorMessage)
{
    QString folded = text;
    folded.remove(QLatin1Char('-')).remove(QLatin1Char('_'));
    for (const QString& known : ALARM_STATES) {
        if (known.compare(folded, Qt::CaseInsensitive) == 0) {
            *state = known;
            return true;
        }
    }
    *errorMessage = QStringLiteral("unknown state \"%1\" (expected one of %2)")
                        .arg(text, ALARM_STATES.join(QLatin1String(", ")));
    return false;
}

QString QueryArguments::stateFilter(const QStringList& states)
{
    QString stateList;
    for (const QString& state : states)
        stateList += QStringLiteral("<State>%1</State>").arg(state);
    return QStringLiteral("<AlarmStateList>%1</AlarmStateList>").arg(stateList);
}

namespace {

// The Event elements of the filter's event groups and events, in that order.
bool eventElements(const QueryFilter& filter, QString* events, QString* errorMessage)
{
    for (const QString& group : filter.eventGroups) {
        QString elements;
        if (!EventCatalog::groupFilter(group, &elements, errorMessage))
            return false;
        *events += elements;
    }
    for (const QString& event : filter.events) {
        QString element;
        if (!EventCatalog::element(event, &element, errorMessage))
            return false;
        *events += element;
    }
    return true;
}

// The filter's states in the server's spelling; an unhandled-only search has that one state.
bool serverStates(const QueryFilter& filter, QStringList* states, QString* errorMessage)
{
    for (const QString& text : filter.states) {
        QString state;
        if (!QueryArguments::canonicalState(text, &state, errorMessage))
            return false;
        states->append(state);
    }
    if (filter.unhandledOnly) {
        if (!states->isEmpty() && *states != QStringList{STATE_UNHANDLED}) {
            *errorMessage = QStringLiteral("--unhandled cannot be combined with other states");
            return false;
        }
        *states = QStringList{STATE_UNHANDLED};
    }
    return true;
}

// The time bounds in the server's form; either may stay empty, the start not after the end.
bool serverTimes(const QueryFilter& filter, const QDateTime& now, QString* startTime,
                 QString* endTime, QString* errorMessage)
{
    if (!filter.from.isEmpty() && !TimeArgument::parse(filter.from, TimeArgument::Bound::Start, now,
                                                       filter.zone, startTime, errorMessage))
        return false;
    if (!filter.to.isEmpty() && !TimeArgument::parse(filter.to, TimeArgument::Bound::End, now,
                                                     filter.zone, endTime, errorMessage))
        return false;
    if (!startTime->isEmpty() && !endTime->isEmpty() && *startTime > *endTime) {
        *errorMessage = QStringLiteral("--from %1 is after --to %2").arg(*startTime, *endTime);
        return false;
    }
    return true;
}

// The name and device-name rules of the filter.
QVariantList rules(const QueryFilter& filter)
{
    QVariantList rules;
    if (!filter.names.isEmpty())
        rules.append(QVariantMap{{ARG_RULE_TYPE, RULE_TYPE_NAME},
                                 {ARG_RULE_TAG_LIST, QVariant(filter.names)}});
    if (!filter.devices.isEmpty())
        rules.append(QVariantMap{{ARG_RULE_TYPE, RULE_TYPE_DEVICE_NAME},
                                 {ARG_RULE_TAG_LIST, QVariant(filter.devices)}});
    return rules;
}

} // namespace

bool QueryArguments::build(const QueryFilter& filter, const QDateTime& now, QVariantMap* args,
                           QString* errorMessage)
{
    QString events;
    QStringList states;
    QString startTime;
    QString endTime;
    if (!eventElements(filter, &events, errorMessage) ||
        !serverStates(filter, &states, errorMessage) ||
        !serverTimes(filter, now, &startTime, &endTime, errorMessage))
        return false;
    args->clear();
    const auto insertText = [args](const QString& key, const QString& text) {
        if (!text.isEmpty())
            args->insert(key, text);
    };
    insertText(ARG_TRIGGER_EVENT_FILTER, events);
    if (!states.isEmpty())
        args->insert(ARG_STATE_FILTER, stateFilter(states));
    const QVariantList nameRules = rules(filter);
    if (!nameRules.isEmpty())
        args->insert(ARG_RULES, nameRules);
    insertText(ARG_START_TIME, startTime);
    insertText(ARG_END_TIME, endTime);
    return true;
}

namespace {

QString unescaped(QString text)
{
    return text.replace(QLatin1String("&lt;"), QLatin1String("<"))
        .replace(QLatin1String("&gt;"), QLatin1String(">"))
        .replace(QLatin1String("&quot;"), QLatin1String("\""))
        .replace(QLatin1String("&amp;"), QLatin1String("&"));
}

// The texts of the elements the pattern matches; false when anything but blanks stands between.
bool elementTexts(const QString& text, const QRegularExpression& pattern,
                  QList<QRegularExpressionMatch>* matches)
{
    qsizetype at = 0;
    auto it = pattern.globalMatch(text);
    while (it.hasNext()) {
        const QRegularExpressionMatch match = it.next();
        if (!text.mid(at, match.capturedStart() - at).trimmed().isEmpty())
            return false;
        matches->append(match);
        at = match.capturedEnd();
    }
    return text.mid(at).trimmed().isEmpty();
}

} // namespace

bool QueryArguments::filterOf(const QVariantMap& args, QueryFilter* filter, QString* errorMessage)
{
    static const QRegularExpression event(
        QStringLiteral("<Event(?:\\s+\\w+=\"([^\"]*)\")?\\s*>([^<]*)</Event>"));
    static const QRegularExpression state(QStringLiteral("<State>([^<]*)</State>"));
    *filter = QueryFilter();
    QList<QRegularExpressionMatch> matches;
    if (!elementTexts(args.value(ARG_TRIGGER_EVENT_FILTER).toString(), event, &matches)) {
        *errorMessage = QStringLiteral("this trigger-event filter has no CLASS[:SUBEVENT] form");
        return false;
    }
    for (const QRegularExpressionMatch& match : std::as_const(matches)) {
        const QString eventClass = unescaped(match.captured(2).trimmed());
        filter->events.append(match.captured(1).isNull()
                                  ? eventClass
                                  : eventClass + QLatin1Char(':') + unescaped(match.captured(1)));
    }
    QString states = args.value(ARG_STATE_FILTER).toString().trimmed();
    if (states.startsWith(QLatin1String("<AlarmStateList>")) &&
        states.endsWith(QLatin1String("</AlarmStateList>")))
        states = states.mid(16, states.size() - 16 - 17);
    matches.clear();
    if (!elementTexts(states, state, &matches)) {
        *errorMessage = QStringLiteral("this state filter is no list of states");
        return false;
    }
    for (const QRegularExpressionMatch& match : std::as_const(matches))
        filter->states.append(match.captured(1).trimmed());
    for (const QVariant& rule : args.value(ARG_RULES).toList()) {
        const QVariantMap fields = rule.toMap();
        const int type = fields.value(ARG_RULE_TYPE).toInt();
        const QStringList tags = fields.value(ARG_RULE_TAG_LIST).toStringList();
        if (type == RULE_TYPE_NAME)
            filter->names += tags;
        else if (type == RULE_TYPE_DEVICE_NAME)
            filter->devices += tags;
    }
    filter->from = args.value(ARG_START_TIME).toString();
    filter->to = args.value(ARG_END_TIME).toString();
    return true;
}
