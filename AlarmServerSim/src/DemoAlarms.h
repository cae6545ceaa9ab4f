#pragma once

#include <QDateTime>
#include <QSqlDatabase>
#include <QString>

namespace AlarmServerSim {

// Writes count demo alarms with their change logs into the alarm tables of db: every event of
// the three trigger-event filters, realistic device and alarm names, spread over the 30 days
// before end, some already processed. The same seed gives the same alarms. Runs inside the
// caller's transaction.
bool seedDemoAlarms(QSqlDatabase db, int count, const QDateTime& end, quint32 seed,
                    QString* errorMessage);

} // namespace AlarmServerSim
