#include "AlarmPager.h"

#include "TimeArgument.h"

#include <PluginAlarmSearchCommon.h>

#include <QSet>

namespace {

const QString kAlarmId = QStringLiteral("AlarmID");
const QString kServerTime = QStringLiteral("ServerTime");

} // namespace

bool AlarmPager::fetchAll(const QVariantMap& args, QVariantList* alarms, QString* errorMessage)
{
    alarms->clear();
    m_pages = 0;
    m_warning.clear();
    QSet<QString> seen;
    QVariantMap window = args;
    for (;;) {
        QVariantList page;
        if (!m_query(window, &page, errorMessage))
            return false;
        ++m_pages;
        int added = 0;
        for (const QVariant& alarm : std::as_const(page)) {
            const QString id = alarm.toMap().value(kAlarmId).toString();
            if (!seen.contains(id)) {
                seen.insert(id);
                alarms->append(alarm);
                ++added;
            }
        }
        if (page.size() < kMaxRecords)
            return true;
        const QString oldest = page.constLast().toMap().value(kServerTime).toString();
        const QDateTime oldestTime = QDateTime::fromString(oldest, Qt::ISODate);
        if (added == 0 || !oldestTime.isValid()) {
            m_warning = QStringLiteral("more than %1 alarms at %2; some of them may be missing")
                            .arg(kMaxRecords)
                            .arg(oldest);
            return true;
        }
        window.insert(PluginAlarmSearchCommon::ARG_END_TIME,
                      TimeArgument::toServerTime(oldestTime));
    }
}
