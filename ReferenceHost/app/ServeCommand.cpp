#include "Cli.h"
#include "Commands.h"

#include <ApiServer.h>

#include <QCoreApplication>
#include <QTimer>

#include <csignal>

#include <sys/resource.h>

namespace {

volatile std::sig_atomic_t g_stopRequested = 0;

extern "C" void onStopSignal(int)
{
    g_stopRequested = 1;
}

// Every client holds a socket, and a WebSocket subscriber stays: the soft limit of open files
// (often 1024) is raised to the hard one.
void raiseOpenFileLimit()
{
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < limit.rlim_max) {
        limit.rlim_cur = limit.rlim_max;
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

bool readListen(const QString& text, ApiServer::Options* options)
{
    const qsizetype colon = text.lastIndexOf(QLatin1Char(':'));
    bool portOk = false;
    const uint port = text.mid(colon + 1).toUInt(&portOk);
    QString host = text.left(colon);
    if (host.startsWith(QLatin1Char('[')) && host.endsWith(QLatin1Char(']')))
        host = host.mid(1, host.size() - 2);
    const QHostAddress address(host);
    if (colon <= 0 || !portOk || port > 65535 || address.isNull())
        return false;
    options->address = address;
    options->port = quint16(port);
    return true;
}

} // namespace

namespace Commands {

int serve(Cli& cli, const QStringList& arguments)
{
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Runs the host as a server: loads the plug-in once and serves the JSON API under "
        "/api/v1 and the AlarmUpdated events on the WebSocket /api/v1/events to many operators. "
        "Prints the URL it listens on; stops on Ctrl-C or SIGTERM."));
    parser.addOptions({
        {QStringLiteral("listen"),
         QStringLiteral("Address and port to listen on (default 127.0.0.1:47880; port 0 picks "
                        "a free one)."),
         QStringLiteral("address:port"), QStringLiteral("127.0.0.1:47880")},
        {QStringLiteral("users"),
         QStringLiteral("Users file: {\"users\": [{\"name\": ..., \"token\": ...}]}. Needed to "
                        "listen on an address other than loopback; without it every request is "
                        "the operator \"local\"."),
         QStringLiteral("file")},
        {QStringLiteral("allow-origin"),
         QStringLiteral("A browser origin allowed on the event WebSocket besides the server's "
                        "own, e.g. http://console.example:8080; repeatable."),
         QStringLiteral("origin")},
    });
    int exitCode = Cli::ExitOk;
    if (!cli.parseCommand(parser, arguments, &exitCode))
        return exitCode;
    if (!parser.positionalArguments().isEmpty())
        return cli.usageError(QStringLiteral("serve takes no arguments, only options"));
    ApiServer::Options options;
    if (!readListen(parser.value(QStringLiteral("listen")), &options))
        return cli.usageError(QStringLiteral("--listen needs ADDRESS:PORT, e.g. 127.0.0.1:47880"));
    options.usersFile = parser.value(QStringLiteral("users"));
    options.allowedOrigins = parser.values(QStringLiteral("allow-origin"));
    options.timeoutMs = cli.timeoutMs();
    if (cli.isRemote())
        return cli.usageError(QStringLiteral("serve is the server; it takes no --host"));
    QString error;
    if (!ApiServer::checkAddress(options, &error))
        return cli.fail(error);
    raiseOpenFileLimit();
    if (!cli.openHost(&exitCode))
        return exitCode;

    ApiServer server(cli.host());
    if (!server.listen(options, &error))
        return cli.fail(error);
    cli.printOut(QStringLiteral("listening on %1\n").arg(server.url().toString()).toUtf8());

    std::signal(SIGINT, onStopSignal);
    std::signal(SIGTERM, onStopSignal);
    QTimer watch;
    QObject::connect(&watch, &QTimer::timeout, [] {
        if (g_stopRequested)
            QCoreApplication::quit();
    });
    watch.start(100);
    QCoreApplication::exec();
    server.stop();
    cli.printNote(QStringLiteral("stopped"));
    return Cli::ExitOk;
}

} // namespace Commands
