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
    // Judges a start tag by its depth (the document element at 1) and qualified name.
    using StartTagCheck = std::function<bool(int depth, QStringView name)>;

    // Whether a DOM may be built from text, found in one streaming pass before it is: no longer
    // than maxLength, within AlarmSearchLimits (depth, element count, attributes per element, no
    // lone surrogate), without document type declaration (its entities could expand without
    // bound), and every start tag passing check when one is given. The DOM's parser takes time
    // quadratic in the depth, and its destructor and writer recurse. The pass reads as the DOM's
    // parser does, without namespace processing, and ends where it ends, at the first fault.
    static bool safeForDom(const QString& text, qsizetype maxLength,
                           const StartTagCheck& check = {});

    // Calls action for each direct child element of parent named tagName (an empty name matches
    // every child element), in document order.
    static void doSomeThingAllChildElement(const QDomElement& parent, const QString& tagName,
                                           const ElementAction& action);

    // The node and its subtree as XML text, exactly as QDomNode::save writes it with an indent
    // of 4. Elements, text, CDATA sections, comments and processing instructions are written
    // without recursion and in time linear in the output; other nodes are handed to
    // QDomNode::save. A null node, or a subtree deeper than AlarmSearchLimits::MaxDepth levels (the
    // node itself at level 1), gives an empty string (QDomNode::save recurses and would
    // overflow the stack).
    static QString nodeToXml(const QDomNode& node);
};
