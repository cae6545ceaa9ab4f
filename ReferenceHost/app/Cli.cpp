#include "Cli.h"

#include "Commands.h"

#include <AnswerFormat.h>
#include <HostTunnelClient.h>
#include <PluginLoader.h>
#include <TimeArgument.h>

#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>

#include <cstdio>

namespace {

const int kDefaultTimeoutSeconds = 30;

// Any help option anywhere before a "--" asks for help and nothing else, whatever else the
// command line holds.
bool asksForHelp(const QStringList& arguments)
{
    static const QStringList helpOptions{QStringLiteral("-h"), QStringLiteral("--help"),
                                         QStringLiteral("-?"), QStringLiteral("--help-all")};
    for (const QString& argument : arguments.mid(1)) {
        if (argument == QLatin1String("--"))
            return false;
        if (helpOptions.contains(argument))
            return true;
    }
    return false;
}

} // namespace

Cli::Cli()
    : m_pluginOption(QStringLiteral("plugin"),
                     QStringLiteral("Plug-in file to load (default: $ALARMSEARCH_PLUGIN, else "
                                    "the installed plug-in, " ALARMSEARCH_PLUGIN_RELATIVE_DIR
                                    "/libPluginAlarmSearchSrv.so from this program's folder)."),
                     QStringLiteral("path")),
      m_serverOption(QStringLiteral("server"),
                     QStringLiteral("Talk to a running alarmsearch-sim over TCP instead of the "
                                    "embedded server."),
                     QStringLiteral("host:port")),
      m_dbOption(QStringLiteral("db"),
                 QStringLiteral("Database of the embedded server (default: the per-user one)."),
                 QStringLiteral("path")),
      m_memoryOption(QStringLiteral("memory"),
                     QStringLiteral("Embedded server with a fresh in-memory database.")),
      m_seedCountOption(QStringLiteral("seed-count"),
                        QStringLiteral("Demo alarms seeded into a new embedded database."),
                        QStringLiteral("n")),
      m_prettyOption(QStringLiteral("pretty"), QStringLiteral("Indent JSON output.")),
      m_xmlOption(QStringLiteral("xml"),
                  QStringLiteral("Keep the raw XML text that comes with each alarm.")),
      m_timeoutOption(
          QStringLiteral("timeout"),
          QStringLiteral("Seconds to wait for an answer (default %1).").arg(kDefaultTimeoutSeconds),
          QStringLiteral("seconds")),
      m_verboseOption(QStringLiteral("verbose"),
                      QStringLiteral("Let the plug-in's trace lines through to standard error.")),
      m_tzOption(QStringLiteral("tz"),
                 QStringLiteral("Time zone of times given without Z or an offset, and of times "
                                "shown in tables and CSV: an IANA name such as Europe/Berlin, UTC "
                                "or an offset such as +02:00 (default UTC)."),
                 QStringLiteral("zone")),
      m_localOption(QStringLiteral("local"),
                    QStringLiteral("Use this machine's time zone, as --tz does.")),
      m_hostOption(QStringLiteral("host"),
                   QStringLiteral("Talk to a running 'alarmsearch serve' at this URL instead of "
                                  "loading the plug-in (default: $ALARMSEARCH_HOST); its token "
                                  "comes from $ALARMSEARCH_TOKEN."),
                   QStringLiteral("url")),
      m_userOption(QStringLiteral("user"),
                   QStringLiteral("Operator recorded in the history of the changes made (default "
                                  "\"%1\"; with --host the token's user).")
                       .arg(AlarmServerSim::AlarmServer::kDefaultOperator),
                   QStringLiteral("name"))
{
}

QList<QCommandLineOption> Cli::globalOptions() const
{
    return {m_pluginOption, m_serverOption, m_dbOption,      m_memoryOption,  m_seedCountOption,
            m_prettyOption, m_xmlOption,    m_timeoutOption, m_verboseOption, m_tzOption,
            m_localOption,  m_hostOption,   m_userOption};
}

Cli::~Cli() = default;

