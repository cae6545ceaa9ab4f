#include "DemoAlarms.h"

#include "CommandXml.h"
#include "FieldFormats.h"

#include <AlarmFields.h>
#include <PluginAlarmSearchCommon.h>

#include <QHash>
#include <QRandomGenerator>
#include <QSqlError>
#include <QSqlQuery>

#include <algorithm>

using namespace PluginAlarmSearchCommon;

namespace AlarmServerSim {

namespace {

struct DemoEvent
{
    QString eventClass;
    QString subEventType; // empty for a whole class
    QString subEvent;
    int weight = 1; // relative frequency
    QString label;  // how alarm names call it
    const QStringList* devices = nullptr;
};

const QStringList kCameras = {
    QStringLiteral("Lobby Entrance"),        QStringLiteral("Main Gate"),
    QStringLiteral("Reception Desk"),        QStringLiteral("Parking Level 1 North"),
    QStringLiteral("Parking Level 1 South"), QStringLiteral("Parking Level 2 Ramp"),
    QStringLiteral("Loading Dock 1"),        QStringLiteral("Loading Dock 2"),
    QStringLiteral("Warehouse Aisle 3"),     QStringLiteral("Warehouse Aisle 7"),
    QStringLiteral("Server Room"),           QStringLiteral("Emergency Exit East"),
    QStringLiteral("Emergency Exit West"),   QStringLiteral("Cafeteria"),
    QStringLiteral("Elevator Hall 3F"),      QStringLiteral("Stairwell B 2F"),
    QStringLiteral("Perimeter Fence North"), QStringLiteral("Perimeter Fence South"),
    QStringLiteral("Bicycle Shelter"),       QStringLiteral("Cash Office"),
    QStringLiteral("Retail Floor Aisle 12"), QStringLiteral("Visitor Car Park"),
    QStringLiteral("Rooftop HVAC"),          QStringLiteral("Mail Room"),
    QStringLiteral("Laboratory Corridor"),   QStringLiteral("Pharmacy Storage"),
};

const QStringList kServers = {
    QStringLiteral("Recording Server 01"),   QStringLiteral("Recording Server 02"),
    QStringLiteral("Failover Server"),       QStringLiteral("Storage Array A"),
    QStringLiteral("Storage Array B"),       QStringLiteral("Management Station HQ"),
    QStringLiteral("Branch Station Harbor"),
};

const QStringList kVehicles = {
    QStringLiteral("Patrol Car 07"),
    QStringLiteral("Patrol Car 12"),
    QStringLiteral("City Bus 214"),
    QStringLiteral("Delivery Van 3"),
};

const QStringList kIoDevices = {
    QStringLiteral("IO Box Main Gate"),         QStringLiteral("Door Controller West Wing"),
    QStringLiteral("Access Panel Lobby"),       QStringLiteral("Alarm Panel Warehouse"),
    QStringLiteral("Barrier Parking Entrance"), QStringLiteral("Operator Desk Console"),
};

// How alarm names call each event, with its relative frequency in the demo data.
struct EventTraits
{
    QString label;
    int weight;
};

const QHash<QString, EventTraits> kTraits = {
    {QStringLiteral("DI"), {QStringLiteral("Digital Input"), 4}},
    {QStringLiteral("DO"), {QStringLiteral("Digital Output"), 1}},
    {QStringLiteral("Motion"), {QStringLiteral("Motion"), 20}},
    {QStringLiteral("VideoLossRestore"), {QStringLiteral("Video Loss"), 5}},
    {QStringLiteral("PIR"), {QStringLiteral("PIR Detection"), 3}},
    {QStringLiteral("Tampering"), {QStringLiteral("Camera Tampering"), 4}},
    {QStringLiteral("Temperature"), {QStringLiteral("Temperature Alert"), 1}},
    {QStringLiteral("IR"), {QStringLiteral("IR Illuminator Failure"), 1}},
    {QStringLiteral("SmartSD"), {QStringLiteral("SD Card Failure"), 1}},
    {QStringLiteral("AudioDetection"), {QStringLiteral("Audio Detection"), 2}},
    {QStringLiteral("ShockDetection"), {QStringLiteral("Shock Detection"), 1}},
    {QStringLiteral("PPTZTrigger"), {QStringLiteral("PTZ Preset Trigger"), 1}},
    {QStringLiteral("BruteForceAttack"), {QStringLiteral("Brute-Force Login Attempt"), 1}},
    {QStringLiteral("CyberAttack"), {QStringLiteral("Cyber Attack"), 1}},
    {QStringLiteral("QuarantineEvent"), {QStringLiteral("Device Quarantined"), 1}},
    {QStringLiteral("Guardian"), {QStringLiteral("Guardian Alert"), 1}},
    {QStringLiteral("Thermal"), {QStringLiteral("Thermal Alarm"), 2}},
    {QStringLiteral("LineDetection"), {QStringLiteral("Line Crossing"), 10}},
    {QStringLiteral("FieldDetection"), {QStringLiteral("Intrusion"), 8}},
    {QStringLiteral("Loitering"), {QStringLiteral("Loitering"), 4}},
    {QStringLiteral("CrowdDetection"), {QStringLiteral("Crowd Gathering"), 2}},
    {QStringLiteral("FaceDetection"), {QStringLiteral("Face Detected"), 3}},
    {QStringLiteral("ZoneDetection"), {QStringLiteral("Zone Entry"), 3}},
    {QStringLiteral("MissingObject"), {QStringLiteral("Missing Object"), 1}},
    {QStringLiteral("AbandonObject"), {QStringLiteral("Abandoned Object"), 2}},
    {QStringLiteral("SmartTracking"), {QStringLiteral("Smart Tracking"), 1}},
    {QStringLiteral("RunningDetection"), {QStringLiteral("Running Person"), 2}},
    {QStringLiteral("ParkingViolationDetection"), {QStringLiteral("Parking Violation"), 3}},
    {QStringLiteral("RestrictedZoneDetection"), {QStringLiteral("Restricted Zone Entry"), 2}},
    {QStringLiteral("CamConn"), {QStringLiteral("Camera Disconnected"), 8}},
    {QStringLiteral("RecStatus"), {QStringLiteral("Recording Stopped"), 2}},
    {QStringLiteral("RecErr"), {QStringLiteral("Recording Error"), 3}},
    {QStringLiteral("StationConn"), {QStringLiteral("Station Disconnected"), 2}},
    {QStringLiteral("StorageConn"), {QStringLiteral("Storage Disconnected"), 1}},
    {QStringLiteral("StorageCapacity"), {QStringLiteral("Storage Almost Full"), 2}},
    {QStringLiteral("SysLicense"), {QStringLiteral("License Expiring"), 1}},
    {QStringLiteral("SysNetwork"), {QStringLiteral("Network Failure"), 1}},
    {QStringLiteral("SysVirMem"), {QStringLiteral("Low Memory"), 1}},
    {QStringLiteral("FanStatus"), {QStringLiteral("Fan Failure"), 1}},
    {QStringLiteral("GpsConn"), {QStringLiteral("GPS Signal Lost"), 2}},
    {QStringLiteral("GpsSpeed"), {QStringLiteral("Speeding"), 2}},
    {QStringLiteral("Gsensor"), {QStringLiteral("Harsh Braking"), 1}},
    {QStringLiteral("SysVcaAreaReport"), {QStringLiteral("VCA Area Report"), 1}},
    {QStringLiteral("ExtIODevice"), {QStringLiteral("IO Device"), 1}},
    {QStringLiteral("DIOStatus"), {QStringLiteral("IO Status"), 1}},
    {QStringLiteral("ExtTCPMessage"), {QStringLiteral("TCP Message"), 1}},
    {QStringLiteral("ExtDataMagnet"), {QStringLiteral("Data Magnet Alert"), 1}},
    {QStringLiteral("ExtAccessRule"), {QStringLiteral("Access Denied"), 3}},
    {QStringLiteral("VirtualTrigger"), {QStringLiteral("Virtual Trigger"), 1}},
    {QStringLiteral("ManualEvent"), {QStringLiteral("Manual Alarm"), 2}},
};

// Vehicles report the positioning events; the rest of each filter has its own kind of device.
const QStringList& devicesFor(const QString& eventClass, const QStringList& fragmentDevices)
{
    if (eventClass.startsWith(QLatin1String("Gps")) || eventClass == QLatin1String("Gsensor"))
        return kVehicles;
    return fragmentDevices;
}

// Every event of the three trigger-event filters.
QList<DemoEvent> demoEvents()
{
    const std::pair<const QString*, const QStringList*> fragments[] = {
        {&CAMERA_TRIGGER_EVENT_FILTER_STRING, &kCameras},
        {&SYSTEM_TRIGGER_EVENT_FILTER_STRING, &kServers},
        {&EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING, &kIoDevices}};
    QList<DemoEvent> events;
    for (const auto& [fragment, devices] : fragments) {
        const std::optional<XmlElement> list =
            parseXmlDocument(QLatin1String("<Events>") + *fragment + QLatin1String("</Events>"));
        Q_ASSERT(list);
        for (const XmlElement* element : list->childrenNamed(u"Event")) {
            DemoEvent event;
            event.eventClass = element->text.trimmed();
            event.devices = &devicesFor(event.eventClass, *devices);
            const EventTraits classTraits = kTraits.value(event.eventClass);
            if (element->attributes.isEmpty()) {
                event.label = classTraits.label;
                event.weight = classTraits.weight;
            } else {
                event.subEventType = element->attributes.first().first;
                event.subEvent = element->attributes.first().second;
                const EventTraits subTraits = kTraits.value(event.subEvent);
                // Camera and analytics sub-events name the alarm themselves; the IO sub-events
                // only say which side of the device fired.
                const bool ownName = event.eventClass == QLatin1String("CamEvent") ||
                                     event.eventClass == QLatin1String("VCA");
                event.label =
                    ownName ? subTraits.label
                            : QStringLiteral("%1 (%2)").arg(classTraits.label, event.subEvent);
                event.weight = subTraits.weight;
            }
            events.append(event);
        }
    }
    return events;
}

const QStringList kProcessingNotes = {
    QStringLiteral("Guard dispatched to check"),
    QStringLiteral("Reviewing recorded video"),
    QStringLiteral("Contacted the site supervisor"),
    QStringLiteral("Technician notified"),
};

const QStringList kHandledNotes = {
    QStringLiteral("Checked on site, all clear"),
    QStringLiteral("Expected delivery at the gate"),
    QStringLiteral("Door closed and secured"),
    QStringLiteral("Camera cleaned and refocused"),
    QStringLiteral("Switch restarted, link restored"),
    QStringLiteral("Visitor escorted out & badge returned"),
};

const QStringList kFalseAlarmNotes = {
    QStringLiteral("Triggered by a passing animal"),
    QStringLiteral("Headlights reflecting on the glass"),
    QStringLiteral("Tree branches moving in the wind"),
    QStringLiteral("Cleaning staff on their round"),
};

const QStringList kUsers = {QStringLiteral("operator"), QStringLiteral("supervisor"),
                            QStringLiteral("night-shift")};

struct LogEntry
{
    qint64 time;
    QString state;
    QString note;
    QString user;
};

class DemoGenerator
{
public:
    DemoGenerator(quint32 seed, qint64 end) : m_random(seed), m_end(end)
    {
        m_events = demoEvents();
        for (const DemoEvent& event : m_events)
            m_totalWeight += event.weight;
    }

