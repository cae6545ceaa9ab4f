#include "DomStyleWriter.h"

#include <algorithm>

namespace {

constexpr int IndentWidth = 4;

} // namespace

void DomStyleWriter::indent(int level)
{
    static constexpr QStringView Spaces =
        u"                                                                ";
    for (qsizetype missing = qsizetype(level) * IndentWidth; missing > 0; missing -= Spaces.size())
        m_out.append(Spaces.first(std::min(missing, Spaces.size())));
}

void DomStyleWriter::openStartTag(QStringView name, int level, bool afterText)
{
    if (!afterText)
        indent(level);
    m_out.append(u'<').append(name);
}

void DomStyleWriter::attribute(QStringView name, QStringView value)
{
    m_out.append(u' ').append(name).append(u"=\"");
    escaped(value, true, true);
    m_out.append(u'"');
}

void DomStyleWriter::closeStartTag(bool hasChildren, bool firstChildIsText)
{
    if (!hasChildren) {
        m_out.append(u"/>");
        return;
    }
    m_out.append(u'>');
    if (!firstChildIsText)
        m_out.append(u'\n');
}

void DomStyleWriter::endTag(QStringView name, int level, bool lastChildIsText)
{
    if (!lastChildIsText)
        indent(level);
    m_out.append(u"</").append(name).append(u'>');
}

void DomStyleWriter::lineBreak(bool beforeText)
{
    if (!beforeText)
        m_out.append(u'\n');
}

void DomStyleWriter::text(QStringView value, bool encodeQuotes)
{
    escaped(value, encodeQuotes, false);
}

void DomStyleWriter::cdata(QStringView value)
{
    m_out.append(u"<![CDATA[").append(value).append(u"]]>");
}

void DomStyleWriter::comment(QStringView value, int level, bool afterText, bool beforeText)
{
    if (!afterText)
        indent(level);
    m_out.append(u"<!--").append(value);
    // Keeps a comment ending in "-" from closing with "--->".
    if (value.endsWith(u'-'))
        m_out.append(u' ');
    m_out.append(u"-->");
    lineBreak(beforeText);
}

void DomStyleWriter::processingInstruction(QStringView target, QStringView data)
{
    m_out.append(u"<?").append(target).append(u' ').append(data).append(u"?>\n");
}

void DomStyleWriter::escaped(QStringView value, bool encodeQuotes, bool attributeValue)
{
    qsizetype plainFrom = 0;
    for (qsizetype i = 0; i < value.size(); ++i) {
        QStringView replacement;
        switch (value[i].unicode()) {
        case u'<':
            replacement = u"&lt;";
            break;
        case u'&':
            replacement = u"&amp;";
            break;
        case u'"':
            if (encodeQuotes)
                replacement = u"&quot;";
            break;
        case u'>':
            // Only where it would close a "]]>".
            if (i >= 2 && value[i - 1] == u']' && value[i - 2] == u']')
                replacement = u"&gt;";
            break;
        case u'\r':
            replacement = u"&#xd;";
            break;
        case u'\n':
            if (attributeValue)
                replacement = u"&#xa;";
            break;
        case u'\t':
            if (attributeValue)
                replacement = u"&#x9;";
            break;
        default:
            break;
        }
        if (!replacement.isEmpty()) {
            m_out.append(value.mid(plainFrom, i - plainFrom)).append(replacement);
            plainFrom = i + 1;
        }
    }
    m_out.append(value.mid(plainFrom));
}