QString Cli::helpText() const
{
    QString help = QStringLiteral(
        "Usage: alarmsearch [global options] <command> [options]\n"
        "\n"
        "Searches and handles alarms through the alarm-search plug-in, loaded into a reference\n"
        "host. By default the host runs its own alarm server on a per-user database.\n"
        "\n"
        "Commands:\n");
    for (const Commands::Command& command : Commands::all())
        help += QStringLiteral("  %1%2\n").arg(command.name.leftJustified(10), command.summary);
    help += QStringLiteral("\nGlobal options (also accepted after the command):\n");
    QCommandLineParser parser;
    parser.addOptions(globalOptions());
    parser.addHelpOption();
    parser.addVersionOption();
    const QString options = parser.helpText();
    help += options.mid(options.indexOf(QLatin1String("\n  ")) + 1);
    help += QStringLiteral("\nRun 'alarmsearch <command> --help' for a command's options.\n");
    return help;
}

int Cli::run(const QStringList& arguments)
{
    m_globalParser.addOptions(globalOptions());
    m_globalParser.addHelpOption();
    const QCommandLineOption versionOption = m_globalParser.addVersionOption();
    m_globalParser.setOptionsAfterPositionalArgumentsMode(
        QCommandLineParser::ParseAsPositionalArguments);
    const bool help = asksForHelp(arguments);
    const bool parsed = m_globalParser.parse(arguments);
    QStringList positional = m_globalParser.positionalArguments();
    if (help && parsed && !positional.isEmpty()) {
        for (const Commands::Command& command : Commands::all()) {
            if (command.name == positional.constFirst()) {
                m_command = command.name;
                // The command's parser shows its help; nothing runs.
                return command.run(*this,
                                   QStringList{arguments.value(0), QStringLiteral("--help")});
            }
        }
    }
    if (help) {
        printOut(helpText().toUtf8());
        return ExitOk;
    }
    if (!parsed)
        return usageError(m_globalParser.errorText());
    if (m_globalParser.isSet(versionOption)) {
        printOut(
            QStringLiteral("%1 %2\n")
                .arg(QCoreApplication::applicationName(), QCoreApplication::applicationVersion())
                .toUtf8());
        return ExitOk;
    }
    if (positional.isEmpty()) {
        std::fputs(qPrintable(helpText()), stderr);
        return ExitUsage;
    }
    m_command = positional.takeFirst();
    for (const Commands::Command& command : Commands::all()) {
        if (command.name == m_command)
            return command.run(*this, QStringList{arguments.value(0)} + positional);
    }
    return usageError(
        QStringLiteral("unknown command \"%1\"; see 'alarmsearch --help'").arg(m_command));
}

bool Cli::parseCommand(QCommandLineParser& parser, const QStringList& arguments, int* exitCode)
{
    parser.addOptions(globalOptions());
    parser.addHelpOption();
    if (asksForHelp(arguments)) {
        QString help = parser.helpText();
        help.replace(QCoreApplication::arguments().value(0),
                     QStringLiteral("alarmsearch ") + m_command);
        printOut(help.toUtf8());
        *exitCode = ExitOk;
        return false;
    }
    if (!parser.parse(arguments)) {
        *exitCode = usageError(parser.errorText());
        return false;
    }
    m_commandParser = &parser;
    return readTimeZone(exitCode);
}

bool Cli::readTimeZone(int* exitCode)
{
    if (isSet(m_tzOption) && isSet(m_localOption)) {
        *exitCode = usageError(QStringLiteral("--tz and --local exclude each other"));
        return false;
    }
    if (isSet(m_localOption))
        m_timeZone = QTimeZone::systemTimeZone();
    if (isSet(m_tzOption)) {
        m_timeZone = TimeArgument::zoneNamed(value(m_tzOption));
        if (!m_timeZone.isValid()) {
            *exitCode = usageError(QStringLiteral("unknown time zone \"%1\" (expected a name such "
                                                  "as Europe/Berlin, UTC, or an offset such as "
                                                  "+02:00)")
                                       .arg(value(m_tzOption)));
            return false;
        }
    }
    return true;
}

bool Cli::isSet(const QCommandLineOption& option) const
{
    return (m_commandParser && m_commandParser->isSet(option)) || m_globalParser.isSet(option);
}

QString Cli::value(const QCommandLineOption& option) const
{
    if (m_commandParser && m_commandParser->isSet(option))
        return m_commandParser->value(option);
    return m_globalParser.value(option);
}

QString Cli::pluginPath() const
{
    return isSet(m_pluginOption) ? value(m_pluginOption) : PluginLoader::defaultPluginPath();
}

int Cli::timeoutMs() const
{
    const int seconds = value(m_timeoutOption).toInt();
    return (seconds > 0 ? seconds : kDefaultTimeoutSeconds) * 1000;
}

bool Cli::embeddedServerDefault() const
{
    return !isSet(m_serverOption) && !isSet(m_dbOption) && !isSet(m_memoryOption) &&
           !isSet(m_seedCountOption);
}

