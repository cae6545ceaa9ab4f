#include "AlarmSubtree.h"

#include "AlarmSearchLimits.h"

bool AlarmSubtree::capture(ReplyTokenizer& tokens, int depth, bool keep)
{
    if (++m_elementsRead > AlarmSearchLimits::MaxReplyElements)
        return false;
    const std::size_t index = m_nodes.size();
    const std::size_t attributesBegin = m_attributes.size();
    QStringView elementName;
    bool emptyElement = false;
    if (!tokens.startTag(elementName, emptyElement, m_attributes))
        return false;
    if (keep) {
        SubtreeNode node;
        node.name = elementName;
        node.attributesBegin = qsizetype(attributesBegin);
        node.attributesEnd = qsizetype(m_attributes.size());
        m_nodes.push_back(std::move(node));
    } else {
        m_attributes.resize(attributesBegin);
    }
    while (!emptyElement) {
        TextRun run;
        if (!tokens.text(run, keep))
            return false;
        if (keep && !run.empty) {
            SubtreeNode node;
            node.text = std::move(run.value);
            node.end = qsizetype(m_nodes.size()) + 1;
            node.xmlWhitespace = run.xmlWhitespace;
            node.blank = run.blank;
            m_nodes.push_back(std::move(node));
        }
        const ReplyTokenizer::Markup next = tokens.markupAfterText(elementName);
        if (next == ReplyTokenizer::Markup::Fault)
            return false;
        if (next == ReplyTokenizer::Markup::EndTag)
            break;
        if (depth == AlarmSearchLimits::MaxDepth || !capture(tokens, depth + 1, keep))
            return false;
    }
    if (keep)
        m_nodes[index].end = qsizetype(m_nodes.size());
    return true;
}

void AlarmSubtree::clear()
{
    m_nodes.clear();
    m_attributes.clear();
}
