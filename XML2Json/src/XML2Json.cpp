#include "XML2Json.h"

#include <AlarmSearchLimits.h>
#include <XmlTextBounds.h>

#include <QVariantMap>
#include <QXmlStreamReader>

#include <vector>

namespace {

const QString TextKey = QStringLiteral("#text");
const QString EmptyText = QStringLiteral("");

// An element whose end tag has not been read yet.
struct OpenElement
{
    QString name;
    // Attributes and children; stays empty as long as the element renders as plain text.
    QVariantMap content;
    // Text pieces that are not whitespace-only, for the "#text" entry.
    QString text;
    // Every text piece, kept only while the element may still render as plain text.
    QString leafText;

    QVariant render()
    {
        if (content.isEmpty())
            return leafText.isNull() ? EmptyText : leafText;
        if (!text.isEmpty())
            content.insert(TextKey, text);
        return content;
    }
};

OpenElement openElement(const QXmlStreamReader& reader)
{
    OpenElement element{reader.qualifiedName().toString(), {}, {}, {}};
    const QXmlStreamAttributes attributes = reader.attributes();
    for (const QXmlStreamAttribute& attribute : attributes) {
        QString key;
        key.reserve(attribute.qualifiedName().size() + 1);
        key.append(u'@').append(attribute.qualifiedName());
        element.content.insert(key, attribute.value().toString());
    }
    return element;
}

} // namespace

QVariant XML2Json::parse(const QString& xml)
{
    m_errorString.clear();
    QXmlStreamReader reader(xml);
    reader.setNamespaceProcessing(false);

    std::vector<OpenElement> open;
    QVariant result;
    const auto refuse = [&](const QString& why) {
        m_errorString = why;
        return QVariant();
    };
    if (xml.size() > AlarmSearchLimits::MaxReplyLength)
        return refuse(QStringLiteral("Text longer than %1").arg(AlarmSearchLimits::MaxReplyLength));
    if (!AlarmSearchLimits::withinTextBounds(xml))
        return refuse(QStringLiteral("Lone surrogate or more than %1 attributes on an element")
                          .arg(AlarmSearchLimits::MaxAttributes));
    qsizetype elements = 0;

    while (!reader.atEnd()) {
        switch (reader.readNext()) {
        case QXmlStreamReader::StartElement:
            if (open.size() == std::size_t(AlarmSearchLimits::MaxDepth))
                return refuse(QStringLiteral("Elements nested deeper than %1")
                                  .arg(AlarmSearchLimits::MaxDepth));
            if (++elements > AlarmSearchLimits::MaxReplyElements)
                return refuse(QStringLiteral("More than %1 elements")
                                  .arg(AlarmSearchLimits::MaxReplyElements));
            // The parent now renders as a map; its plain text is no longer needed.
            if (!open.empty())
                open.back().leafText.clear();
            open.push_back(openElement(reader));
            break;
        case QXmlStreamReader::EndElement: {
            QVariant rendering = open.back().render();
            const QString name = std::move(open.back().name);
            open.pop_back();
            if (open.empty())
                result = QVariantMap{{name, std::move(rendering)}};
            else
                XML2Json::addChild(open.back().content, name, std::move(rendering));
            break;
        }
        case QXmlStreamReader::Characters: {
            // Text outside the document element carries nothing.
            if (open.empty())
                break;
            OpenElement& element = open.back();
            const bool leaf = element.content.isEmpty();
            const bool whitespace = reader.isWhitespace();
            if (!leaf && whitespace)
                break;
            const QString piece = reader.text().toString();
            if (leaf)
                element.leafText += piece;
            if (!whitespace)
                element.text += piece;
            break;
        }
        case QXmlStreamReader::DTD:
            return refuse(QStringLiteral("Document type declarations are not accepted"));
        default:
            break;
        }
    }
    if (reader.hasError())
        return refuse(QStringLiteral("Line %1, column %2: %3")
                          .arg(reader.lineNumber())
                          .arg(reader.columnNumber())
                          .arg(reader.errorString()));
    return result;
}

QVariantList XML2Json::transContentAsList(const QVariant& value)
{
    if (!value.isValid())
        return {};
    if (value.userType() == QMetaType::QVariantList)
        return value.toList();
    return {value};
}

void XML2Json::addChild(QVariantMap& content, const QString& name, QVariant value)
{
    const auto it = content.find(name);
    if (it == content.end()) {
        content.insert(name, value);
    } else if (it->userType() == QMetaType::QVariantList) {
        static_cast<QVariantList*>(it->data())->append(std::move(value));
    } else {
        QVariantList repeated{std::move(*it), std::move(value)};
        *it = repeated;
    }
}
