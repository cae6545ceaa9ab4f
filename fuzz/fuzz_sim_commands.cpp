// Feeds the simulated server what a client may send it: the first byte picks the route. Even:
// the rest is a stream of frames for the TCP frame reader, each request run by the server. Odd:
// the rest is one command's text, run under the method the byte picks. Every reply carries a
// status of "0" or one with bit 31 set.
#include <AlarmServer.h>
#include <TcpFrame.h>

#include <QCoreApplication>
#include <QJsonObject>

#include <cstdint>
#include <cstdio>
#include <cstdlib>

using namespace AlarmServerSim;

namespace {

AlarmServer& server()
{
    static AlarmServer* const instance = [] {
        static int argc = 1;
        static char name[] = "fuzz_sim_commands";
        static char* argv[] = {name, nullptr};
        new QCoreApplication(argc, argv);
        auto* opened = new AlarmServer;
        AlarmServer::Options options;
        options.databasePath = QStringLiteral(":memory:");
        options.seedCount = 50;
        options.seedEnd = QDateTime(QDate(2026, 11, 20), QTime(12, 0), Qt::UTC);
        QString error;
        if (!opened->open(options, &error)) {
            std::fprintf(stderr, "%s\n", qPrintable(error));
            std::abort();
        }
        return opened;
    }();
    return *instance;
}

void run(const QString& method, const QString& command)
{
    const CommandReply reply = server().execute(method, command);
    bool converted = false;
    const qulonglong status = reply.statusText.toULongLong(&converted, 16);
    if (!converted || (status != 0 && !(status & 0x80000000ULL)))
        std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    if (size == 0)
        return 0;
    const char* const rest = reinterpret_cast<const char*>(data + 1);
    const auto restSize = qsizetype(size - 1);
    if (data[0] % 2 == 1) {
        static const QString methods[] = {
            QStringLiteral("QryAlarmList"), QStringLiteral("ProcessAlarm"),
            QStringLiteral("GetAlarmInfo"), QStringLiteral("MuteAlarm")};
        run(methods[(data[0] / 2) % 4], QString::fromUtf8(rest, restSize));
        return 0;
    }
    QByteArray buffer(rest, restSize);
    QList<QJsonObject> frames;
    takeFrames(buffer, frames, nullptr);
    for (const QJsonObject& frame : frames)
        run(frame.value(QLatin1String("method")).toString(),
            frame.value(QLatin1String("command")).toString());
    return 0;
}
