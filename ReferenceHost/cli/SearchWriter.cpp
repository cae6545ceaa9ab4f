#include "SearchWriter.h"

#include "AnswerFormat.h"

#include <QJsonDocument>
#include <QJsonValue>

namespace {

// The answer object around the alarm array, pretty or compact, split where the array goes.
QByteArray answerHead(const QString& method, bool pretty)
{
    const QByteArray name = QJsonDocument(QJsonObject{{QStringLiteral("m"), method}})
                                .toJson(QJsonDocument::Compact)
                                .mid(5)
                                .chopped(1); // the method as a JSON string
    return pretty ? "{\n    \"isLast\": true,\n    \"message\": \"\",\n    \"method\": " + name +
                        ",\n    \"result\": {\n        \"queryResult\": ["
                  : "{\"isLast\":true,\"message\":\"\",\"method\":" + name +
                        ",\"result\":{\"queryResult\":[";
}

QByteArray answerTail(bool empty, bool truncated, bool pretty)
{
    const QByteArray flag = truncated ? "true" : "false";
    return pretty ? QByteArray(empty ? "" : "\n        ") +
                        "],\n        \"relayPath\": \"\"\n    },\n    \"resultCode\": \"0\",\n"
                        "    \"truncated\": " +
                        flag + "\n}\n"
                  : "],\"relayPath\":\"\"},\"resultCode\":\"0\",\"truncated\":" + flag + "}\n";
}

} // namespace

SearchWriter::SearchWriter(const Options& options)
    : m_options(options), m_table(options.zone, options.tableWidth)
{
}

std::optional<SearchWriter::Format> SearchWriter::formatNamed(const QString& name)
{
    if (name == QLatin1String("json"))
        return Format::Json;
    if (name == QLatin1String("jsonl"))
        return Format::JsonLines;
    if (name == QLatin1String("table"))
        return Format::Table;
    return std::nullopt;
}

QByteArray SearchWriter::page(const QVariantList& alarms)
{
    QByteArray out;
    const bool first = !m_started;
    m_started = true;
    switch (m_options.format) {
    case Format::Table:
        return m_table.page(alarms).toUtf8();
    case Format::JsonLines:
        for (const QVariant& alarm : alarms)
            out +=
                AnswerFormat::jsonText(AnswerFormat::alarmObject(alarm.toMap()), false, 0) + '\n';
        return out;
    case Format::Json:
        if (first)
            out = answerHead(m_options.method, m_options.pretty);
        for (const QVariant& alarm : alarms) {
            out += m_written++ > 0 ? "," : "";
            if (m_options.pretty)
                out += "\n            ";
            out += AnswerFormat::jsonText(AnswerFormat::alarmObject(alarm.toMap()),
                                          m_options.pretty, 12);
        }
        return out;
    }
    return out;
}

QByteArray SearchWriter::finish(bool truncated)
{
    switch (m_options.format) {
    case Format::Table:
        return m_started ? QByteArray() : m_table.page(QVariantList()).toUtf8();
    case Format::JsonLines:
        return QByteArray();
    case Format::Json:
        return (m_started ? QByteArray() : answerHead(m_options.method, m_options.pretty)) +
               answerTail(m_written == 0, truncated, m_options.pretty);
    }
    return QByteArray();
}
