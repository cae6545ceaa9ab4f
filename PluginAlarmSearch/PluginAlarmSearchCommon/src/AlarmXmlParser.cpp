#include "AlarmXmlParser.h"

#include "AlarmListScanner.h"
#include "AlarmSearchLimits.h"
#include "XmlHelper.h"

#include <XML2Json.h>

#include <QDomDocument>

namespace {

using namespace AlarmSearchLimits;

// Whether a DOM may be built from the reply: within the bounds of a reply, and with at most
// MaxReplyAlarms alarms.
bool safeForDom(const QString& text)
{
    qsizetype alarms = 0;
    return XmlHelper::safeForDom(text, MaxReplyLength, [&alarms](int depth, QStringView name) {
        return depth != 2 || name != u"Alarm" || ++alarms <= MaxReplyAlarms;
    });
}

} // namespace

QList<QString> AlarmXmlParser::getAlarmList(const QString& replyText)
{
    if (!safeForDom(replyText))
        return {};

    // A reply that breaks off keeps what was built before the fault, so the result of setContent
    // is deliberately not looked at.
    QDomDocument document;
    document.setContent(replyText);

    QList<QString> alarms;
    XmlHelper::doSomeThingAllChildElement(
        document.documentElement(), QStringLiteral("Alarm"),
        [&alarms](const QDomElement& alarm) { alarms.append(XmlHelper::nodeToXml(alarm)); });
    return alarms;
}

std::optional<QVariantList> AlarmXmlParser::readAlarmListReply(const QString& replyText)
{
    if (replyText.size() > MaxReplyLength)
        return std::nullopt;
    if (std::optional<QVariantList> alarms = AlarmListScanner::read(replyText))
        return alarms;
    return readAlarmListReplyGeneral(replyText);
}

std::optional<QVariantList> AlarmXmlParser::readAlarmListReplyGeneral(const QString& replyText)
{
    if (!safeForDom(replyText))
        return std::nullopt;
    const QVariant parsed = XML2Json().parse(replyText);
    if (!parsed.isValid() || parsed.isNull())
        return std::nullopt;

    const QVariantList alarms =
        XML2Json::transContentAsList(parsed.toMap()
                                         .value(QStringLiteral("QryAlarmListRes"))
                                         .toMap()
                                         .value(QStringLiteral("Alarm")));
    const QList<QString> alarmTexts = getAlarmList(replyText);

    // Alarm maps and texts are paired by position; should the texts run short, the remaining
    // alarms get an empty text rather than another alarm's.
    const QString xmlKey = QStringLiteral("XML");
    QVariantList result;
    result.reserve(alarms.size());
    for (qsizetype i = 0; i < alarms.size(); ++i) {
        QVariantMap alarm = alarms.at(i).toMap();
        alarm.insert(xmlKey, i < alarmTexts.size() ? alarmTexts.at(i) : QString());
        result.append(QVariant(alarm));
    }
    return result;
}

QVariant AlarmXmlParser::readReply(const QString& replyText)
{
    if (replyText.size() <= MaxReplyLength) {
        if (std::optional<QVariantMap> document = AlarmListScanner::readDocument(replyText))
            return QVariant(*document);
    }
    return XML2Json().parse(replyText);
}
