#pragma once

#include <QDateTime>
#include <QString>
#include <QStringList>
#include <QTimeZone>
#include <QVariantMap>

// What a user asks for in an alarm search, in command-line terms.
struct QueryFilter
{
    bool unhandledOnly = false;
    QStringList events;      // "CLASS" or "CLASS:SUBEVENT"
    QStringList eventGroups; // "camera", "system", "external"
    QStringList states;
    QString from;
    QString to;
    QStringList names;
    QStringList devices;
    QTimeZone zone = QTimeZone::utc(); // of times given without "Z" or an offset
};

// Turns command-line search terms into the argument map of the search requests.
class QueryArguments
{
public:
    // The alarm states for a help text: "Unhandled, Processing, Handled or FalseAlarm".
    static QString stateChoices();

    // The request method the filter calls for: unhandled-only searches use "QryUnhandledAlarm".
    static QString method(const QueryFilter& filter);
    static bool build(const QueryFilter& filter, const QDateTime& now, QVariantMap* args,
                      QString* errorMessage);
    // The search terms an argument map of build() was made from, for a client that hands the
    // terms to a server which builds the map itself. Fails on filter texts that build() cannot
    // have written.
    static bool filterOf(const QVariantMap& args, QueryFilter* filter, QString* errorMessage);
    // A state as the server spells it, from any letter case, with or without "-" or "_".
    static bool canonicalState(const QString& text, QString* state, QString* errorMessage);
    // The state filter element for states already in the server's spelling.
    static QString stateFilter(const QStringList& states);
};
