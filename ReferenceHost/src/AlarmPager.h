#pragma once

#include <QString>
#include <QVariantList>
#include <QVariantMap>

#include <functional>

// Collects every alarm of a search, past the server's limit of records per search: while a
// search comes back full, it searches again with the window's end moved to the oldest alarm
// time seen. The bounds are inclusive, so alarms sharing that second come back twice; they are
// dropped by their AlarmID.
class AlarmPager
{
public:
    static constexpr int kMaxRecords = 5000;

    // One search with the given arguments; the alarms newest first.
    using PageQuery =
        std::function<bool(const QVariantMap& args, QVariantList* alarms, QString* errorMessage)>;

    explicit AlarmPager(PageQuery query) : m_query(std::move(query)) {}

    bool fetchAll(const QVariantMap& args, QVariantList* alarms, QString* errorMessage);

    int pages() const { return m_pages; }
    // Set when more alarms than one search returns share one second: some may be missing.
    QString warning() const { return m_warning; }

private:
    PageQuery m_query;
    int m_pages = 0;
    QString m_warning;
};
