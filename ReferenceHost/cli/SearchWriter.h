#pragma once

#include "AlarmTable.h"

#include <QByteArray>
#include <QString>
#include <QVariantList>

#include <optional>

// Writes the alarms of a search page by page as they arrive, so that nothing grows with their
// number: one JSON answer object whose "queryResult" array is written incrementally
// ({"isLast", "message", "method", "result": {"queryResult", "relayPath"}, "resultCode",
// "truncated"}), JSON lines (one alarm object per line), or a table.
class SearchWriter
{
public:
    enum class Format { Json, JsonLines, Table };
    struct Options
    {
        Format format = Format::Json;
        QString method;
        bool pretty = false;
        QTimeZone zone = QTimeZone::utc(); // of table times
        int tableWidth = 0;                // 0: no limit
    };

    explicit SearchWriter(const Options& options);

    QByteArray page(const QVariantList& alarms);
    // The end of the output; truncated tells that matches may be missing.
    QByteArray finish(bool truncated);

    // "json", "jsonl" or "table"; nullopt for any other name.
    static std::optional<Format> formatNamed(const QString& name);

private:
    Options m_options;
    AlarmTable m_table;
    bool m_started = false;
    qint64 m_written = 0;
};
