#include "ReplyTokenizer.h"

#include "DomAttributeOrder.h"

#include <array>

namespace {

// Short texts recur from alarm to alarm (event classes, states, device names); up to this many
// distinct ones of up to InternedLength characters are shared instead of allocated again.
constexpr qsizetype InternedTexts = 4096;
constexpr qsizetype InternedLength = 48;

// Elements with more attributes are left to the general route, which handles them without the
// scanner's quadratic check for duplicates.
constexpr std::size_t ScannedAttributes = 32;

// Where the DOM's attribute order cannot be reproduced, elements with several attributes are
// left to the general route too.
std::size_t scannedAttributes()
{
    static const std::size_t limit =
        DomAttributeOrder::forDocumentOrder() == DomAttributeOrder::Rule::Unknown
            ? 1
            : ScannedAttributes;
    return limit;
}

const QString EmptyText = QStringLiteral("");

// How a character of ASCII is read in text.
enum class Ascii : quint8 { Plain, Space, Markup, Reference, Bracket, Refused };

constexpr std::array<Ascii, 128> asciiClasses()
{
    std::array<Ascii, 128> classes{};
    for (char16_t c = 0; c < 0x20; ++c)
        classes[c] = Ascii::Refused;
    classes[u'\t'] = classes[u'\n'] = classes[u' '] = Ascii::Space;
    classes[u'<'] = Ascii::Markup;
    classes[u'&'] = Ascii::Reference;
    classes[u']'] = Ascii::Bracket;
    return classes;
}

constexpr std::array<Ascii, 128> AsciiClass = asciiClasses();

bool isNameStart(char16_t c)
{
    return (c >= u'a' && c <= u'z') || (c >= u'A' && c <= u'Z') || c == u'_';
}

bool isNameChar(char16_t c)
{
    return isNameStart(c) || (c >= u'0' && c <= u'9') || c == u'-' || c == u'.';
}

// A character the DOM keeps and that is not white space to it: no markup, no surrogate, no
// noncharacter U+FFFE/U+FFFF.
bool isPlain(char16_t c)
{
    if (c < 0x80)
        return AsciiClass[c] == Ascii::Plain;
    if (c < 0x1680) // the common letters of most scripts; no spaces here but two
        return c != 0x85 && c != 0xA0;
    return (c < 0xD800 || (c >= 0xE000 && c < 0xFFFE)) && (c > 0x3000 || !QChar::isSpace(c));
}

// Characters XML allows, the white space controls only where asked for (in text, references to
// them make pieces that the DOM and XML2Json judge differently, so the scanner leaves them alone).
bool isAllowedReference(char32_t c, bool whitespaceControls)
{
    if (c < 0x20)
        return whitespaceControls && (c == u'\t' || c == u'\n' || c == u'\r');
    return c < 0xD800 || (c >= 0xE000 && c <= 0xFFFD) || (c >= 0x10000 && c <= 0x10FFFF);
}

} // namespace

bool ReplyTokenizer::skipSpace()
{
    const char16_t* const from = m_pos;
    while (m_pos < m_end && (*m_pos == u' ' || *m_pos == u'\t' || *m_pos == u'\n'))
        ++m_pos;
    return m_pos != from;
}

bool ReplyTokenizer::name(QStringView& out)
{
    const char16_t* const from = m_pos;
    if (m_pos == m_end || !isNameStart(*m_pos))
        return false;
    while (m_pos < m_end && isNameChar(*m_pos))
        ++m_pos;
    out = QStringView(from, m_pos);
    return true;
}

// name S? = S? quoted value, the value without markup.
bool ReplyTokenizer::pseudoAttribute(QStringView attributeName, QStringView& value)
{
    if (!startsWith(attributeName))
        return false;
    m_pos += attributeName.size();
    skipSpace();
    if (!at(u'='))
        return false;
    ++m_pos;
    skipSpace();
    if (!at(u'"') && !at(u'\''))
        return false;
    const char16_t quote = *m_pos++;
    const char16_t* const from = m_pos;
    while (m_pos < m_end && *m_pos != quote)
        ++m_pos;
    if (m_pos == m_end)
        return false;
    value = QStringView(from, m_pos++);
    return true;
}

