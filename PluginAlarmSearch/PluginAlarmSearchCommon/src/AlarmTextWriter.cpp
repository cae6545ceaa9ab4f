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
    for (const qsizetype i : DomAttributeOrder::arrange(m_attributeOrder, names)) {
        const ReplyAttribute& attribute = subtree.attribute(node.attributesBegin + i);
        m_writer.attribute(attribute.name, attribute.value);
    }
}
