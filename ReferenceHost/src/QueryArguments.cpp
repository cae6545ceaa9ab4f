#include "QueryArguments.h"

#include "EventCatalog.h"
#include "TimeArgument.h"

#include <PluginAlarmSearchCommon.h>

using namespace PluginAlarmSearchCommon;

namespace {

const QString kUnhandled = QStringLiteral("Unhandled");

} // namespace

const QStringList& QueryArguments::alarmStates()
{
    static const QStringList states{kUnhandled, QStringLiteral("Processing"),
                                    QStringLiteral("Handled"), QStringLiteral("FalseAlarm")};
    return states;
}

QString QueryArguments::method(const QueryFilter& filter)
{
    return filter.unhandledOnly ? METHOD_QUERY_UNHANDLED_ALARM : METHOD_QUERY_ALARM_LIST;
}

bool QueryArguments::canonicalState(const QString& text, QString* state, QString* errorMessage)
{
    QString folded = text;
    folded.remove(QLatin1Char('-')).remove(QLatin1Char('_'));
    for (const QString& known : alarmStates()) {
        if (known.compare(folded, Qt::CaseInsensitive) == 0) {
            *state = known;
            return true;
        }
    }
    *errorMessage = QStringLiteral("unknown state \"%1\" (expected one of %2)")
                        .arg(text, alarmStates().join(QLatin1String(", ")));
    return false;
}

QString QueryArguments::stateFilter(const QStringList& states)
{
    QString stateList;
    for (const QString& state : states)
        stateList += QStringLiteral("<State>%1</State>").arg(state);
    return QStringLiteral("<AlarmStateList>%1</AlarmStateList>").arg(stateList);
}

bool QueryArguments::build(const QueryFilter& filter, const QDateTime& now, QVariantMap* args,
                           QString* errorMessage)
{
    QString events;
    for (const QString& group : filter.eventGroups) {
        QString elements;
        if (!EventCatalog::groupFilter(group, &elements, errorMessage))
            return false;
        events += elements;
    }
    for (const QString& event : filter.events) {
        QString element;
        if (!EventCatalog::element(event, &element, errorMessage))
            return false;
        events += element;
    }

    QStringList states;
    for (const QString& text : filter.states) {
        QString state;
        if (!canonicalState(text, &state, errorMessage))
            return false;
        states.append(state);
    }
    if (filter.unhandledOnly) {
        if (!states.isEmpty() && states != QStringList{kUnhandled}) {
            *errorMessage = QStringLiteral("--unhandled cannot be combined with other states");
            return false;
        }
        states = QStringList{kUnhandled};
    }

    QString startTime;
    QString endTime;
    if (!filter.from.isEmpty() && !TimeArgument::parse(filter.from, TimeArgument::Bound::Start, now,
                                                       filter.zone, &startTime, errorMessage))
        return false;
    if (!filter.to.isEmpty() && !TimeArgument::parse(filter.to, TimeArgument::Bound::End, now,
                                                     filter.zone, &endTime, errorMessage))
        return false;
    if (!startTime.isEmpty() && !endTime.isEmpty() && startTime > endTime) {
        *errorMessage = QStringLiteral("--from %1 is after --to %2").arg(startTime, endTime);
        return false;
    }

    QVariantList rules;
    if (!filter.names.isEmpty())
        rules.append(QVariantMap{{QStringLiteral("type"), 0},
                                 {QStringLiteral("tagList"), QVariant(filter.names)}});
    if (!filter.devices.isEmpty())
        rules.append(QVariantMap{{QStringLiteral("type"), 1},
                                 {QStringLiteral("tagList"), QVariant(filter.devices)}});

    args->clear();
    if (!events.isEmpty())
        args->insert(ARG_TRIGGER_EVENT_FILTER, events);
    if (!states.isEmpty())
        args->insert(ARG_STATE_FILTER, stateFilter(states));
    if (!rules.isEmpty())
        args->insert(ARG_RULES, rules);
    if (!startTime.isEmpty())
        args->insert(ARG_START_TIME, startTime);
    if (!endTime.isEmpty())
        args->insert(ARG_END_TIME, endTime);
    return true;
}
