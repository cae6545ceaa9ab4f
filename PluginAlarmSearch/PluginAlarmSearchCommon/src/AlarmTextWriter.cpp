#include "AlarmTextWriter.h"

#include <QVarLengthArray>

void AlarmTextWriter::write(const AlarmSubtree& subtree, qsizetype index, int level, bool afterText)
{
    const SubtreeNode& node = subtree.node(index);
    m_writer.openStartTag(node.name, level, afterText);
    writeAttributes(subtree, node);

    QVarLengthArray<qsizetype, 16> children; // the DOM drops blank text
    forEachChild(subtree, index, [&](qsizetype child) {
        if (!subtree.node(child).blank)
            children.append(child);
    });
    const auto isText = [&](qsizetype i) {
        return i >= 0 && i < children.size() && subtree.node(children[i]).isText();
    };
    m_writer.closeStartTag(!children.isEmpty(), isText(0));
    for (qsizetype i = 0; i < children.size(); ++i) {
        const SubtreeNode& child = subtree.node(children[i]);
        if (child.isText()) {
            m_writer.text(child.text, false);
        } else {
            write(subtree, children[i], level + 1, isText(i - 1));
            m_writer.lineBreak(isText(i + 1));
        }
    }
    if (!children.isEmpty())
        m_writer.endTag(node.name, level, isText(children.size() - 1));
}

// In the order the running Qt's DOM writes them.
void AlarmTextWriter::writeAttributes(const AlarmSubtree& subtree, const SubtreeNode& node)
{
    DomAttributeOrder::Names names;
    for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a)
        names.append(subtree.attribute(a).name);
    for (const qsizetype i : attributeOrder(names)) {
        const ReplyAttribute& attribute = subtree.attribute(node.attributesBegin + i);
        m_writer.attribute(attribute.name, attribute.value);
    }
}

const DomAttributeOrder::Positions&
AlarmTextWriter::attributeOrder(const DomAttributeOrder::Names& names)
{
    // Up to this many lists are remembered; lists beyond them are arranged each time.
    constexpr qsizetype RememberedOrders = 256;
    if (names.size() < 2 || m_attributeOrder != DomAttributeOrder::Rule::Hash) {
        m_uncachedOrder = DomAttributeOrder::arrange(m_attributeOrder, names);
        return m_uncachedOrder;
    }
    m_ordersKey.resize(0); // keeps the capacity
    for (const QStringView name : names)
        m_ordersKey.append(name).append(u' ');
    const auto it = m_orders.constFind(m_ordersKey);
    if (it != m_orders.cend())
        return *it;
    m_uncachedOrder = DomAttributeOrder::arrange(m_attributeOrder, names);
    if (m_orders.size() == RememberedOrders)
        return m_uncachedOrder;
    return *m_orders.insert(m_ordersKey, m_uncachedOrder);
}
