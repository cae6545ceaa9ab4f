#include "MessageComposer.h"

#include <AlarmFields.h>
#include <AlarmSearchLimits.h>
#include <DomWalk.h>
#include <PluginAlarmSearchCommon.h>
#include <XmlHelper.h>

#include <QDomDocument>
#include <QLocale>
#include <QTimeZone>
#include <QUrl>

#include <algorithm>
#include <optional>

using namespace PluginAlarmSearchCommon;

namespace {

// Length in code units of the XML 1.0 character at position i: 1 or 2 (a surrogate pair), or 0
// when XML cannot carry it (control characters other than tab and line breaks, unpaired
// surrogates, U+FFFE, U+FFFF).
qsizetype xmlCharLength(const QString& text, qsizetype i)
{
    const char16_t c = text.at(i).unicode();
    if (c < 0x20) {
        return (c == u'\t' || c == u'\n' || c == u'\r') ? 1 : 0;
    }
    if (QChar::isHighSurrogate(c)) {
        return (i + 1 < text.size() && text.at(i + 1).isLowSurrogate()) ? 2 : 0;
    }
    return (QChar::isLowSurrogate(c) || c == 0xFFFE || c == 0xFFFF) ? 0 : 1;
}

// Whether XML can carry every character of text.
bool isXmlText(const QString& text)
{
    for (qsizetype i = 0; i < text.size();) {
        const qsizetype length = xmlCharLength(text, i);
        if (length == 0) {
            return false;
        }
        i += length;
    }
    return true;
}

// The text without the characters XML cannot carry. Neither the DOM serialiser nor the text
// templates would encode them, and a single one makes the whole command unreadable.
QString withoutInvalidXmlChars(const QString& text)
{
    QString result;
    qsizetype runStart = 0;
    qsizetype i = 0;
    while (i < text.size()) {
        const qsizetype length = xmlCharLength(text, i);
        if (length > 0) {
            i += length;
            continue;
        }
        result.append(QStringView(text).mid(runStart, i - runStart));
        runStart = ++i;
    }
    if (runStart == 0) {
        return text;
    }
    result.append(QStringView(text).mid(runStart));
    return result;
}

// Where an escaped value goes: a reader normalises white space differently in each.
enum class ValuePlace { Content, Attribute };

// A value made safe for element content and double-quoted attribute values, so that it can
// never end its element or add elements or attributes. Characters that a reader would normalise
// are written as references, so that the server reads the value that was sent: carriage returns
// everywhere, tabs and line feeds in attribute values, where they would become spaces.
QString escapedXml(const QString& text, ValuePlace place = ValuePlace::Content)
{
    QString escaped = withoutInvalidXmlChars(text).toHtmlEscaped();
    escaped.replace(u'\r', QLatin1String("&#xd;"));
    if (place == ValuePlace::Attribute) {
        escaped.replace(u'\t', QLatin1String("&#x9;"));
        escaped.replace(u'\n', QLatin1String("&#xa;"));
    }
    return escaped;
}

// Alarm IDs address alarms: one that XML cannot carry whole is not sent with characters
// dropped, which could address another alarm.
bool areSendableIds(const QList<QString>& ids)
{
    return std::all_of(ids.cbegin(), ids.cend(), isXmlText);
}

// A request argument where a list is expected: a list as it is, any other value as a list of
// that one value (a text is not split into characters, a map not into its values), nothing as
// an empty list.
QVariantList listArgument(const QVariant& value)
{
    switch (value.metaType().id()) {
    case QMetaType::UnknownType:
        return {};
    case QMetaType::QVariantList:
    case QMetaType::QStringList:
        return value.toList();
    default:
        return {value};
    }
}

// Removes the processing instructions inside element. They address a parser, not the server,
// and the DOM writes some targets that its own reader took in (U+FFFD in the name) back out in
// a form that the reader refuses.
void removeProcessingInstructions(const QDomElement& element)
{
    QList<QDomNode> found;
    DomWalk::walkSubtree(element, [&found](const QDomNode& node, int) {
        if (node.isProcessingInstruction())
            found.append(node);
        return true;
    });
    for (QDomNode& instruction : found) {
        instruction.parentNode().removeChild(instruction);
    }
}

// Parses xml on its own and returns a deep copy of its document element owned by message; a
// null node (which appends nothing) when nothing parsed. Text that breaks off keeps what was
// built before the fault, so the parse result is deliberately not looked at. Nothing when the
// text is beyond the bounds of a fragment: the DOM's importer and writer recurse once per level.
std::optional<QDomNode> importFragment(QDomDocument& message, const QString& xml)
{
    if (!XmlHelper::safeForDom(xml, AlarmSearchLimits::MaxFragmentLength)) {
        return std::nullopt;
    }
    QDomDocument fragment;
    fragment.setContent(xml);
    const QDomElement element = fragment.documentElement();
    removeProcessingInstructions(element);
    return message.importNode(element, true);
}

QDomElement textElement(QDomDocument& message, const QString& tagName, const QString& text,
                        bool percentEncode)
{
    QDomElement element = message.createElement(tagName);
    element.appendChild(
        message.createTextNode(percentEncode ? QString::fromUtf8(QUrl::toPercentEncoding(text))
                                             : withoutInvalidXmlChars(text)));
    return element;
}

QDomElement listElement(QDomDocument& message, const QString& tagName, const QString& childTagName,
                        const QVariantList& items, bool percentEncode)
{
    QDomElement element = message.createElement(tagName);
    for (const QVariant& item : items) {
        element.appendChild(textElement(message, childTagName, item.toString(), percentEncode));
    }
    return element;
}

} // namespace

