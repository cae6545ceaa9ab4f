#include "AlarmListScanner.h"

#include "DomAttributeOrder.h"
#include "DomStyleWriter.h"

#include <XML2Json.h>

#include <QHash>
#include <QVarLengthArray>

#include <algorithm>
#include <array>
#include <map>
#include <numeric>
#include <vector>

namespace {

constexpr qsizetype MaxAttributes = 32;
// Short texts recur from alarm to alarm (event classes, states, device names); up to this many
// distinct ones of up to InternedLength characters are shared instead of allocated again.
constexpr qsizetype InternedTexts = 4096;
constexpr qsizetype InternedLength = 48;

const QString ReplyName = QStringLiteral("QryAlarmListRes");
const QString AlarmName = QStringLiteral("Alarm");
const QString XmlKey = QStringLiteral("XML");
const QString TextKey = QStringLiteral("#text");
constexpr int TextKeyId = 0; // the first of the scanner's map keys
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
    return (c < 0xD800 || (c >= 0xE000 && c < 0xFFFE)) && !QChar::isSpace(c);
}

// Characters XML allows, the white space controls only where asked for (in text, references to
// them make pieces that the DOM and XML2Json judge differently, so the scanner leaves them alone).
bool isAllowedReference(char32_t c, bool whitespaceControls)
{
    if (c < 0x20)
        return whitespaceControls && (c == u'\t' || c == u'\n' || c == u'\r');
    return c < 0xD800 || (c >= 0xE000 && c <= 0xFFFD) || (c >= 0x10000 && c <= 0x10FFFF);
}

// An element, or a text run between two pieces of markup, of the alarm being read.
struct Node
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

struct Attribute
{
    QStringView name;
    QString value;
};

struct TextRun
{
    QString value;
    bool empty = true;
    bool xmlWhitespace = true;
    bool blank = true;
};

class Scanner
{
public:
    explicit Scanner(const QString& text)
        : m_pos(reinterpret_cast<const char16_t*>(text.utf16())), m_end(m_pos + text.size())
    {
    }

    std::optional<QVariantList> run()
    {
        if (!declaration())
            return std::nullopt;
        skipSpace();
        if (!at(u'<'))
            return std::nullopt;
        ++m_pos;
        if (!documentElement())
            return std::nullopt;
        skipSpace();
        if (m_pos != m_end)
            return std::nullopt;
        return std::move(m_alarms);
    }

private:
    bool at(char16_t c) const { return m_pos < m_end && *m_pos == c; }

    bool startsWith(QStringView text) const
    {
        return m_end - m_pos >= text.size() && QStringView(m_pos, text.size()) == text;
    }

    bool skipSpace()
    {
        const char16_t* const from = m_pos;
        while (m_pos < m_end && (*m_pos == u' ' || *m_pos == u'\t' || *m_pos == u'\n'))
            ++m_pos;
        return m_pos != from;
    }

    bool name(QStringView& out)
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
    bool pseudoAttribute(QStringView attributeName, QStringView& value)
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

    // <?xml version="1.0" encoding="UTF-8" standalone="yes"?>, the last two optional.
    bool declaration()
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
    bool reference(char32_t& c, bool whitespaceControls)
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

    // Character data up to the next "<" (or the end), checked and, when keep is set, decoded.
    bool text(TextRun& run, bool keep)
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

    QString interned(QStringView text)
    {
        if (text.size() > InternedLength)
            return text.toString();
        const auto it = m_texts.constFind(text);
        if (it != m_texts.cend())
            return *it;
        QString copy = text.toString();
        if (m_texts.size() < InternedTexts)
            m_texts.insert(text, copy);
        return copy;
    }

