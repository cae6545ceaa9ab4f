#pragma once

#include <QDomNode>
#include <QString>
#include <QTextStream>

// The DOM's own serialisation, the reference XmlHelper::nodeToXml and the alarm-list scanner are
// held against.
inline QString savedByDom(const QDomNode& node)
{
    QString xml;
    QTextStream stream(&xml);
    node.save(stream, 4);
    stream.flush();
    return xml;
}
