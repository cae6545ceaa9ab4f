#include "EventCatalog.h"

#include <PluginAlarmSearchCommon.h>

#include <QRegularExpression>

using namespace PluginAlarmSearchCommon;

namespace {

struct Group
{
    const char* name;
    const QString* filter;
};

const Group kGroups[] = {{"camera", &CAMERA_TRIGGER_EVENT_FILTER_STRING},
                         {"system", &SYSTEM_TRIGGER_EVENT_FILTER_STRING},
                         {"external", &EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING}};

QList<EventCatalog::EventClass> readFilters()
{
    static const QRegularExpression pattern(
        QStringLiteral("<Event(?: (\\w+)=\"([^\"]*)\")?>([^<]+)</Event>"));
    QList<EventCatalog::EventClass> classes;
    for (const Group& group : kGroups) {
        auto matches = pattern.globalMatch(*group.filter);
        while (matches.hasNext()) {
            const QRegularExpressionMatch match = matches.next();
            const QString name = match.captured(3);
            auto known = std::find_if(classes.begin(), classes.end(),
                                      [&](const auto& c) { return c.name == name; });
            if (known == classes.end()) {
                classes.append({name, match.captured(1), {}, QString::fromLatin1(group.name)});
                known = classes.end() - 1;
            }
            if (!match.captured(2).isEmpty())
                known->subEvents.append(match.captured(2));
        }
    }
    return classes;
}

QString names(const QStringList& list)
{
    return list.join(QLatin1String(", "));
}

} // namespace

const QList<EventCatalog::EventClass>& EventCatalog::classes()
{
    static const QList<EventClass> classes = readFilters();
    return classes;
}

bool EventCatalog::element(const QString& event, QString* element, QString* errorMessage)
{
    const qsizetype colon = event.indexOf(QLatin1Char(':'));
    const QString className = event.left(colon).trimmed();
    const QString subEvent = colon < 0 ? QString() : event.mid(colon + 1).trimmed();
    QStringList classNames;
    for (const EventClass& eventClass : classes()) {
        classNames.append(eventClass.name);
        if (eventClass.name.compare(className, Qt::CaseInsensitive) != 0)
            continue;
        if (colon < 0) {
            *element = QStringLiteral("<Event>%1</Event>").arg(eventClass.name);
            return true;
        }
        for (const QString& known : eventClass.subEvents) {
            if (known.compare(subEvent, Qt::CaseInsensitive) == 0) {
                *element = QStringLiteral("<Event %1=\"%2\">%3</Event>")
                               .arg(eventClass.attribute, known, eventClass.name);
                return true;
            }
        }
        *errorMessage =
            eventClass.subEvents.isEmpty()
                ? QStringLiteral("event class %1 has no sub-events").arg(eventClass.name)
                : QStringLiteral("unknown sub-event \"%1\" of %2 (expected one of %3)")
                      .arg(subEvent, eventClass.name, names(eventClass.subEvents));
        return false;
    }
    *errorMessage = QStringLiteral("unknown event class \"%1\" (expected CLASS or CLASS:SUBEVENT, "
                                   "CLASS one of %2; 'alarmsearch classes' lists the sub-events)")
                        .arg(className, names(classNames));
    return false;
}

bool EventCatalog::groupFilter(const QString& group, QString* elements, QString* errorMessage)
{
    QStringList groupNames;
    for (const Group& known : kGroups) {
        groupNames.append(QString::fromLatin1(known.name));
        if (group.trimmed().compare(QLatin1String(known.name), Qt::CaseInsensitive) == 0) {
            *elements = *known.filter;
            return true;
        }
    }
    *errorMessage = QStringLiteral("unknown event group \"%1\" (expected one of %2)")
                        .arg(group, names(groupNames));
    return false;
}

QString EventCatalog::listing()
{
    QString text;
    for (const EventClass& eventClass : classes()) {
        text += QStringLiteral("%1 %2").arg(eventClass.group.leftJustified(9), eventClass.name);
        if (!eventClass.subEvents.isEmpty())
            text += QStringLiteral(": ") + names(eventClass.subEvents);
        text += QLatin1Char('\n');
    }
    return text;
}