bool ReplyTokenizer::declaration()
{
    if (!startsWith(u"<?xml"))
        return true;
    m_pos += 5;
    QStringView value;
    if (!skipSpace() || !pseudoAttribute(u"version", value) || value != u"1.0")
        return false;
    bool spaced = skipSpace();
    if (spaced && startsWith(u"encoding")) {
        if (!pseudoAttribute(u"encoding", value) ||
            value.compare(u"UTF-8", Qt::CaseInsensitive) != 0)
            return false;
        spaced = skipSpace();
    }
    if (spaced && startsWith(u"standalone")) {
        if (!pseudoAttribute(u"standalone", value) || (value != u"yes" && value != u"no"))
            return false;
        skipSpace();
    }
    if (!startsWith(u"?>"))
        return false;
    m_pos += 2;
    return true;
}

// At "&": a predefined entity or a character reference.
bool ReplyTokenizer::reference(char32_t& c, bool whitespaceControls)
{
    ++m_pos;
    static constexpr std::array<std::pair<QStringView, char16_t>, 5> Entities{{
        {u"amp;", u'&'},
        {u"lt;", u'<'},
        {u"gt;", u'>'},
        {u"quot;", u'"'},
        {u"apos;", u'\''},
    }};
    if (!at(u'#')) {
        for (const auto& [entity, value] : Entities) {
            if (startsWith(entity)) {
                m_pos += entity.size();
                c = value;
                return true;
            }
        }
        return false;
    }
    ++m_pos;
    const int base = at(u'x') ? 16 : 10;
    if (base == 16)
        ++m_pos;
    c = 0;
    int digits = 0;
    for (; m_pos < m_end && digits <= 7; ++m_pos, ++digits) {
        const char16_t d = *m_pos;
        const char16_t lower = d | 0x20;
        int digit = -1;
        if (d >= u'0' && d <= u'9')
            digit = d - u'0';
        else if (base == 16 && lower >= u'a' && lower <= u'f')
            digit = lower - u'a' + 10;
        if (digit < 0)
            break;
        c = c * char32_t(base) + char32_t(digit);
    }
    if (digits == 0 || digits > 7 || !at(u';') || !isAllowedReference(c, whitespaceControls))
        return false;
    ++m_pos;
    return true;
}

bool ReplyTokenizer::text(TextRun& run, bool keep)
{
    const char16_t* const begin = m_pos;
    const char16_t* plainFrom = m_pos;
    const auto flush = [&] {
        if (keep)
            run.value.append(QStringView(plainFrom, m_pos));
    };
    for (;;) {
        const char16_t* const plainStart = m_pos;
        while (m_pos < m_end && isPlain(*m_pos))
            ++m_pos;
        if (m_pos != plainStart)
            run.xmlWhitespace = run.blank = false;
        if (m_pos == m_end)
            break;
        const char16_t c = *m_pos;
        if (c < 0x80) {
            const Ascii kind = AsciiClass[c];
            if (kind == Ascii::Markup)
                break;
            if (kind == Ascii::Space) {
                ++m_pos;
            } else if (kind == Ascii::Reference) {
                flush();
                char32_t decoded = 0;
                if (!reference(decoded, false))
                    return false;
                if (keep)
                    run.value.append(QChar::fromUcs4(decoded));
                run.xmlWhitespace = false;
                run.blank = run.blank && QChar::isSpace(decoded);
                plainFrom = m_pos;
            } else if (kind == Ascii::Bracket) {
                if (startsWith(u"]]>"))
                    return false;
                ++m_pos;
                run.xmlWhitespace = run.blank = false;
            } else {
                return false;
            }
        } else if (QChar::isHighSurrogate(c)) {
            if (m_end - m_pos < 2 || !QChar::isLowSurrogate(m_pos[1]))
                return false;
            m_pos += 2;
            run.xmlWhitespace = run.blank = false;
        } else if (QChar::isSpace(c)) {
            ++m_pos;
            run.xmlWhitespace = false;
        } else {
            return false; // lone low surrogate, U+FFFE, U+FFFF
        }
    }
    run.empty = m_pos == begin;
    if (keep && !run.empty) {
        if (run.value.isNull())
            run.value = interned(QStringView(plainFrom, m_pos));
        else
            flush();
    }
    return true;
}

