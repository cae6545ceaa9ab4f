#pragma once

#include "ReplyTokenizer.h"

#include <QString>
#include <QStringView>

#include <vector>

// A node of a captured subtree: an element, or a text run between two pieces of markup.
struct SubtreeNode
{
    QStringView name; // empty for text
    QString text;
    qsizetype attributesBegin = 0;
    qsizetype attributesEnd = 0;
    qsizetype end = 0;          // one past the node's subtree
    bool xmlWhitespace = false; // raw XML white space only: text XML2Json leaves out of "#text"
    bool blank = false;         // white space to QChar::isSpace only: text the DOM drops

    bool isText() const { return name.isEmpty(); }
};

// An element's subtree read from the reply, its nodes in document order in one flat list: the
// element at index 0, each node's children from the index after it up to its end, one child's
// end being the index of the next. Attributes are kept in a list of their own. Cleared and
// reused from alarm to alarm, so its storage is allocated once.
class AlarmSubtree
{
public:
    // After "<": reads an element at the given depth below the document element (the document
    // element at depth 1), into the subtree when keep is set and only checked otherwise. False on
    // text outside the tokenizer's form, nesting deeper than AlarmSearchLimits::MaxDepth, or more
    // elements in the reply than AlarmSearchLimits::MaxReplyElements.
    bool capture(ReplyTokenizer& tokens, int depth, bool keep);
    void clear();

    const SubtreeNode& node(qsizetype index) const { return m_nodes[std::size_t(index)]; }
    const ReplyAttribute& attribute(qsizetype index) const
    {
        return m_attributes[std::size_t(index)];
    }

private:
    std::vector<SubtreeNode> m_nodes;
    std::vector<ReplyAttribute> m_attributes;
    qsizetype m_elementsRead = 1; // in the whole reply, counting the document element
};

// Calls visit(childIndex) for each child of the node at index, in document order.
template <typename Visit>
void forEachChild(const AlarmSubtree& subtree, qsizetype index, Visit&& visit)
{
    const qsizetype end = subtree.node(index).end;
    for (qsizetype child = index + 1; child < end; child = subtree.node(child).end)
        visit(child);
}
