#pragma once

#include <AlarmPager.h>

#include <QString>
#include <QVariantMap>

class Cli;

// Runs a search for the query and export commands, handing each page of alarms to sink as it
// arrives: one request, or with all set every time window until the matches are exhausted.
// *truncated tells whether matches may be missing: a single search that came back full (the
// server's limit may have cut it), or a walk that met more alarms in one second than a search
// returns. Either is also said on standard error.
bool runSearch(Cli& cli, const QString& method, const QVariantMap& args, bool all,
               const AlarmPager::PageSink& sink, bool* truncated, int* exitCode);
