#pragma once

#include <QString>
#include <QStringList>
#include <QTime>

// Alarm-list replies as the alarm server writes them, with varied but repeatable values: some
// notes carry "&amp;", non-ASCII text and characters outside the basic plane, some alarms are
// muted.
namespace AlarmReplies {

inline QString alarm(int n)
{
    static const QStringList subEvents{"Motion", "DI", "VideoLossRestore", "Tampering", "PIR"};
    static const QStringList devices{"Lobby Entrance",
                                     "Parking Level -2",
                                     "Warehouse Dock 3",
                                     QString::fromUtf8("Kamera Süd"),
                                     QString::fromUtf8("東門 カメラ"),
                                     "Server Room"};
    static const QStringList states{"Unhandled", "Handling", "Handled", "Closed"};
    static const QStringList notes{
        QString(),
        "Checked by guard",
        "Door &amp; gate checked, all clear",
        QString::fromUtf8("Fehlalarm: Katze \u00fcber Zaun"),
        QString::fromUtf8(
            "\u73fe\u5834\u78ba\u8a8d\u6e08\u307f \U0001F6A8 escalated to &lt;ops&gt;"),
        "Long note: " + QStringLiteral("camera moved by wind; ").repeated(6)};

    const QString& device = devices.at(n % devices.size());
    const QString& subEvent = subEvents.at(n % subEvents.size());
    const QString& note = notes.at((n / 3) % notes.size());
    const bool muted = n % 7 == 0;
    const QString time = QStringLiteral("2026-11-20T%1Z")
                             .arg(QTime::fromMSecsSinceStartOfDay(n % 86400 * 1000)
                                      .toString(QStringLiteral("HH:mm:ss")));
    QString xml = QStringLiteral("<Alarm>");
    xml += QStringLiteral("<AlarmID>A%1</AlarmID>").arg(n, 7, 10, QLatin1Char('0'));
    xml += QStringLiteral("<EventClass>CamEvent</EventClass><SubEventType>CameraEvent"
                          "</SubEventType>");
    xml += QStringLiteral("<SubEvent>%1</SubEvent>").arg(subEvent);
    xml += QStringLiteral("<AlarmName>%1 at %2</AlarmName>").arg(subEvent, device);
    xml += QStringLiteral("<DeviceName>%1</DeviceName>").arg(device);
    xml += QStringLiteral("<State>%1</State>").arg(states.at(n % states.size()));
    xml += QStringLiteral("<ServerTime>%1</ServerTime>").arg(time);
    xml += note.isEmpty() ? QStringLiteral("<Note/>") : QStringLiteral("<Note>%1</Note>").arg(note);
    xml += muted ? QStringLiteral("<Muted>true</Muted><MuteUntil>%1</MuteUntil>").arg(time)
                 : QStringLiteral("<Muted>false</Muted><MuteUntil/>");
    xml += QStringLiteral("</Alarm>");
    return xml;
}

// A "QryAlarmListRes" reply with count alarms, one per line.
inline QString reply(int count)
{
    QString xml = QStringLiteral("<QryAlarmListRes>\n");
    xml.reserve(count * 420);
    for (int n = 1; n <= count; ++n)
        xml.append(alarm(n)).append(u'\n');
    xml += QStringLiteral("</QryAlarmListRes>");
    return xml;
}

// Alarms of other shapes than alarm(), for the reader's speed and its agreement with the
// general route on each.
enum class Shape {
    ThirtyFields,  // 30 fields
    LongNonAscii,  // names and notes of a few hundred characters outside ASCII
    Escaped,       // texts full of entities and character references
    Attributes,    // two or three attributes on most elements
    DistinctNames, // one field whose name no other alarm has
};
constexpr Shape Shapes[] = {Shape::ThirtyFields, Shape::LongNonAscii, Shape::Escaped,
                            Shape::Attributes};

inline const char* shapeName(Shape shape)
{
    static const char* const names[] = {"30 fields", "long non-ASCII names and notes",
                                        "escaped text", "attributes", "a distinct name per alarm"};
    return names[int(shape)];
}

inline QString shapedAlarm(Shape shape, int n)
{
    QString xml = alarm(n);
    xml.chop(8); // "</Alarm>"
    switch (shape) {
    case Shape::ThirtyFields:
        for (int field = 12; field <= 30; ++field)
            xml += QStringLiteral("<Field%1>value %2-%1</Field%1>").arg(field).arg(n % 97);
        break;
    case Shape::LongNonAscii: {
        const QString name = QString::fromUtf8("Überwachungskamera Südflügel Ebene ") +
                             QString::fromUtf8("東門カメラ北側駐車場入口 ").repeated(4) +
                             QString::number(n % 50);
        xml += QStringLiteral("<LocationName>%1</LocationName><OperatorNote>%2</OperatorNote>")
                   .arg(name, QString::fromUtf8("Проверено на месте, ложная тревога; "
                                                "現場確認済み、誤報です。")
                                  .repeated(3 + n % 4));
        break;
    }
    case Shape::Escaped:
        xml += QStringLiteral("<Detail>%1</Detail><Rule>a &lt; b &amp;&amp; c &gt; d</Rule>")
                   .arg(QStringLiteral("&lt;tag a=&quot;%1&quot;&gt; &amp; &#x263A; &#233; ")
                            .arg(n)
                            .repeated(4));
        break;
    case Shape::Attributes:
        xml = QStringLiteral("<Alarm seq=\"%1\" source=\"station-%2\">").arg(n).arg(n % 7) +
              xml.mid(7)
                  .replace(QLatin1String("<State>"),
                           QStringLiteral("<State code=\"%1\" changed=\"true\">").arg(n % 4))
                  .replace(QLatin1String("<DeviceName>"),
                           QStringLiteral("<DeviceName id=\"D%1\" kind=\"camera\" zone=\"z%2\">")
                               .arg(n % 6)
                               .arg(n % 3));
        break;
    case Shape::DistinctNames:
        xml += QStringLiteral("<Extra%1>x</Extra%1>").arg(n);
        break;
    }
    return xml + QStringLiteral("</Alarm>");
}

inline QString shapedReply(Shape shape, int count)
{
    QString xml = QStringLiteral("<QryAlarmListRes>\n");
    for (int n = 1; n <= count; ++n)
        xml.append(shapedAlarm(shape, n)).append(u'\n');
    xml += QStringLiteral("</QryAlarmListRes>");
    return xml;
}

} // namespace AlarmReplies
