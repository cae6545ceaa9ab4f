#pragma once

#include "Utf16Buffer.h"

#include <QStringView>

#include <cstddef>

// Appends XML text laid out and escaped as QDomNode::save writes it with an indent of 4:
// - an element's start tag is indented by 4 spaces per level unless it follows text;
// - an element without children takes the short form "/>";
// - a line break follows a start tag whose first child is not text, and the end tag of an
//   element (or its short form, or a comment) unless text follows;
// - an end tag is indented unless the element's last child is text;
// - text escapes "<", "&", ">" after "]]" and carriage returns (and quotes outside elements);
//   attribute values also escape quotes, tabs and line feeds.
// Callers walk their tree and say where text stands next to each node.
class DomStyleWriter
{
public:
    explicit DomStyleWriter(Utf16Buffer& out) : m_out(out) {}

    // "<name", indented for its level (1 for the node being written) unless it follows text.
    void openStartTag(QStringView name, int level, bool afterText);
    void attribute(QStringView name, QStringView value);
    // Ends the start tag: "/>" without children, otherwise ">" and, unless the first child is
    // text, a line break.
    void closeStartTag(bool hasChildren, bool firstChildIsText);
    // "</name>", indented unless the last child is text.
    void endTag(QStringView name, int level, bool lastChildIsText);
    // The line break after an element or comment, left out when text follows.
    void lineBreak(bool beforeText);

    void text(QStringView value, bool encodeQuotes);
    void cdata(QStringView value);
    void comment(QStringView value, int level, bool afterText, bool beforeText);
    void processingInstruction(QStringView target, QStringView data);

private:
    void put(QStringView piece)
    {
        m_out.append(reinterpret_cast<const char16_t*>(piece.utf16()), std::size_t(piece.size()));
    }
    void put(char16_t c) { m_out.append(c); }
    void indent(int level);
    void escaped(QStringView value, bool encodeQuotes, bool attributeValue);

    Utf16Buffer& m_out;
};
