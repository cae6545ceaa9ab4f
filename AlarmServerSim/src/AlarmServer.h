#pragma once

#include <QDateTime>
#include <QString>

#include <memory>

namespace AlarmServerSim {

// What the server answers to one command: a hexadecimal status text ("0" for success; bit 31
// set for a failure) and the reply XML.
struct CommandReply
{
    QString statusText;
    QString replyText;
};

// A management server that keeps alarms in SQLite and answers the commands "QryAlarmList",
// "ProcessAlarm", "GetAlarmInfo" and "MuteAlarm".
class AlarmServer
{
public:
    struct Options
    {
        QString databasePath;  // a file path; ":memory:" keeps everything in memory
        int seedCount = 30000; // demo alarms seeded when the database is new (0: none)
        QDateTime seedEnd;     // newest seeded alarm time (invalid: now)
        quint32 seed = 1;      // the same seed gives the same demo alarms
    };

    AlarmServer();
    ~AlarmServer();
    Q_DISABLE_COPY(AlarmServer)

    // Opens the database, creating the schema and seeding demo alarms when it is new.
    bool open(const Options& options, QString* errorMessage);
    // Runs one command; may be called from any thread, also concurrently. operatorName is who
    // asked, as the host knows its client; a change is logged under it (empty, or longer than
    // kMaxOperatorName: kDefaultOperator).
    CommandReply execute(const QString& method, const QString& commandText,
                         const QString& operatorName = QString());

    static constexpr int kMaxOperatorName = 64;
    static const QString kDefaultOperator;

    // The per-user database file used when no other is chosen.
    static QString defaultDatabasePath();

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace AlarmServerSim
