#pragma once

#include <QDomElement>
#include <QDomNode>
#include <QString>

#include <functional>

// Small DOM utilities used to cut replies apart.
class XmlHelper
{
public:
    using ElementAction = std::function<void(const QDomElement&)>;

    // Calls action for each direct child element of parent named tagName (an empty name matches
    // every child element), in document order.
    static void doSomeThingAllChildElement(const QDomElement& parent, const QString& tagName,
                                           ElementAction action);

    // The node and its subtree as XML text, written with an indent of 4 as QDomNode::save does.
    static QString nodeToXml(const QDomNode& node);
};
