#pragma once

#include <QList>
#include <QString>
#include <QVariant>
#include <QVariantList>

#include <optional>

// Cuts an alarm-list reply into one XML text per alarm. The bounds are those of
// AlarmSearchLimits; a reply beyond any of them is refused as a whole by every reader here, as
// XML2Json refuses it, so no alarm is ever cut short or left out on its own.
class AlarmXmlParser
{
public:
    // The XML text of every "Alarm" child of the document element, in document order, each as
    // XmlHelper::nodeToXml writes it. Text that is not XML gives an empty list; text that breaks
    // off is searched up to the fault. Refused with an empty list, before a DOM is built: text
    // longer than MaxReplyLength, nested deeper than MaxDepth (up to the fault, for text that
    // breaks off), with more than MaxReplyElements elements, MaxReplyAlarms alarms or
    // MaxAttributes attributes on an element, with a lone surrogate, or with a document type
    // declaration (its entities could expand without bound). So every text holds one whole
    // alarm, starting with its start tag.
    static QList<QString> getAlarmList(const QString& replyText);

    // The alarms of a "QryAlarmListRes" reply: the XML2Json rendering of each "Alarm" child of
    // the document element as a map (empty for an alarm that renders as text), with the alarm's
    // text from getAlarmList inserted under "XML". Nothing when XML2Json refuses the text or it
    // is beyond the bounds of getAlarmList. Replies in the common form are read in one pass by
    // AlarmListScanner; the others take readAlarmListReplyGeneral.
    static std::optional<QVariantList> readAlarmListReply(const QString& replyText);

    // The same result by the general route: XML2Json::parse and getAlarmList, paired by
    // position.
    static std::optional<QVariantList> readAlarmListReplyGeneral(const QString& replyText);

    // Any other reply as XML2Json::parse renders it, invalid where XML2Json refuses the text:
    // read in one pass by AlarmListScanner::readDocument where it has the common form.
    static QVariant readReply(const QString& replyText);
};