QString MessageComposer::composeQueryAlarmListMessage(const QVariant& args)
{
    const QVariantMap request = args.toMap();
    QDomDocument message;
    QDomElement root = message.createElement(QStringLiteral("QryAlarmList"));
    QDomElement filters = message.createElement(QStringLiteral("Filters"));

    // The trigger-event and state filters are XML by design and go in unescaped; parsing each on
    // its own keeps a broken one, or one with extra top-level content, to its own element.
    const std::optional<QDomNode> events =
        importFragment(message, QStringLiteral("<TriggerEventList>%1</TriggerEventList>")
                                    .arg(request.value(ARG_TRIGGER_EVENT_FILTER).toString()));
    const std::optional<QDomNode> state =
        importFragment(message, request.value(ARG_STATE_FILTER).toString());
    if (!events || !state) {
        return QString();
    }
    filters.appendChild(*events);
    filters.appendChild(*state);

    const QVariantList rules = listArgument(request.value(ARG_RULES));
    for (const QVariant& entry : rules) {
        const QVariantMap rule = entry.toMap();
        const QVariantList tags = listArgument(rule.value(ARG_RULE_TAG_LIST));
        switch (rule.value(ARG_RULE_TYPE).toInt()) {
        case RULE_TYPE_NAME:
            filters.appendChild(listElement(message, QStringLiteral("NameList"),
                                            QStringLiteral("Name"), tags, true));
            break;
        case RULE_TYPE_DEVICE_NAME:
            filters.appendChild(listElement(message, QStringLiteral("TriggerDeviceNameList"),
                                            QStringLiteral("DeviceName"), tags, false));
            break;
        default:
            break;
        }
    }
    root.appendChild(filters);

    // Times are always sent as UTC. They are plain text: escaped, and inserted in one pass so
    // that a marker inside one value is never filled with another.
    root.appendChild(*importFragment(
        message,
        QStringLiteral("<TmBound><TZ>%1</TZ><StartTm>%2</StartTm><EndTm>%3</EndTm></TmBound>")
            .arg(QStringLiteral("+00:00"), escapedXml(request.value(ARG_START_TIME).toString()),
                 escapedXml(request.value(ARG_END_TIME).toString()))));

    QDomElement timeBase =
        textElement(message, QStringLiteral("TmBase"), QStringLiteral("Station"), false);
    timeBase.setAttribute(QStringLiteral("useUTC"), QStringLiteral("true"));
    root.appendChild(timeBase);
    root.appendChild(textElement(message, QStringLiteral("MaxRec"),
                                 QString::number(AlarmSearchLimits::MaxRecords), false));
    root.appendChild(*importFragment(
        message, QStringLiteral("<OrderBy><Field>%1</Field><Descending>true</Descending></OrderBy>")
                     .arg(FIELD_SERVER_TIME)));

    message.appendChild(root);
    return message.toString(-1);
}

QString MessageComposer::composeProcessAlarmMessage(const QList<QString>& ids,
                                                    const QMap<QString, QVariant>& status,
                                                    const QString& note)
{
    if (!areSendableIds(ids)) {
        return QString();
    }
    QString message = QStringLiteral("<ProcessAlarm><AlarmList>");
    for (const QString& id : ids) {
        message += QLatin1String("<Alarm ID=\"") + escapedXml(id, ValuePlace::Attribute) +
                   QLatin1String("\"/>");
    }
    message += QLatin1String("</AlarmList>");

    if (!status.isEmpty()) {
        message += QLatin1String("<Status>");
        const auto state = status.constFind(ARG_ALARM_STATUS);
        if (state != status.constEnd()) {
            message += QLatin1String("<State>") + escapedXml(state->toString()) +
                       QLatin1String("</State>");
        }
        message += QLatin1String("</Status>");
    }
    if (!note.isEmpty()) {
        message += QLatin1String("<Note>") + escapedXml(note) + QLatin1String("</Note>");
    }
    message += QLatin1String("</ProcessAlarm>");
    return message;
}

QString MessageComposer::composeGetAlarmInfoMessage(const QString& alarmId)
{
    if (!isXmlText(alarmId)) {
        return QString();
    }
    return QLatin1String("<GetAlarmInfo><AlarmID>") + escapedXml(alarmId) +
           QLatin1String("</AlarmID></GetAlarmInfo>");
}

QString MessageComposer::composeMuteAlarmMessage(const QList<QString>& ids, bool mute, int interval)
{
    if (!areSendableIds(ids)) {
        return QString();
    }
    QString idList;
    for (const QString& id : ids) {
        idList += QLatin1String("<ID>") + escapedXml(id) + QLatin1String("</ID>");
    }
    // One pass: an ID holding a marker is not filled with the flag or the interval.
    return QStringLiteral("<MuteAlarm><EventTimecardIDList>%1</EventTimecardIDList><Mute>%2</Mute>"
                          "<MuteInterval>%3</MuteInterval></MuteAlarm>")
        .arg(idList, mute ? QLatin1String("true") : QLatin1String("false"),
             QString::number(interval));
}

QString MessageComposer::getSystemTimeZone()
{
    // The offset name reads "UTC+HH:MM"; the prefix is cut off.
    return QTimeZone::systemTimeZone()
        .displayName(QTimeZone::GenericTime, QTimeZone::OffsetName, QLocale())
        .mid(3);
}
