#include "AlarmPager.h"

#include <TimeArgument.h>

#include <AlarmFields.h>
#include <AlarmSearchLimits.h>
#include <PluginAlarmSearchCommon.h>

#include <QSet>

using namespace PluginAlarmSearchCommon;

namespace {

QDateTime serverTimeOf(const QVariant& alarm)
{
    return QDateTime::fromString(alarm.toMap().value(FIELD_SERVER_TIME).toString(), Qt::ISODate);
}

} // namespace

bool AlarmPager::fetchAll(const QVariantMap& args, const PageSink& sink, QString* errorMessage)
{
    m_alarmCount = 0;
    m_warning.clear();
    QSet<QString> boundaryIds; // the alarms of the previous page at its oldest second
    QDateTime windowEnd;       // the oldest second of the previous page
    QVariantMap window = args;
    for (;;) {
        QVariantList page;
        if (!m_query(window, &page, errorMessage))
            return false;
        // Each window ends at the oldest second of the page before, so the walk ends only if
        // pages come newest first and within the window: a server that breaks that is refused
        // instead of walked forever.
        const QDateTime newestTime = page.isEmpty() ? QDateTime() : serverTimeOf(page.constFirst());
        const QDateTime oldestTime = page.isEmpty() ? QDateTime() : serverTimeOf(page.constLast());
        if ((newestTime.isValid() && newestTime < oldestTime) ||
            (windowEnd.isValid() && newestTime > windowEnd)) {
            *errorMessage = QStringLiteral("the server's alarms are not newest first within the "
                                           "searched time range; stopped after %1 alarms")
                                .arg(m_alarmCount);
            return false;
        }
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
        // A full page within one second of the last: searching again gives the same second.
        if (added.isEmpty() || !oldestTime.isValid() || oldestTime == windowEnd) {
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
        windowEnd = oldestTime;
        window.insert(ARG_END_TIME, TimeArgument::toServerTime(oldestTime));
    }
}
