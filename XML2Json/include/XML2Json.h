#pragma once

#include <QString>
#include <QVariant>
#include <QVariantList>
#include <QVariantMap>

// Turns an XML document into nested QVariant values in one streaming pass.
//
// Rendering of an element:
// - No attributes and no child elements: its text as a QString ("" when empty). CDATA sections
//   count as text; comments and processing instructions are skipped.
// - Otherwise a QVariantMap: each attribute under "@name", each child element under its name,
//   several children of one name as a QVariantList in document order, and the element's text
//   pieces that are not whitespace-only, concatenated, under "#text".
// Names are qualified names as written; namespaces are not resolved.
//
// Example: <R><A>1</A><A>2</A><B x="y">t</B><C/></R> renders as
//   {"R": {"A": ["1", "2"], "B": {"@x": "y", "#text": "t"}, "C": ""}}
//
// Hostile input is refused with an invalid result: a document type declaration (its entities
// could expand without bound), text beyond the bounds of AlarmSearchLimits (longer than
// MaxReplyLength, nested deeper than MaxDepth, more than MaxReplyElements elements or
// MaxAttributes attributes on one element), undeclared entities, characters that XML does not
// allow (lone surrogates included), and anything that is not one well-formed document element.
class XML2Json
{
public:
    // A QVariantMap holding one entry, keyed by the document element's name, with the element's
    // rendering as value. An invalid QVariant when the text is not a well-formed document or is
    // refused as hostile; errorString() then says why.
    QVariant parse(const QString& xml);

    // Why the last parse() failed; empty after a successful one.
    QString errorString() const { return m_errorString; }

    // One entry per element of a name: the list itself for repeated elements, a one-element
    // list for a single one, an empty list for an invalid value.
    static QVariantList transContentAsList(const QVariant& value);

    // Adds a child's rendering to its parent's map: under its name, or appended to the list of
    // its namesakes when the name is taken.
    static void addChild(QVariantMap& content, const QString& name, QVariant value);

private:
    QString m_errorString;
};