QString Cli::remoteHost() const
{
    return isSet(m_hostOption) ? value(m_hostOption) : qEnvironmentVariable("ALARMSEARCH_HOST");
}

ClientSession& Cli::session()
{
    if (m_remote)
        return *m_remote;
    return m_host->session();
}

bool Cli::openRemote(int* exitCode)
{
    for (const QCommandLineOption* local : {&m_pluginOption, &m_serverOption, &m_dbOption,
                                            &m_memoryOption, &m_seedCountOption, &m_userOption}) {
        if (isSet(*local)) {
            *exitCode = usageError(QStringLiteral("--%1 is for a host in this process; with "
                                                  "--host the server decides it")
                                       .arg(local->names().constFirst()));
            return false;
        }
    }
    const QUrl url(remoteHost(), QUrl::StrictMode);
    if (!url.isValid() || url.scheme() != QLatin1String("http") || url.host().isEmpty()) {
        *exitCode =
            usageError(QStringLiteral("--host needs a URL like http://127.0.0.1:47880, not \"%1\"")
                           .arg(remoteHost()));
        return false;
    }
    m_remote =
        std::make_unique<RemoteSession>(url, qEnvironmentVariable("ALARMSEARCH_TOKEN"), keepXml());
    QString error;
    if (!m_remote->connectToServer(timeoutMs(), &error)) {
        m_remote.reset();
        *exitCode = fail(error);
        return false;
    }
    return true;
}

bool Cli::openHost(int* exitCode)
{
    if (isRemote())
        return openRemote(exitCode);
    ReferenceHost::Options options;
    options.pluginPath = pluginPath();
    options.serverAddress = value(m_serverOption);
    if (isSet(m_timeoutOption) && value(m_timeoutOption).toInt() <= 0) {
        *exitCode = usageError(QStringLiteral("--timeout needs a positive number of seconds"));
        return false;
    }
    if (isSet(m_memoryOption) && isSet(m_dbOption)) {
        *exitCode = usageError(QStringLiteral("--memory and --db exclude each other"));
        return false;
    }
    if (isSet(m_serverOption) && (isSet(m_memoryOption) || isSet(m_dbOption))) {
        *exitCode = usageError(QStringLiteral("--server talks to a running server; "
                                              "--db and --memory are for the embedded one"));
        return false;
    }
    bool seeds = false;
    if (isSet(m_memoryOption)) {
        options.embedded.databasePath = QStringLiteral(":memory:");
    } else {
        options.embedded.databasePath = isSet(m_dbOption)
                                            ? value(m_dbOption)
                                            : AlarmServerSim::AlarmServer::defaultDatabasePath();
        QDir().mkpath(QFileInfo(options.embedded.databasePath).absolutePath());
        seeds = !QFileInfo::exists(options.embedded.databasePath);
    }
    if (isSet(m_seedCountOption)) {
        bool ok = false;
        options.embedded.seedCount = value(m_seedCountOption).toInt(&ok);
        if (!ok || options.embedded.seedCount < 0) {
            *exitCode = usageError(QStringLiteral("--seed-count needs a number of alarms"));
            return false;
        }
    }
    if (!openHost(options, exitCode))
        return false;
    if (seeds && options.serverAddress.isEmpty())
        printNote(QStringLiteral("created the database %1 with %2 demo alarms")
                      .arg(options.embedded.databasePath)
                      .arg(options.embedded.seedCount));
    return true;
}

bool Cli::openHost(const ReferenceHost::Options& hostOptions, int* exitCode)
{
    if (isRemote()) {
        *exitCode =
            usageError(QStringLiteral("%1 runs its own host; it takes no --host").arg(m_command));
        return false;
    }
    ReferenceHost::Options options = hostOptions;
    if (isSet(m_userOption)) {
        options.operatorName = value(m_userOption).trimmed();
        if (options.operatorName.isEmpty() ||
            options.operatorName.size() > AlarmServerSim::AlarmServer::kMaxOperatorName) {
            *exitCode = usageError(QStringLiteral("--user needs a name of 1 to %1 characters")
                                       .arg(AlarmServerSim::AlarmServer::kMaxOperatorName));
            return false;
        }
    }
    // The trace library reads its settings when the plug-in loads it.
    if (!isSet(m_verboseOption) && !qEnvironmentVariableIsSet("ZOLTLOG_FILE"))
        qputenv("ZOLTLOG_LEVEL", "0");
    m_host = std::make_unique<ReferenceHost>();
    QString error;
    if (!m_host->open(options, &error)) {
        m_host.reset();
        *exitCode = fail(error);
        return false;
    }
    return true;
}

