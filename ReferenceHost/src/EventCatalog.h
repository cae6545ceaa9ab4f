#pragma once

#include <QList>
#include <QString>
#include <QStringList>

// The trigger events a search can name, read from the ready-made filters: each event class with
// the attribute that narrows it and its sub-events. Names are matched ignoring letter case and
// written as the server spells them.
class EventCatalog
{
public:
    struct EventClass
    {
        QString name;          // "CamEvent"
        QString attribute;     // "CameraEvent"; empty for a class without sub-events
        QStringList subEvents; // "Motion", ...
        QString group;         // "camera", "system" or "external"
    };

    static const QList<EventClass>& classes();
    // The filter element for "CLASS" or "CLASS:SUBEVENT", e.g.
    // <Event CameraEvent="Motion">CamEvent</Event>. False with a message that lists the valid
    // names when the class or sub-event is unknown.
    static bool element(const QString& event, QString* element, QString* errorMessage);
    // The ready-made filter of a group: camera, system or external.
    static bool groupFilter(const QString& group, QString* elements, QString* errorMessage);
    // One line per class: its group, name and sub-events.
    static QString listing();
};
