#pragma once

#include "AlarmSubtree.h"
#include "DomAttributeOrder.h"
#include "DomStyleWriter.h"
#include "Utf16Buffer.h"

#include <QHash>
#include <QString>

// Writes a captured element as XmlHelper::nodeToXml writes the DOM's element: indented and
// escaped as QDomNode::save does, blank text dropped as the DOM drops it, attributes in the
// DOM's order. One writer serves a whole reply, so that the attribute orders found stay known.
class AlarmTextWriter
{
public:
    explicit AlarmTextWriter(Utf16Buffer& out) : m_writer(out) {}

    // The element at index, at the given level (1 for the node written), without the line break
    // after it; afterText says whether text stands before it.
    void write(const AlarmSubtree& subtree, qsizetype index, int level, bool afterText);

private:
    void writeAttributes(const AlarmSubtree& subtree, const SubtreeNode& node);
    const DomAttributeOrder::Positions& attributeOrder(const DomAttributeOrder::Names& names);

    DomStyleWriter m_writer;
    const DomAttributeOrder::Rule m_attributeOrder = DomAttributeOrder::forDocumentOrder();
    // The order of each list of attribute names met, keyed by the names joined with spaces.
    // Replies repeat a few lists on every alarm, and under the hash rule each order costs a
    // hash table of its own to find.
    QHash<QString, DomAttributeOrder::Positions> m_orders;
    QString m_ordersKey; // reused for each lookup
    DomAttributeOrder::Positions m_uncachedOrder;
};
