#pragma once

#include <QDateTime>
#include <QJsonObject>
#include <QString>
#include <QTimeZone>
#include <QVariantMap>

// One request line of `alarmsearch batch`, checked against the schema of its method: every key
// must be known and of its type, and friendly forms (state names, event names, times in the
// command line's forms) become what the plug-in reads. The schema is in the README.
struct BatchRequest
{
    QString method;
    QVariantMap args;
    bool all = false; // searches: walk every time window, as query --all

    // False with a one-line message naming the offending key.
    static bool read(const QJsonObject& line, const QDateTime& now, const QTimeZone& zone,
                     BatchRequest* request, QString* errorMessage);
    static const QStringList& methods();
};