    const DemoEvent& pickEvent()
    {
        int ticket = m_random.bounded(m_totalWeight);
        for (const DemoEvent& event : m_events) {
            ticket -= event.weight;
            if (ticket < 0)
                return event;
        }
        return m_events.last();
    }

    const QString& pickDevice(const DemoEvent& event)
    {
        return event.devices->at(m_random.bounded(int(event.devices->size())));
    }

    // A time in the last 30 days, mostly during working hours.
    qint64 pickTime()
    {
        const qint64 dayStart = m_end - (1 + m_random.bounded(30)) * 86400;
        const bool daytime = m_random.bounded(10) < 7;
        const int second =
            daytime ? 7 * 3600 + m_random.bounded(13 * 3600) : m_random.bounded(86400);
        return qMin(dayStart + second, m_end);
    }

    // What became of an alarm raised at time: older alarms are mostly dealt with.
    QList<LogEntry> history(qint64 time)
    {
        QList<LogEntry> log = {{time, STATE_UNHANDLED, QString(), QStringLiteral("system")}};
        const bool old = m_end - time > 2 * 86400;
        const int roll = m_random.bounded(100);
        const int processingShare = old ? 5 : 25;
        const int handledShare = old ? 70 : 10;
        const int falseShare = old ? 10 : 5;
        if (roll < processingShare) {
            addEntry(log, STATE_PROCESSING, kProcessingNotes);
        } else if (roll < processingShare + handledShare + falseShare) {
            if (m_random.bounded(10) < 6)
                addEntry(log, STATE_PROCESSING, kProcessingNotes);
            if (roll < processingShare + handledShare)
                addEntry(log, STATE_HANDLED, kHandledNotes);
            else
                addEntry(log, STATE_FALSE_ALARM, kFalseAlarmNotes);
        }
        return log;
    }

private:
    void addEntry(QList<LogEntry>& log, const QString& state, const QStringList& notes)
    {
        const qint64 time = qMin(log.last().time + 60 + m_random.bounded(2 * 3600), m_end);
        log.append({time, state, notes.at(m_random.bounded(int(notes.size()))),
                    kUsers.at(m_random.bounded(int(kUsers.size())))});
    }

