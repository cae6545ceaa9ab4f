#pragma once

#include <QList>
#include <QString>
#include <QVariantList>

#include <optional>

// Cuts an alarm-list reply into one XML text per alarm.
class AlarmXmlParser
{
public:
    // Longest reply text read, in UTF-16 code units (128 MiB); longer text counts as not
    // parseable. A reply of 50 000 alarms is about 31 Mi units.
    static constexpr qsizetype MaxReplyLength = qsizetype(64) * 1024 * 1024;
    // Deepest element nesting read; the document element is at depth 1.
    static constexpr int MaxDepth = 256;

    // The XML text of every "Alarm" child of the document element, in document order, each as
    // XmlHelper::nodeToXml writes it. Text that is not XML gives an empty list; text that breaks
    // off is searched up to the fault. Refused with an empty list, before a DOM is built: text
    // longer than MaxReplyLength, nested deeper than MaxDepth, or with a document type
    // declaration (its entities could expand without bound).
    static QList<QString> getAlarmList(const QString& replyText);

    // The alarms of a "QryAlarmListRes" reply: the XML2Json rendering of each "Alarm" child of
    // the document element as a map (empty for an alarm that renders as text), with the alarm's
    // text from getAlarmList inserted under "XML". Nothing when XML2Json refuses the text or it
    // is longer than MaxReplyLength. Replies in the common form are read in one pass by
    // AlarmListScanner; the others take readAlarmListReplyGeneral.
    static std::optional<QVariantList> readAlarmListReply(const QString& replyText);

    // The same result by the general route: XML2Json::parse and getAlarmList, paired by
    // position.
    static std::optional<QVariantList> readAlarmListReplyGeneral(const QString& replyText);
};
