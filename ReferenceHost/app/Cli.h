#pragma once

#include <HostSession.h>
#include <QueryArguments.h>
#include <ReferenceHost.h>
#include <RemoteSession.h>

#include <QCommandLineOption>
#include <QCommandLineParser>
#include <QMutex>
#include <QTimeZone>

#include <memory>

// The command-line client: global options, sub-command dispatch, the host it opens and the
// output channels the commands share.
class Cli
{
public:
    enum ExitCode { ExitOk = 0, ExitFailed = 1, ExitUsage = 2 };

    Cli();
    ~Cli();

    int run(const QStringList& arguments);

    // Adds the global options to a command's parser and parses the command's arguments. False
    // when the command is done already (--help, or a usage error); exitCode tells how.
    bool parseCommand(QCommandLineParser& parser, const QStringList& arguments, int* exitCode);
    // Opens the host as the global options say: the plug-in file, the server or database; or,
    // with --host, a session with a running `alarmsearch serve`.
    bool openHost(int* exitCode);
    bool openHost(const ReferenceHost::Options& options, int* exitCode);
    // Whether the command line leaves the server alone: no --server, --db, --memory or
    // --seed-count.
    bool embeddedServerDefault() const;
    ClientSession& session();
    // The host in this process (not with --host).
    ReferenceHost& host() { return *m_host; }
    // Whether --host (or $ALARMSEARCH_HOST) names a running server to talk to.
    bool isRemote() const { return !remoteHost().isEmpty(); }
    // Why requests fail for want of a connection to the server in this process; empty while
    // they can reach it, and with --host (where the answer's result code says it).
    QString connectionError() const;

    // Sends a request and waits for its answers; on timeout reports it and sets exitCode.
    bool call(const QString& method, const QVariant& args, QList<PluginAnswer>* answers,
              int* exitCode);

    // The plug-in file: --plugin, else the default place.
    QString pluginPath() const;
    int timeoutMs() const;
    bool pretty() const { return isSet(m_prettyOption); }
    bool keepXml() const { return isSet(m_xmlOption); }
    // The zone of times read without "Z" or an offset and of times shown: --tz, --local or UTC.
    QTimeZone timeZone() const { return m_timeZone; }

    void printOut(const QByteArray& bytes);
    void printAnswer(const QString& method, const PluginAnswer& answer);
    void printError(const QString& message);
    // A remark for the user on standard error.
    void printNote(const QString& message);
    int fail(const QString& message, int exitCode = ExitFailed);
    int usageError(const QString& message);
    // Why a request failed: a lost connection by name, else the method and its result code.
    QString answerError(const QString& method, const PluginAnswer& answer);

    // The search options; allText describes --all.
    static void addFilterOptions(QCommandLineParser& parser, const QString& allText);
    QueryFilter readFilter(const QCommandLineParser& parser) const;
    // Identifiers given as positional arguments and with --id.
    static QStringList alarmIds(const QCommandLineParser& parser);

private:
    // The program's usage: its commands and the global options.
    QString helpText() const;
    QList<QCommandLineOption> globalOptions() const;
    bool readTimeZone(int* exitCode);
    QString remoteHost() const;
    bool openRemote(int* exitCode);
    bool isSet(const QCommandLineOption& option) const;
    QString value(const QCommandLineOption& option) const;

    QCommandLineOption m_pluginOption;
    QCommandLineOption m_serverOption;
    QCommandLineOption m_dbOption;
    QCommandLineOption m_memoryOption;
    QCommandLineOption m_seedCountOption;
    QCommandLineOption m_prettyOption;
    QCommandLineOption m_xmlOption;
    QCommandLineOption m_timeoutOption;
    QCommandLineOption m_verboseOption;
    QCommandLineOption m_tzOption;
    QCommandLineOption m_localOption;
    QCommandLineOption m_hostOption;
    QCommandLineOption m_userOption;
    QCommandLineParser m_globalParser;
    const QCommandLineParser* m_commandParser = nullptr;
    QString m_command;
    QTimeZone m_timeZone = QTimeZone::utc();
    QMutex m_outputMutex;
    std::unique_ptr<ReferenceHost> m_host;
    std::unique_ptr<RemoteSession> m_remote;
};
