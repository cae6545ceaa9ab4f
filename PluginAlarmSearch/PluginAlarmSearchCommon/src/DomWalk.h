#pragma once

#include "AlarmSearchLimits.h"

#include <QDomNode>

#include <utility>

// A walk over a DOM subtree in document order without recursion: replies and request fragments
// may nest deeply, and a recursive walk would take one stack frame per level.
namespace DomWalk {

enum class Result { Done, TooDeep, Stopped };

// Walks the subtree below top, top at level 1: enter(node, level) comes before a node's
// children and stops the walk by returning false; leave(node, level) comes after the children of
// a node that has some. A level deeper than AlarmSearchLimits::MaxDepth stops the walk too.
template <typename Enter, typename Leave>
Result walkSubtree(const QDomNode& top, Enter&& enter, Leave&& leave)
{
    QDomNode node = top;
    int level = 1;
    for (;;) {
        if (level > AlarmSearchLimits::MaxDepth)
            return Result::TooDeep;
        if (!enter(node, level))
            return Result::Stopped;
        if (node.hasChildNodes()) {
            node = node.firstChild();
            ++level;
            continue;
        }
        // Climb to the next node to enter, leaving the nodes that end on the way.
        while (node != top && node.nextSibling().isNull()) {
            node = node.parentNode();
            --level;
            leave(node, level);
        }
        if (node == top)
            return Result::Done;
        node = node.nextSibling();
    }
}

// The same walk for callers with nothing to do when a node's children end.
template <typename Enter> Result walkSubtree(const QDomNode& top, Enter&& enter)
{
    return walkSubtree(top, std::forward<Enter>(enter), [](const QDomNode&, int) {});
}

} // namespace DomWalk
