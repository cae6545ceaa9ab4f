#include "AlarmPager.h"

#include <TimeArgument.h>

#include <AlarmFields.h>
#include <AlarmSearchLimits.h>
#include <PluginAlarmSearchCommon.h>

#include <QSet>

using namespace PluginAlarmSearchCommon;

bool AlarmPager::fetchAll(const QVariantMap& args, const PageSink& sink, QString* errorMessage)
{
    m_alarmCount = 0;
    m_warning.clear();
    QSet<QString> boundaryIds; // the alarms of the previous page at its oldest second
    QVariantMap window = args;
    for (;;) {
        QVariantList page;
        if (!m_query(window, &page, errorMessage))
            return false;
        QVariantList added;
        added.reserve(page.size());
        for (const QVariant& alarm : std::as_const(page)) {
            if (!boundaryIds.contains(alarm.toMap().value(FIELD_ALARM_ID).toString()))
                added.append(alarm);
        }
        m_alarmCount += added.size();
        if (!added.isEmpty() && !sink(added, errorMessage))
            return false;
        if (page.size() < AlarmSearchLimits::MaxRecords)
            return true;
        const QString oldest = page.constLast().toMap().value(FIELD_SERVER_TIME).toString();
        const QDateTime oldestTime = QDateTime::fromString(oldest, Qt::ISODate);
        if (added.isEmpty() || !oldestTime.isValid()) {
            m_warning = QStringLiteral("more than %1 alarms at %2; some of them may be missing")
                            .arg(AlarmSearchLimits::MaxRecords)
                            .arg(oldest);
            return true;
        }
        // Alarms at the oldest second seen come back in the next window; remember all of them
        // (those of earlier pages at that second included).
        if (page.constFirst().toMap().value(FIELD_SERVER_TIME).toString() != oldest)
            boundaryIds.clear();
        for (const QVariant& alarm : std::as_const(page)) {
            const QVariantMap fields = alarm.toMap();
            if (fields.value(FIELD_SERVER_TIME).toString() == oldest)
                boundaryIds.insert(fields.value(FIELD_ALARM_ID).toString());
        }
        window.insert(ARG_END_TIME, TimeArgument::toServerTime(oldestTime));
    }
}
