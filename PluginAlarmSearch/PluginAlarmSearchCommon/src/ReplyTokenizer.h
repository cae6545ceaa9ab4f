#pragma once

#include <QHash>
#include <QString>
#include <QStringView>

#include <vector>

// An attribute as written in a start tag, its value decoded.
struct ReplyAttribute
{
    QStringView name;
    QString value;
};

// A run of character data between two pieces of markup.
struct TextRun
{
    QString value;
    bool empty = true;
    bool xmlWhitespace = true; // raw XML white space only: text XML2Json leaves out of "#text"
    bool blank = true;         // white space to QChar::isSpace only: text the DOM drops
};

// Reads the tokens of a reply in the plain form AlarmListScanner takes, over the UTF-16 text
// without copying it: names and attribute names are views of the text. Each step returns false
// on anything outside that form, and the reader then gives up on the whole text.
class ReplyTokenizer
{
public:
    explicit ReplyTokenizer(const QString& text)
        : m_pos(reinterpret_cast<const char16_t*>(text.utf16())), m_end(m_pos + text.size())
    {
    }

    bool atEnd() const { return m_pos == m_end; }
    bool at(char16_t c) const { return m_pos < m_end && *m_pos == c; }
    void skip() { ++m_pos; }
    // White space as XML counts it outside text (no carriage returns: the form has none).
    bool skipSpace();

    // An optional <?xml version="1.0" encoding="UTF-8" standalone="yes"?>, the last two
    // pseudo-attributes optional.
    bool declaration();

    // After "<": the name, the attributes (appended to attributes) and ">" or "/>".
    bool startTag(QStringView& elementName, bool& emptyElement,
                  std::vector<ReplyAttribute>& attributes);
    // Character data up to the next "<" (or the end), checked and, when keep is set, decoded.
    bool text(TextRun& run, bool keep);

    enum class Markup { ChildStart, EndTag, Fault };
    // At the markup after an element's text: a child's start tag (left just past its "<") or
    // the end tag of the element being read (left just past it).
    Markup markupAfterText(QStringView elementName);

    // The name at the current position, the position unchanged; empty when there is none.
    QStringView peekName() const;

private:
    bool startsWith(QStringView text) const
    {
        return m_end - m_pos >= text.size() && QStringView(m_pos, text.size()) == text;
    }
    bool name(QStringView& out);
    bool pseudoAttribute(QStringView attributeName, QStringView& value);
    bool reference(char32_t& c, bool whitespaceControls);
    bool attributeValue(QString& value);
    bool endTag(QStringView elementName);
    QString interned(QStringView text);

    // A text of the reply with its hash, so that a lookup compares the texts themselves (far
    // apart in a long reply) only where the hashes agree.
    struct HashedView
    {
        QStringView text;
        size_t hash;

        friend bool operator==(const HashedView& a, const HashedView& b)
        {
            return a.hash == b.hash && a.text == b.text;
        }
        friend size_t qHash(const HashedView& key, size_t) { return key.hash; }
    };

    const char16_t* m_pos;
    const char16_t* const m_end;
    QHash<HashedView, QString> m_texts; // keys view the reply text
};
