#pragma once

#include "AlarmSubtree.h"
#include "DomAttributeOrder.h"
#include "DomStyleWriter.h"
#include "Utf16Buffer.h"

// Writes a captured element as XmlHelper::nodeToXml writes the DOM's element: indented and
// escaped as QDomNode::save does, blank text dropped as the DOM drops it, attributes in the
// DOM's order.
class AlarmTextWriter
{
public:
    explicit AlarmTextWriter(Utf16Buffer& out) : m_writer(out) {}

    // The element at index, at the given level (1 for the node written), without the line break
    // after it; afterText says whether text stands before it.
    void write(const AlarmSubtree& subtree, qsizetype index, int level, bool afterText);

private:
    void writeAttributes(const AlarmSubtree& subtree, const SubtreeNode& node);

    DomStyleWriter m_writer;
    const DomAttributeOrder::Rule m_attributeOrder = DomAttributeOrder::forDocumentOrder();
};
