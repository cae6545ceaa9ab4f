#include "CommandXml.h"

#include <AlarmSearchLimits.h>
#include <XmlTextBounds.h>

#include <QScopeGuard>
#include <QXmlStreamReader>

#include <algorithm>

namespace AlarmServerSim {

const XmlElement* XmlElement::child(QStringView childName) const
{
    for (const XmlElement& element : children) {
        if (element.name == childName)
            return &element;
    }
    return nullptr;
}

QList<const XmlElement*> XmlElement::childrenNamed(QStringView childName) const
{
    QList<const XmlElement*> found;
    for (const XmlElement& element : children) {
        if (element.name == childName)
            found.append(&element);
    }
    return found;
}

QString XmlElement::attribute(QStringView attributeName) const
{
    for (const auto& [attributeKey, value] : attributes) {
        if (attributeKey == attributeName)
            return value;
    }
    return QString();
}

QString XmlElement::childText(QStringView childName) const
{
    const XmlElement* element = child(childName);
    return element ? element->text.trimmed() : QString();
}

std::optional<XmlElement> parseXmlDocument(const QString& text)
{
    // The tree's destructor recurses once per level, and the reader checks attributes for
    // duplicates in quadratic time.
    if (!AlarmSearchLimits::withinTextBounds(text))
        return std::nullopt;
    // One reader per thread, cleared after each text: setting a reader up takes about as long as
    // reading a short command with it.
    thread_local QXmlStreamReader reader;
    reader.addData(text);
    const auto clear = qScopeGuard([] { reader.clear(); });
    XmlElement root;
    // Path from the document element down to the element being read.
    QList<XmlElement*> open;
    while (!reader.atEnd()) {
        switch (reader.readNext()) {
        case QXmlStreamReader::DTD:
            return std::nullopt;
        case QXmlStreamReader::StartElement: {
            if (open.size() == AlarmSearchLimits::MaxDepth)
                return std::nullopt;
            XmlElement* element = &root;
            if (!open.isEmpty()) {
                open.last()->children.append(XmlElement());
                element = &open.last()->children.last();
            }
            element->name = reader.name().toString();
            for (const QXmlStreamAttribute& attribute : reader.attributes())
                element->attributes.append(
                    {attribute.qualifiedName().toString(), attribute.value().toString()});
            open.append(element);
            break;
        }
        case QXmlStreamReader::EndElement:
            open.removeLast();
            break;
        case QXmlStreamReader::Characters:
            if (!open.isEmpty())
                open.last()->text += reader.text();
            break;
        default:
            break;
        }
    }
    if (reader.hasError() || root.name.isEmpty())
        return std::nullopt;
    return root;
}

void appendTextElement(QString& out, const QString& tag, const QString& value)
{
    out += QLatin1Char('<');
    out += tag;
    if (value.isEmpty()) {
        out += QLatin1String("/>");
        return;
    }
    out += QLatin1Char('>');
    const bool plain = std::none_of(value.cbegin(), value.cend(), [](QChar c) {
        return c == u'<' || c == u'>' || c == u'&' || c == u'"';
    });
    out += plain ? value : value.toHtmlEscaped(); // escaping copies the text even when it is plain
    out += QLatin1String("</");
    out += tag;
    out += QLatin1Char('>');
}

} // namespace AlarmServerSim