    // A quoted attribute value, its white space normalised to spaces as parsers do.
    bool attributeValue(QString& value)
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
        flush();
        ++m_pos;
        if (value.isNull())
            value = EmptyText;
        return true;
    }

    // After "<": the name, the attributes (appended to m_attributes) and ">" or "/>".
    bool startTag(QStringView& elementName, bool& emptyElement)
    {
        if (!name(elementName))
            return false;
        const std::size_t first = m_attributes.size();
        for (;;) {
            const bool spaced = skipSpace();
            if (at(u'>') || startsWith(u"/>")) {
                emptyElement = at(u'/');
                m_pos += emptyElement ? 2 : 1;
                return true;
            }
            Attribute attribute;
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
            for (std::size_t i = first; i < m_attributes.size(); ++i) {
                if (m_attributes[i].name == attribute.name)
                    return false;
            }
            if (m_attributes.size() - first == maxAttributes())
                return false;
            m_attributes.push_back(std::move(attribute));
        }
    }

    // After "</": the name of the element being closed, and ">".
    bool endTag(QStringView elementName)
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

    enum class Markup { ChildStart, EndTag, Fault };

    // At the markup after an element's text: a child's start tag (left just past its "<") or
    // the end tag of the element being read (left just past it).
    Markup markupAfterText(QStringView elementName)
    {
        if (m_pos == m_end)
            return Markup::Fault;
        ++m_pos;
        if (!at(u'/'))
            return Markup::ChildStart;
        ++m_pos;
        return endTag(elementName) ? Markup::EndTag : Markup::Fault;
    }

    // After "<": an element at the given depth below the document element, kept in m_nodes when
    // keep is set and only checked otherwise.
    bool element(int depth, bool keep)
    {
        const std::size_t index = m_nodes.size();
        const std::size_t attributesBegin = m_attributes.size();
        QStringView elementName;
        bool emptyElement = false;
        if (!startTag(elementName, emptyElement))
            return false;
        if (keep) {
            Node node;
            node.name = elementName;
            node.attributesBegin = qsizetype(attributesBegin);
            node.attributesEnd = qsizetype(m_attributes.size());
            m_nodes.push_back(std::move(node));
        } else {
            m_attributes.resize(attributesBegin);
        }
        while (!emptyElement) {
            TextRun run;
            if (!text(run, keep))
                return false;
            if (keep && !run.empty) {
                Node node;
                node.text = std::move(run.value);
                node.end = qsizetype(m_nodes.size() + 1);
                node.xmlWhitespace = run.xmlWhitespace;
                node.blank = run.blank;
                m_nodes.push_back(std::move(node));
            }
            const Markup next = markupAfterText(elementName);
            if (next == Markup::Fault)
                return false;
            if (next == Markup::EndTag)
                break;
            if (depth == XML2Json::MaxDepth || !element(depth + 1, keep))
                return false;
        }
        if (keep)
            m_nodes[index].end = qsizetype(m_nodes.size());
        return true;
    }

    // After "<": the document element, with each "Alarm" child read into the results when it is
    // a "QryAlarmListRes".
    bool documentElement()
    {
        QStringView elementName;
        bool emptyElement = false;
        if (!startTag(elementName, emptyElement))
            return false;
        m_attributes.clear();
        const bool isReply = elementName == ReplyName;
        while (!emptyElement) {
            // Text the DOM keeps, between two children: the alarm before it takes no line break,
            // the alarm after it no indentation.
            TextRun run;
            if (!text(run, false))
                return false;
            const bool afterText = !run.blank;
            if (m_alarmPending)
                finishAlarmText(afterText);
            const Markup next = markupAfterText(elementName);
            if (next == Markup::Fault)
                return false;
            if (next == Markup::EndTag)
                break;
            const char16_t* const childStart = m_pos;
            QStringView childName;
            const bool isAlarm = isReply && name(childName) && childName == AlarmName;
            m_pos = childStart;
            if (!element(2, isAlarm))
                return false;
            if (isAlarm)
                addAlarm(afterText);
        }
        return true;
    }

    // The alarm just read into m_nodes.
    void addAlarm(bool afterText)
    {
        QVariant rendering = render(0);
        m_alarm = rendering.toMap();
        rendering.clear();

        // Written into a buffer that keeps its capacity from alarm to alarm; whether a line break
        // ends it is known once the text after the alarm has been read.
        m_xml.clear();
        DomStyleWriter writer(m_xml);
        write(writer, 0, 1, afterText);
        m_alarmPending = true;

        m_nodes.clear();
        m_attributes.clear();
    }

    // Ends the text of the alarm read last and adds the alarm, with a copy of its text of just
    // the right size.
    void finishAlarmText(bool beforeText)
    {
        DomStyleWriter(m_xml).lineBreak(beforeText);
        m_alarm.insert(XmlKey, m_xml.view().toString());
        m_alarms.append(QVariant(std::move(m_alarm)));
        m_alarm = QVariantMap();
        m_alarmPending = false;
    }

    // The number of the map key prefix + name; keys are numbered as they first turn up, and
    // m_keyRanks holds their order in a QVariantMap.
    int keyId(QStringView name, QHash<QStringView, int>& cache, QStringView prefix)
    {
        const auto it = cache.constFind(name);
        if (it != cache.cend())
            return *it;
        const int id = int(m_keys.size());
        QString key;
        key.reserve(prefix.size() + name.size());
        m_keys.push_back(key.append(prefix).append(name));
        cache.insert(name, id);

        std::vector<int> order(m_keys.size());
        std::iota(order.begin(), order.end(), 0);
        std::sort(order.begin(), order.end(), [&](int a, int b) { return m_keys[a] < m_keys[b]; });
        m_keyRanks.resize(order.size());
        for (std::size_t rank = 0; rank < order.size(); ++rank)
            m_keyRanks[std::size_t(order[rank])] = int(rank);
        return id;
    }

    // The node's rendering as XML2Json::parse gives it.
    QVariant render(qsizetype index)
    {
        const Node& node = m_nodes[std::size_t(index)];
        bool hasChildElements = false;
        for (qsizetype child = index + 1; child < node.end; child = m_nodes[std::size_t(child)].end)
            hasChildElements = hasChildElements || !m_nodes[std::size_t(child)].isText();

        if (node.attributesBegin == node.attributesEnd && !hasChildElements) {
            QString leaf;
            for (qsizetype child = index + 1; child < node.end; ++child)
                leaf += m_nodes[std::size_t(child)].text;
            return leaf.isNull() ? EmptyText : leaf;
        }

        // The entries in document order, then sorted by key so that each goes in at the map's
        // end without searching; repeated names stay in document order and become a list.
        struct Entry
        {
            int key;
            QVariant value;
        };
        QVarLengthArray<Entry, 32> entries;
        for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a) {
            const Attribute& attribute = m_attributes[std::size_t(a)];
            entries.append({keyId(attribute.name, m_attributeKeys, u"@"), attribute.value});
        }
        QString text;
        for (qsizetype child = index + 1; child < node.end;
             child = m_nodes[std::size_t(child)].end) {
            const Node& childNode = m_nodes[std::size_t(child)];
            if (!childNode.isText())
                entries.append({keyId(childNode.name, m_elementKeys, {}), render(child)});
            else if (!childNode.xmlWhitespace)
                text += childNode.text;
        }
        if (!text.isEmpty())
            entries.append({TextKeyId, std::move(text)});
        // Positions ordered by the rank of their key, ties in document order.
        QVarLengthArray<std::pair<int, int>, 32> order;
        for (int i = 0; i < int(entries.size()); ++i)
            order.append({m_keyRanks[std::size_t(entries[i].key)], i});
        std::sort(order.begin(), order.end());

        std::map<QString, QVariant> content;
        for (auto it = order.cbegin(); it != order.cend();) {
            const auto next = std::find_if(it + 1, order.cend(), [&](const auto& position) {
                return position.first != it->first;
            });
            Entry& first = entries[it->second];
            QVariant value;
            if (next - it == 1) {
                value = std::move(first.value);
            } else {
                QVariantList repeated;
                repeated.reserve(next - it);
                for (auto same = it; same != next; ++same)
                    repeated.append(std::move(entries[same->second].value));
                value = std::move(repeated);
            }
            content.emplace_hint(content.cend(), m_keys[std::size_t(first.key)], std::move(value));
            it = next;
        }
        return QVariantMap(std::move(content));
    }

    // The element as XmlHelper::nodeToXml writes it, without the line break after it.
    void write(DomStyleWriter& writer, qsizetype index, int level, bool afterText)
    {
        const Node& node = m_nodes[std::size_t(index)];
        writer.openStartTag(node.name, level, afterText);
        writeAttributes(writer, node);

        QVarLengthArray<qsizetype, 16> children; // the DOM drops blank text
        for (qsizetype child = index + 1; child < node.end;
             child = m_nodes[std::size_t(child)].end) {
            if (!m_nodes[std::size_t(child)].blank)
                children.append(child);
        }
        const auto isText = [&](qsizetype i) {
            return i >= 0 && i < children.size() && m_nodes[std::size_t(children[i])].isText();
        };
        writer.closeStartTag(!children.isEmpty(), isText(0));
        for (qsizetype i = 0; i < children.size(); ++i) {
            const Node& child = m_nodes[std::size_t(children[i])];
            if (child.isText()) {
                writer.text(child.text, false);
            } else {
                write(writer, children[i], level + 1, isText(i - 1));
                writer.lineBreak(isText(i + 1));
            }
        }
        if (!children.isEmpty())
            writer.endTag(node.name, level, isText(children.size() - 1));
    }

    // In the order the running Qt's DOM writes them.
    void writeAttributes(DomStyleWriter& writer, const Node& node)
    {
        DomAttributeOrder::Names names;
        for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a)
            names.append(m_attributes[std::size_t(a)].name);
        for (const qsizetype i : DomAttributeOrder::arrange(m_attributeOrder, names)) {
            const Attribute& attribute = m_attributes[std::size_t(node.attributesBegin + i)];
            writer.attribute(attribute.name, attribute.value);
        }
    }

    // Where the DOM's attribute order cannot be reproduced, elements with several attributes
    // are left to the general route.
    std::size_t maxAttributes() const
    {
        return m_attributeOrder == DomAttributeOrder::Rule::Unknown ? 1
                                                                    : std::size_t(MaxAttributes);
    }

    const char16_t* m_pos;
    const char16_t* const m_end;
    const DomAttributeOrder::Rule m_attributeOrder = DomAttributeOrder::forDocumentOrder();

    // The alarm being read.
    std::vector<Node> m_nodes;
    std::vector<Attribute> m_attributes;

    QVariantList m_alarms;
    // The alarm read last, its text in m_xml still without its line break, while m_alarmPending.
    QVariantMap m_alarm;
    Utf16Buffer m_xml;
    bool m_alarmPending = false;
    std::vector<QString> m_keys{TextKey};
    std::vector<int> m_keyRanks{0};
    QHash<QStringView, int> m_elementKeys;
    QHash<QStringView, int> m_attributeKeys;
    QHash<QStringView, QString> m_texts; // keys view the reply text
};

} // namespace

std::optional<QVariantList> AlarmListScanner::read(const QString& replyText)
{
    return Scanner(replyText).run();
}
