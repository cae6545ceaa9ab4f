#pragma once

#include <QStringView>

#include <algorithm>
#include <cstring>
#include <vector>

// Text assembled from many short pieces. Appends are inline, without the library call that a
// string class makes for each piece; the storage is kept when the buffer is cleared.
class Utf16Buffer
{
public:
    void clear() { m_size = 0; }
    QStringView view() const { return QStringView(m_data.data(), qsizetype(m_size)); }

    void append(const char16_t* piece, std::size_t length)
    {
        if (length == 0)
            return; // an empty piece may have no data at all, which memcpy must not be given
        std::memcpy(room(length), piece, length * sizeof(char16_t));
        m_size += length;
    }
    void append(char16_t c)
    {
        *room(1) = c;
        ++m_size;
    }
    void fill(std::size_t count, char16_t c)
    {
        char16_t* const out = room(count);
        for (std::size_t i = 0; i < count; ++i)
            out[i] = c;
        m_size += count;
    }

private:
    // Where the next length characters go, the storage grown to hold them.
    char16_t* room(std::size_t length)
    {
        if (length > m_data.size() - m_size)
            m_data.resize(std::max(2 * m_data.size(), m_size + length));
        return m_data.data() + m_size;
    }

    std::vector<char16_t> m_data; // all of it writable; the text is its first m_size characters
    std::size_t m_size = 0;
};

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