bool Cli::call(const QString& method, const QVariant& args, QList<PluginAnswer>* answers,
               int* exitCode)
{
    QString error;
    if (session().call(method, args, timeoutMs(), answers, &error))
        return true;
    *exitCode = fail(error);
    return false;
}

QString Cli::connectionError() const
{
    return m_host ? m_host->tunnelClient().connectionError() : QString();
}

QString Cli::answerError(const QString& method, const PluginAnswer& answer)
{
    QString lost = connectionError();
    if (!lost.isEmpty())
        return lost;
    if (answer.resultCode.isEmpty())
        return QStringLiteral("%1 failed without a result code").arg(method);
    return QStringLiteral("%1 failed with result code %2").arg(method, answer.resultCode);
}

void Cli::printOut(const QByteArray& bytes)
{
    QMutexLocker locker(&m_outputMutex);
    std::fwrite(bytes.constData(), 1, size_t(bytes.size()), stdout);
    std::fflush(stdout);
}

void Cli::printAnswer(const QString& method, const PluginAnswer& answer)
{
    printOut(
        AnswerFormat::jsonLine(AnswerFormat::answerObject(method, answer, keepXml()), pretty()));
}

void Cli::printError(const QString& message)
{
    QMutexLocker locker(&m_outputMutex);
    std::fprintf(stderr, "alarmsearch: %s\n", qPrintable(message.simplified()));
    std::fflush(stderr);
}

void Cli::printNote(const QString& message)
{
    QMutexLocker locker(&m_outputMutex);
    std::fprintf(stderr, "%s\n", qPrintable(message));
    std::fflush(stderr);
}

int Cli::fail(const QString& message, int exitCode)
{
    printError(message);
    return exitCode;
}

int Cli::usageError(const QString& message)
{
    return fail(message, ExitUsage);
}

void Cli::addFilterOptions(QCommandLineParser& parser, const QString& allText)
{
    parser.addOptions({
        {QStringLiteral("unhandled"),
         QStringLiteral("Only unhandled alarms (method QryUnhandledAlarm).")},
        {QStringLiteral("event"),
         QStringLiteral("Trigger event, e.g. CamEvent:Motion or StationConn, in any letter case "
                        "('alarmsearch classes' lists them); repeatable."),
         QStringLiteral("class[:subevent]")},
        {QStringLiteral("events"),
         QStringLiteral("All trigger events of a group: camera, system or external; repeatable."),
         QStringLiteral("group")},
        {QStringLiteral("state"),
         QStringLiteral("Alarm state: %1; repeatable.").arg(QueryArguments::stateChoices()),
         QStringLiteral("state")},
        {QStringLiteral("from"),
         QStringLiteral("Oldest alarm time: ISO 8601 (2026-11-20T08:15:30Z, an offset such as "
                        "+01:00), \"2026-11-20 08:15[:30]\" (in the --tz zone), a date, now, or "
                        "an age such as 30m, 24h, 7d or 2w."),
         QStringLiteral("time")},
        {QStringLiteral("to"), QStringLiteral("Newest alarm time, in the same forms as --from."),
         QStringLiteral("time")},
        {QStringLiteral("name"), QStringLiteral("Alarm name; repeatable."), QStringLiteral("name")},
        {QStringLiteral("device"), QStringLiteral("Trigger device name; repeatable."),
         QStringLiteral("name")},
        {QStringLiteral("all"), allText},
    });
}

QueryFilter Cli::readFilter(const QCommandLineParser& parser) const
{
    QueryFilter filter;
    filter.zone = m_timeZone;
    filter.unhandledOnly = parser.isSet(QStringLiteral("unhandled"));
    filter.events = parser.values(QStringLiteral("event"));
    filter.eventGroups = parser.values(QStringLiteral("events"));
    filter.states = parser.values(QStringLiteral("state"));
    filter.from = parser.value(QStringLiteral("from"));
    filter.to = parser.value(QStringLiteral("to"));
    filter.names = parser.values(QStringLiteral("name"));
    filter.devices = parser.values(QStringLiteral("device"));
    return filter;
}

QStringList Cli::alarmIds(const QCommandLineParser& parser)
{
    return parser.positionalArguments() + parser.values(QStringLiteral("id"));
}
