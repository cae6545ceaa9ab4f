#include "Commands.h"

namespace Commands {

const QList<Command>& all()
{
    static const QList<Command> commands{
        {QStringLiteral("query"), QStringLiteral("Search alarms"), query},
        {QStringLiteral("update"), QStringLiteral("Set the state and note of alarms"), update},
        {QStringLiteral("history"), QStringLiteral("Show the change history of an alarm"), history},
        {QStringLiteral("mute"), QStringLiteral("Mute alarms for a while"), mute},
        {QStringLiteral("unmute"), QStringLiteral("Unmute alarms"), unmute},
        {QStringLiteral("classes"),
         QStringLiteral("List the event classes and sub-events that --event takes"), classes},
        {QStringLiteral("events"), QStringLiteral("Print AlarmUpdated events as they happen"),
         events},
        {QStringLiteral("export"),
         QStringLiteral("Export found alarms with their history as CSV or JSON"), exportAlarms},
        {QStringLiteral("batch"), QStringLiteral("Answer JSON-line requests from standard input"),
         batch},
        {QStringLiteral("serve"),
         QStringLiteral("Serve the plug-in to many operators over HTTP and WebSocket"), serve},
        {QStringLiteral("demo"),
         QStringLiteral("Walk through every request against a fresh embedded server"), demo},
    };
    return commands;
}

} // namespace Commands
