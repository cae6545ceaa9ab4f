#pragma once

#include <QString>
#include <QVariantList>
#include <QVariantMap>

#include <optional>

// Reads an alarm-list reply in one pass over its UTF-16 text and gives exactly what
// AlarmXmlParser::readAlarmListReplyGeneral gives, for replies in the plain form servers write:
// - an optional XML declaration of version 1.0 (encoding UTF-8), then one document element,
//   with nothing but white space around it;
// - names of ASCII letters, digits, "_", "-" and "." (so no namespace prefixes), no "xmlns";
// - text and attribute values of characters XML allows, with the five predefined entities and
//   character references (in text not to control characters); no raw carriage returns;
// - no comments, processing instructions, CDATA sections or document type declaration;
// - nesting up to AlarmSearchLimits::MaxDepth, up to 32 attributes per element (one where the
//   running Qt's DOM orders attributes in a way DomAttributeOrder cannot reproduce), within the
//   element and alarm counts of AlarmSearchLimits.
// Anything else gives nothing, also text that is not well-formed, and the caller takes the
// general route. Its parts: ReplyTokenizer reads the text, AlarmSubtree captures an alarm,
// AlarmMapBuilder renders it, AlarmTextWriter writes its text.
class AlarmListScanner
{
public:
    static std::optional<QVariantList> read(const QString& replyText);
    // Any reply of that form, whatever its document element, as XML2Json::parse gives it: the
    // document element's name mapped to its rendering.
    static std::optional<QVariantMap> readDocument(const QString& replyText);
};
