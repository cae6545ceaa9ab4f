#pragma once

#include <QString>
#include <QStringList>
#include <QVariantList>
#include <QVariantMap>

#include <functional>

// Walks every alarm of a search, past the server's limit of records per search
// (AlarmSearchLimits::MaxRecords), handing each
// page on as it arrives: while a search comes back full, it searches again with the window's end
// moved to the oldest alarm time seen. The bounds are inclusive, so alarms sharing that second
// come back again; they are dropped by their AlarmID. Only the IDs of that one second are kept,
// so memory does not grow with the number of alarms.
class AlarmPager
{
public:
    // One search with the given arguments; the alarms newest first.
    using PageQuery =
        std::function<bool(const QVariantMap& args, QVariantList* alarms, QString* errorMessage)>;
    // Takes the new alarms of one page, newest first; false stops the walk (errorMessage set).
    using PageSink = std::function<bool(const QVariantList& alarms, QString* errorMessage)>;

    explicit AlarmPager(PageQuery query) : m_query(std::move(query)) {}

    bool fetchAll(const QVariantMap& args, const PageSink& sink, QString* errorMessage);

    qint64 alarmCount() const { return m_alarmCount; }
    // Set when more alarms than one search returns share one second: some may be missing.
    QString warning() const { return m_warning; }

private:
    PageQuery m_query;
    qint64 m_alarmCount = 0;
    QString m_warning;
};
