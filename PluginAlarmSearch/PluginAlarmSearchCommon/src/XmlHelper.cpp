#include "XmlHelper.h"

#include "AlarmSearchLimits.h"
#include "DomAttributeOrder.h"
#include "DomStyleWriter.h"
#include "DomWalk.h"
#include "Utf16Buffer.h"

#include "XmlTextBounds.h"

#include <QTextStream>
#include <QVarLengthArray>
#include <QXmlStreamReader>

namespace {

// Elements with more attributes are left to QDomNode::save: QDomNamedNodeMap::item(i) walks
// the attribute hash from its start, so reading every attribute by index is quadratic.
constexpr int MaxIndexedAttributes = 64;

bool isTextNode(const QDomNode& node)
{
    return node.isText(); // also true for CDATA sections, as QDomNode::save sees them
}

// Writes the subtree below a node iteratively; the walk stops at a node it does not write.
class DomNodeWriter
{
public:
    explicit DomNodeWriter(Utf16Buffer& out) : m_writer(out) {}

    DomWalk::Result write(const QDomNode& top)
    {
        // Only elements among the nodes written have children, so only elements are left.
        return DomWalk::walkSubtree(
            top, [this](const QDomNode& node, int level) { return enter(node, level); },
            [this](const QDomNode& node, int level) { leaveElement(node.toElement(), level); });
    }

private:
    // Writes what comes before a node's children; false for a node it does not write.
    bool enter(const QDomNode& node, int level)
    {
        const bool afterText = isTextNode(node.previousSibling());
        const bool beforeText = isTextNode(node.nextSibling());
        switch (node.nodeType()) {
        case QDomNode::ElementNode:
            return startElement(node.toElement(), level, afterText, beforeText);
        case QDomNode::TextNode:
            m_writer.text(node.nodeValue(), !node.parentNode().isElement());
            return true;
        case QDomNode::CDATASectionNode:
            m_writer.cdata(node.nodeValue());
            return true;
        case QDomNode::CommentNode:
            m_writer.comment(node.nodeValue(), level, afterText, beforeText);
            return true;
        case QDomNode::ProcessingInstructionNode:
            m_writer.processingInstruction(node.nodeName(), node.nodeValue());
            return true;
        default:
            return false;
        }
    }

    bool startElement(const QDomElement& element, int level, bool afterText, bool beforeText)
    {
        const QDomNamedNodeMap attributes = element.attributes();
        if (!element.namespaceURI().isNull() || attributes.count() > MaxIndexedAttributes)
            return false;
        m_writer.openStartTag(element.tagName(), level, afterText);
        if (!writeAttributes(attributes))
            return false;
        const bool hasChildren = element.hasChildNodes();
        m_writer.closeStartTag(hasChildren, isTextNode(element.firstChild()));
        if (!hasChildren)
            m_writer.lineBreak(beforeText);
        return true;
    }

    // In the order the running Qt's QDomNode::save writes them; false for a namespace or an
    // order this writer cannot reproduce.
    bool writeAttributes(const QDomNamedNodeMap& attributes)
    {
        QVarLengthArray<QString, 32> nameTexts;
        QVarLengthArray<QString, 32> values;
        for (int i = 0; i < attributes.count(); ++i) {
            const QDomAttr attribute = attributes.item(i).toAttr();
            if (!attribute.namespaceURI().isNull())
                return false;
            nameTexts.append(attribute.name());
            values.append(attribute.value());
        }
        DomAttributeOrder::Names names; // views of nameTexts, which no longer grows
        for (const QString& name : nameTexts)
            names.append(name);
        const DomAttributeOrder::Positions positions =
            DomAttributeOrder::arrange(m_attributeOrder, names);
        if (positions.size() != names.size())
            return false;
        for (const qsizetype i : positions)
            m_writer.attribute(nameTexts[i], values[i]);
        return true;
    }

    void leaveElement(const QDomElement& element, int level)
    {
        m_writer.endTag(element.tagName(), level, isTextNode(element.lastChild()));
        m_writer.lineBreak(isTextNode(element.nextSibling()));
    }

    DomStyleWriter m_writer;
    const DomAttributeOrder::Rule m_attributeOrder = DomAttributeOrder::forItemOrder();
};

// Whether the subtree below node is no deeper than AlarmSearchLimits::MaxDepth, found without
// recursion.
bool withinDepth(const QDomNode& node)
{
    return DomWalk::walkSubtree(node, [](const QDomNode&, int) { return true; }) !=
           DomWalk::Result::TooDeep;
}

QString savedByDom(const QDomNode& node)
{
    QString xml;
    QTextStream stream(&xml);
    node.save(stream, 4);
    stream.flush();
    return xml;
}

} // namespace

bool XmlHelper::safeForDom(const QString& text, qsizetype maxLength, const StartTagCheck& check)
{
    using namespace AlarmSearchLimits;
    if (text.size() > maxLength || !withinTextBounds(text))
        return false;
    QXmlStreamReader reader(text);
    reader.setNamespaceProcessing(false);
    int depth = 0;
    qsizetype elements = 0;
    while (!reader.atEnd()) {
        switch (reader.readNext()) {
        case QXmlStreamReader::StartElement:
            if (++depth > MaxDepth || ++elements > MaxReplyElements)
                return false;
            if (check && !check(depth, reader.qualifiedName()))
                return false;
            break;
        case QXmlStreamReader::EndElement:
            --depth;
            break;
        case QXmlStreamReader::DTD:
            return false;
        default:
            break;
        }
    }
    return true;
}

void XmlHelper::doSomeThingAllChildElement(const QDomElement& parent, const QString& tagName,
                                           const ElementAction& action)
{
    for (QDomElement child = parent.firstChildElement(tagName); !child.isNull();
         child = child.nextSiblingElement(tagName)) {
        action(child);
    }
}

QString XmlHelper::nodeToXml(const QDomNode& node)
{
    if (node.isNull())
        return QString();
    Utf16Buffer xml;
    switch (DomNodeWriter(xml).write(node)) {
    case DomWalk::Result::Done:
        return xml.view().toString();
    case DomWalk::Result::TooDeep:
        return QString();
    case DomWalk::Result::Stopped:
        break;
    }
    return withinDepth(node) ? savedByDom(node) : QString();
}