QString ReplyTokenizer::interned(QStringView text)
{
    if (text.size() > InternedLength)
        return text.toString();
    const HashedView key{text, qHash(text)};
    const auto it = m_texts.constFind(key);
    if (it != m_texts.cend())
        return *it;
    QString copy = text.toString();
    if (m_texts.size() < InternedTexts)
        m_texts.insert(key, copy);
    return copy;
}

// A quoted attribute value, its white space normalised to spaces as parsers do.
bool ReplyTokenizer::attributeValue(QString& value)
{
    if (!at(u'"') && !at(u'\''))
        return false;
    const char16_t quote = *m_pos++;
    const char16_t* plainFrom = m_pos;
    const auto flush = [&] { value.append(QStringView(plainFrom, m_pos)); };
    for (;;) {
        if (m_pos == m_end)
            return false;
        const char16_t c = *m_pos;
        if (c == quote)
            break;
        if (c == u'&') {
            flush();
            char32_t decoded = 0;
            if (!reference(decoded, true))
                return false;
            value.append(QChar::fromUcs4(decoded));
            plainFrom = m_pos;
        } else if (c == u'\t' || c == u'\n') {
            flush();
            value.append(u' ');
            plainFrom = ++m_pos;
        } else if (c < 0x20 || c == u'<' || c >= 0xFFFE || QChar::isLowSurrogate(c)) {
            return false;
        } else if (QChar::isHighSurrogate(c)) {
            if (m_end - m_pos < 2 || !QChar::isLowSurrogate(m_pos[1]))
                return false;
            m_pos += 2;
        } else {
            ++m_pos;
        }
    }
    // A value written as it reads is shared with its repeats (ids of kinds, zones, flags).
    if (value.isNull())
        value = interned(QStringView(plainFrom, m_pos));
    else
        flush();
    ++m_pos;
    if (value.isNull())
        value = EmptyText;
    return true;
}

bool ReplyTokenizer::startTag(QStringView& elementName, bool& emptyElement,
                              std::vector<ReplyAttribute>& attributes)
{
    if (!name(elementName))
        return false;
    const std::size_t first = attributes.size();
    for (;;) {
        const bool spaced = skipSpace();
        if (at(u'>') || startsWith(u"/>")) {
            emptyElement = at(u'/');
            m_pos += emptyElement ? 2 : 1;
            return true;
        }
        ReplyAttribute attribute;
        // "xmlns" declares a namespace rather than an attribute.
        if (!spaced || !name(attribute.name) || attribute.name == u"xmlns")
            return false;
        skipSpace();
        if (!at(u'='))
            return false;
        ++m_pos;
        skipSpace();
        if (!attributeValue(attribute.value))
            return false;
        for (std::size_t i = first; i < attributes.size(); ++i) {
            if (attributes[i].name == attribute.name)
                return false;
        }
        if (attributes.size() - first == scannedAttributes())
            return false;
        attributes.push_back(std::move(attribute));
    }
}

// After "</": the name of the element being closed, and ">".
bool ReplyTokenizer::endTag(QStringView elementName)
{
    QStringView closing;
    if (!name(closing) || closing != elementName)
        return false;
    skipSpace();
    if (!at(u'>'))
        return false;
    ++m_pos;
    return true;
}

ReplyTokenizer::Markup ReplyTokenizer::markupAfterText(QStringView elementName)
{
    if (m_pos == m_end)
        return Markup::Fault;
    ++m_pos;
    if (!at(u'/'))
        return Markup::ChildStart;
    ++m_pos;
    return endTag(elementName) ? Markup::EndTag : Markup::Fault;
}

QStringView ReplyTokenizer::peekName() const
{
    const char16_t* end = m_pos;
    if (end == m_end || !isNameStart(*end))
        return {};
    while (end < m_end && isNameChar(*end))
        ++end;
    return QStringView(m_pos, end);
}
