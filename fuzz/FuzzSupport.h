#pragma once

#include <fuzzer/FuzzedDataProvider.h>

#include <QString>
#include <QXmlStreamReader>

#include <cstdio>
#include <cstdlib>

// Reads the next text field of a fuzz input: bytes up to a backslash followed by another
// character ("\\\\" stands for one backslash). Decoded as UTF-8, or as raw UTF-16 when utf16 is
// set, so that unpaired surrogates and U+FFFE reach the code under test too.
inline QString fuzzedText(FuzzedDataProvider& input, bool utf16)
{
    const std::string bytes = input.ConsumeRandomLengthString();
    if (!utf16)
        return QString::fromUtf8(bytes.data(), qsizetype(bytes.size()));
    return QString(reinterpret_cast<const QChar*>(bytes.data()), qsizetype(bytes.size() / 2));
}

// Aborts unless xml is one well-formed element named root, without an XML declaration: what the
// server is sent must always be readable, whatever the client put into its request. An empty
// text is the composer's refusal, allowed only where refusable says the request may be refused.
inline void requireWellFormed(const QString& xml, const QString& root, bool refusable = false)
{
    if (xml.isEmpty() && refusable)
        return;
    QXmlStreamReader reader(xml);
    reader.setNamespaceProcessing(false);
    QString firstElement;
    while (!reader.atEnd()) {
        if (reader.readNext() == QXmlStreamReader::StartElement && firstElement.isNull())
            firstElement = reader.qualifiedName().toString();
    }
    const bool rootFirst = xml.startsWith(QLatin1Char('<') + root);
    if (reader.hasError() || firstElement != root || !rootFirst) {
        std::fprintf(stderr, "Command not well-formed (%s):\n%s\n",
                     qUtf8Printable(reader.errorString()), qUtf8Printable(xml));
        std::abort();
    }
}