    QRandomGenerator m_random;
    qint64 m_end;
    QList<DemoEvent> m_events;
    int m_totalWeight = 0;
};

} // namespace

bool seedDemoAlarms(QSqlDatabase db, int count, const QDateTime& end, quint32 seed,
                    QString* errorMessage)
{
    DemoGenerator generator(seed, end.toSecsSinceEpoch());
    // Alarm numbers grow with time, as a server hands them out.
    QList<qint64> times(count);
    for (qint64& time : times)
        time = generator.pickTime();
    std::sort(times.begin(), times.end());

    QSqlQuery alarm(db);
    QSqlQuery log(db);
    const bool prepared =
        alarm.prepare(QStringLiteral(
            "INSERT INTO alarm (id, event_class, sub_event_type, sub_event, alarm_name, "
            "alarm_name_folded, device_name, device_name_folded, state, server_time, note) "
            "VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)")) &&
        log.prepare(QStringLiteral(
            "INSERT INTO change_log (alarm_id, time, state, note, user) VALUES (?, ?, ?, ?, ?)"));
    if (!prepared) {
        *errorMessage = alarm.lastError().text() + log.lastError().text();
        return false;
    }
    for (int i = 0; i < count; ++i) {
        const qint64 id = i + 1;
        const DemoEvent& event = generator.pickEvent();
        const QString& device = generator.pickDevice(event);
        const QString name = QStringLiteral("%1 at %2").arg(event.label, device);
        const QList<LogEntry> history = generator.history(times.at(i));
        QString note;
        for (const LogEntry& entry : history) {
            if (!entry.note.isEmpty())
                note = entry.note;
        }
        const QVariantList values = {
            id,     event.eventClass, event.subEventType,   event.subEvent, name, foldName(name),
            device, foldName(device), history.last().state, times.at(i),    note};
        if (!execWith(alarm, values)) {
            *errorMessage = alarm.lastError().text();
            return false;
        }
        for (const LogEntry& entry : history) {
            if (!execWith(log, {id, entry.time, entry.state, entry.note, entry.user})) {
                *errorMessage = log.lastError().text();
                return false;
            }
        }
    }
    return true;
}

} // namespace AlarmServerSim
