#include "AlarmXmlParser.h"

#include "XmlHelper.h"

#include <QDomDocument>

QList<QString> AlarmXmlParser::getAlarmList(const QString& replyText)
{
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
