// Feeds the same text to the one-pass alarm-list reader and to the general route (XML2Json and
// the DOM splitter) and aborts when they disagree: whenever the scanner answers, XML2Json must
// accept the text, each alarm map must equal XML2Json's rendering of that alarm and each "XML"
// text the DOM splitter's. Also checks nodeToXml against QDomNode::save on every alarm.
#include "../tests/support/DomReference.h"

#include <AlarmListScanner.h>
#include <AlarmXmlParser.h>
#include <XML2Json.h>
#include <XmlHelper.h>

#include <QDomDocument>

#include <cstdint>
#include <cstdio>
#include <cstdlib>

namespace {

[[noreturn]] void disagree(const char* what, const QString& reply)
{
    std::fprintf(stderr, "readers disagree: %s\n%s\n", what, reply.toUtf8().constData());
    std::abort();
}

void checkScanner(const QString& reply, const QVariantList& scanned)
{
    const QVariant parsed = XML2Json().parse(reply);
    if (!parsed.isValid() || parsed.isNull())
        disagree("the scanner read text that XML2Json refuses", reply);
    const QVariantList entries =
        XML2Json::transContentAsList(parsed.toMap()
                                         .value(QStringLiteral("QryAlarmListRes"))
                                         .toMap()
                                         .value(QStringLiteral("Alarm")));
    const QList<QString> texts = AlarmXmlParser::getAlarmList(reply);
    if (scanned.size() != entries.size() || (!entries.isEmpty() && texts.size() != entries.size()))
        disagree("number of alarms", reply);
    const QString xmlKey = QStringLiteral("XML");
    for (qsizetype i = 0; i < scanned.size(); ++i) {
        QVariantMap alarm = scanned.at(i).toMap();
        if (alarm.take(xmlKey).toString() != texts.at(i))
            disagree("alarm text", reply);
        // An alarm's own "XML" child gives way to its text.
        QVariantMap rendering = entries.at(i).toMap();
        rendering.remove(xmlKey);
        if (alarm != rendering)
            disagree("alarm map", reply);
    }
}

// Only on text XML2Json accepts: well-formed, without document type, at most 256 levels.
void checkNodeToXml(const QString& reply)
{
    if (!XML2Json().parse(reply).isValid())
        return;
    QDomDocument document;
    document.setContent(reply);
    for (QDomElement alarm = document.documentElement().firstChildElement(); !alarm.isNull();
         alarm = alarm.nextSiblingElement()) {
        if (XmlHelper::nodeToXml(alarm) != savedByDom(alarm))
            disagree("nodeToXml", reply);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const QString reply =
        QString::fromUtf8(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    const std::optional<QVariantList> scanned = AlarmListScanner::read(reply);
    const std::optional<QVariantList> general = AlarmXmlParser::readAlarmListReplyGeneral(reply);
    if (scanned) {
        checkScanner(reply, *scanned);
        if (scanned != general)
            disagree("combined result", reply);
    }
    if (AlarmXmlParser::readAlarmListReply(reply) != general)
        disagree("readAlarmListReply", reply);
    checkNodeToXml(reply);
    return 0;
}
