#include "XmlHelper.h"

#include <QTextStream>

void XmlHelper::doSomeThingAllChildElement(const QDomElement& parent, const QString& tagName,
                                           ElementAction action)
{
    for (QDomElement child = parent.firstChildElement(tagName); !child.isNull();
         child = child.nextSiblingElement(tagName)) {
        action(child);
    }
}

QString XmlHelper::nodeToXml(const QDomNode& node)
{
    QString xml;
    QTextStream stream(&xml);
    node.save(stream, 4);
    stream.flush();
    return xml;
}
