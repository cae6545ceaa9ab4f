#pragma once

#include <QString>
#include <QStringList>

#include <functional>

class Cli;

// The sub-commands of the command-line client.
namespace Commands {

// Runs one sub-command with its arguments (the command name first); returns the exit code.
using Runner = std::function<int(Cli& cli, const QStringList& arguments)>;

struct Command
{
    QString name;
    QString summary;
    Runner run;
};

const QList<Command>& all();

int query(Cli& cli, const QStringList& arguments);
int exportAlarms(Cli& cli, const QStringList& arguments);
int update(Cli& cli, const QStringList& arguments);
int history(Cli& cli, const QStringList& arguments);
int mute(Cli& cli, const QStringList& arguments);
int unmute(Cli& cli, const QStringList& arguments);
int events(Cli& cli, const QStringList& arguments);
int batch(Cli& cli, const QStringList& arguments);
int demo(Cli& cli, const QStringList& arguments);
int classes(Cli& cli, const QStringList& arguments);
int serve(Cli& cli, const QStringList& arguments);

} // namespace Commands
