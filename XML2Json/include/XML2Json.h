#pragma once

#include <QString>
#include <QVariant>
#include <QVariantList>

// Turns an XML document into nested QVariant values.
//
// (The rendering convention is documented here once the converter exists.)
class XML2Json
{
public:
    // A QVariantMap holding one entry, keyed by the document element's name. An invalid
    // QVariant when the text is not a well-formed document or is refused as hostile.
    QVariant parse(const QString& xml);

    // One entry per element of a name: the list itself for repeated elements, a one-element
    // list for a single one, an empty list for an invalid value.
    static QVariantList transContentAsList(const QVariant& value);
};
