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

    // Deepest subtree nodeToXml writes; the node itself is at level 1.
    static constexpr int MaxDepth = 256;

    // Calls action for each direct child element of parent named tagName (an empty name matches
    // every child element), in document order.
    static void doSomeThingAllChildElement(const QDomElement& parent, const QString& tagName,
                                           ElementAction action);

    // The node and its subtree as XML text, exactly as QDomNode::save writes it with an indent
    // of 4. Elements, text, CDATA sections, comments and processing instructions are written
    // without recursion and in time linear in the output; other nodes are handed to
    // QDomNode::save. A null node, or a subtree deeper than MaxDepth levels, gives an empty
    // string (QDomNode::save recurses and would overflow the stack).
    static QString nodeToXml(const QDomNode& node);
};
