#include "AlarmTextWriter.h"

#include <QHash>
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

// In the DOM's order: that of its attribute hash, filled in document order.
void AlarmTextWriter::writeAttributes(const AlarmSubtree& subtree, const SubtreeNode& node)
{
    if (node.attributesEnd - node.attributesBegin < 2) {
        for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a)
            m_writer.attribute(subtree.attribute(a).name, subtree.attribute(a).value);
        return;
    }
    // Keyed by views: qHash of a view equals that of the string, so the order is the same.
    QHash<QStringView, qsizetype> hashOrder;
    for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a)
        hashOrder.insert(subtree.attribute(a).name, a);
    for (auto it = hashOrder.cbegin(); it != hashOrder.cend(); ++it)
        m_writer.attribute(it.key(), subtree.attribute(it.value()).value);
}
