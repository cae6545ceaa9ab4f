#pragma once

#include <QList>
#include <QPair>
#include <QString>

#include <optional>

namespace AlarmServerSim {

// A parsed XML element: the small tree that commands are read into.
struct XmlElement
{
    QString name;
    QList<QPair<QString, QString>> attributes; // in document order
    QString text;                              // the element's own character data
    QList<XmlElement> children;

    // The first child element called name, or null.
    const XmlElement* child(QStringView name) const;
    // Every child element called name, in document order.
    QList<const XmlElement*> childrenNamed(QStringView name) const;
    // The value of the attribute called name (empty when there is none).
    QString attribute(QStringView name) const;
    // The trimmed text of the first child element called name (empty when there is none).
    QString childText(QStringView name) const;
};

// Parses one XML document into its document element. Refuses text that is not well-formed, any
// document with a DTD (no entity declarations reach the server), and text beyond the bounds of
// AlarmSearchLimits on nesting, attributes per element and lone surrogates.
std::optional<XmlElement> parseXmlDocument(const QString& text);

// Appends <tag>value</tag>, or <tag/> when value is empty, with value escaped as element text.
void appendTextElement(QString& out, const QString& tag, const QString& value);

} // namespace AlarmServerSim
