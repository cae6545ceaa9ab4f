#include "DomStyleWriter.h"

namespace {

constexpr int IndentWidth = 4;

} // namespace

void DomStyleWriter::indent(int level)
{
    m_out.fill(std::size_t(level) * IndentWidth, u' ');
}

void DomStyleWriter::openStartTag(QStringView name, int level, bool afterText)
{
    if (!afterText)
        indent(level);
    put(u'<');
    put(name);
}

void DomStyleWriter::attribute(QStringView name, QStringView value)
{
    put(u' ');
    put(name);
    put(u"=\"");
    escaped(value, true, true);
    put(u'"');
}

void DomStyleWriter::closeStartTag(bool hasChildren, bool firstChildIsText)
{
    if (!hasChildren) {
        put(u"/>");
        return;
    }
    put(u'>');
    if (!firstChildIsText)
        put(u'\n');
}

void DomStyleWriter::endTag(QStringView name, int level, bool lastChildIsText)
{
    if (!lastChildIsText)
        indent(level);
    put(u"</");
    put(name);
    put(u'>');
}

void DomStyleWriter::lineBreak(bool beforeText)
{
    if (!beforeText)
        put(u'\n');
}

void DomStyleWriter::text(QStringView value, bool encodeQuotes)
{
    escaped(value, encodeQuotes, false);
}

void DomStyleWriter::cdata(QStringView value)
{
    put(u"<![CDATA[");
    put(value);
    put(u"]]>");
}

void DomStyleWriter::comment(QStringView value, int level, bool afterText, bool beforeText)
{
    if (!afterText)
        indent(level);
    put(u"<!--");
    put(value);
    // Keeps a comment ending in "-" from closing with "--->".
    if (value.endsWith(u'-'))
        put(u' ');
    put(u"-->");
    lineBreak(beforeText);
}

void DomStyleWriter::processingInstruction(QStringView target, QStringView data)
{
    put(u"<?");
    put(target);
    put(u' ');
    put(data);
    put(u"?>\n");
}

void DomStyleWriter::escaped(QStringView value, bool encodeQuotes, bool attributeValue)
{
    qsizetype plainFrom = 0;
    for (qsizetype i = 0; i < value.size(); ++i) {
        const char16_t c = value[i].unicode();
        if (c > u'>') // past every character escaped below
            continue;
        QStringView replacement;
        switch (c) {
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
            put(value.mid(plainFrom, i - plainFrom));
            put(replacement);
            plainFrom = i + 1;
        }
    }
    put(value.mid(plainFrom));
}
