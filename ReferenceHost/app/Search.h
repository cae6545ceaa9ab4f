#pragma once

#include <QString>
#include <QVariantList>
#include <QVariantMap>

class Cli;

// Runs a search for the query and export commands: one request, or with all set every time
// window until the matches are exhausted. Says on standard error when a single search came back
// full, since the server's limit may have cut it.
bool runSearch(Cli& cli, const QString& method, const QVariantMap& args, bool all,
               QVariantList* alarms, int* exitCode);
