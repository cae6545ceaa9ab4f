// alarmsearch-sim: serves the simulated management server over loopback TCP until SIGINT or
// SIGTERM.

#include "AlarmServer.h"
#include "TcpAlarmServer.h"

#include <QCommandLineParser>
#include <QCoreApplication>
#include <QSocketNotifier>

#include <csignal>
#include <cstdio>
#include <sys/socket.h>
#include <unistd.h>

namespace {

int g_signalPipe[2] = {-1, -1};

void onSignal(int)
{
    const char byte = 1;
    [[maybe_unused]] const ssize_t written = ::write(g_signalPipe[1], &byte, 1);
}

// Quits the event loop on SIGINT or SIGTERM; the handler only writes to a socket pair that the
// event loop watches.
bool quitOnSignals(QCoreApplication& app)
{
    if (::socketpair(AF_UNIX, SOCK_STREAM, 0, g_signalPipe) != 0)
        return false;
    auto* notifier = new QSocketNotifier(g_signalPipe[0], QSocketNotifier::Read, &app);
    QObject::connect(notifier, &QSocketNotifier::activated, &app, &QCoreApplication::quit);
    struct sigaction action = {};
    action.sa_handler = onSignal;
    sigemptyset(&action.sa_mask);
    action.sa_flags = SA_RESTART;
    return ::sigaction(SIGINT, &action, nullptr) == 0 &&
           ::sigaction(SIGTERM, &action, nullptr) == 0;
}

// A usage error: one line naming what is wrong, exit code 2.
int usageError(const QString& message)
{
    std::fprintf(stderr, "alarmsearch-sim: %s; see 'alarmsearch-sim --help'\n",
                 qPrintable(message));
    return 2;
}

} // namespace

int main(int argc, char* argv[])
{
    QCoreApplication app(argc, argv);
    QCoreApplication::setApplicationName(QStringLiteral("alarmsearch-sim"));
    QCoreApplication::setApplicationVersion(QStringLiteral(ALARMSEARCH_VERSION));

    QCommandLineParser parser;
    parser.setApplicationDescription(
        QStringLiteral("Simulated management server answering alarm commands over loopback TCP."));
    const QCommandLineOption helpOption = parser.addHelpOption();
    const QCommandLineOption versionOption = parser.addVersionOption();
    const QCommandLineOption dbOption(QStringLiteral("db"),
                                      QStringLiteral("Database file (default: %1).")
                                          .arg(AlarmServerSim::AlarmServer::defaultDatabasePath()),
                                      QStringLiteral("path"));
    const QCommandLineOption memoryOption(QStringLiteral("memory"),
                                          QStringLiteral("Keep the alarms in memory only."));
    const QCommandLineOption portOption(QStringLiteral("port"),
                                        QStringLiteral("TCP port on 127.0.0.1 (default: 47800)."),
                                        QStringLiteral("port"), QStringLiteral("47800"));
    const QCommandLineOption seedCountOption(
        QStringLiteral("seed-count"),
        QStringLiteral("Demo alarms seeded into a new database (default: 30000)."),
        QStringLiteral("count"), QStringLiteral("30000"));
    const QCommandLineOption maxConnectionsOption(
        QStringLiteral("max-connections"),
        QStringLiteral("Clients served at once; more are closed at once (default: %1).")
            .arg(AlarmServerSim::TcpAlarmServer::DefaultMaxConnections),
        QStringLiteral("count"),
        QString::number(AlarmServerSim::TcpAlarmServer::DefaultMaxConnections));
    parser.addOptions({dbOption, memoryOption, portOption, seedCountOption, maxConnectionsOption});
    if (!parser.parse(app.arguments()))
        return usageError(parser.errorText());
    if (parser.isSet(helpOption) || parser.isSet(QStringLiteral("help-all"))) {
        std::printf("%s", qPrintable(parser.helpText()));
        return 0;
    }
    if (parser.isSet(versionOption)) {
        std::printf("alarmsearch-sim %s\n", qPrintable(app.applicationVersion()));
        return 0;
    }
    if (!parser.positionalArguments().isEmpty())
        return usageError(QStringLiteral("unexpected argument \"%1\"; it takes options only")
                              .arg(parser.positionalArguments().constFirst()));

    bool portOk = false;
    const uint port = parser.value(portOption).toUInt(&portOk);
    if (!portOk || port > 65535)
        return usageError(QStringLiteral("--port needs a number from 0 to 65535, not \"%1\"")
                              .arg(parser.value(portOption)));
    bool countOk = false;
    AlarmServerSim::AlarmServer::Options options;
    options.seedCount = parser.value(seedCountOption).toInt(&countOk);
    if (!countOk || options.seedCount < 0)
        return usageError(QStringLiteral("--seed-count needs a number of alarms, not \"%1\"")
                              .arg(parser.value(seedCountOption)));
    if (parser.isSet(dbOption) && parser.isSet(memoryOption))
        return usageError(QStringLiteral("--db and --memory exclude each other"));
    bool connectionsOk = false;
    const int maxConnections = parser.value(maxConnectionsOption).toInt(&connectionsOk);
    if (!connectionsOk || maxConnections < 1)
        return usageError(
            QStringLiteral("--max-connections needs a number of 1 or more, not \"%1\"")
                .arg(parser.value(maxConnectionsOption)));
    options.databasePath = parser.isSet(memoryOption) ? QStringLiteral(":memory:")
                           : parser.isSet(dbOption)
                               ? parser.value(dbOption)
                               : AlarmServerSim::AlarmServer::defaultDatabasePath();

    AlarmServerSim::AlarmServer server;
    QString error;
    if (!server.open(options, &error)) {
        std::fprintf(stderr, "cannot open %s: %s\n", qPrintable(options.databasePath),
                     qPrintable(error));
        return 1;
    }
    AlarmServerSim::TcpAlarmServer tcpServer(server);
    tcpServer.setMaxConnections(maxConnections);
    if (!tcpServer.listenOnLoopback(quint16(port))) {
        std::fprintf(stderr, "cannot listen on 127.0.0.1:%u: %s\n", port,
                     qPrintable(tcpServer.errorString()));
        return 1;
    }
    if (!quitOnSignals(app)) {
        std::perror("cannot install the signal handlers");
        return 1;
    }
    std::printf("listening on 127.0.0.1:%u\n", unsigned(tcpServer.serverPort()));
    std::fflush(stdout);
    return app.exec();
}
