#pragma once

#include <QList>
#include <QString>

// The routes of the network API, one per request method of the plug-in plus the API's own. The
// server registers exactly these, and the OpenAPI document describes exactly these; the tests
// hold the two against each other.
namespace ApiRoutes {

enum class Verb { Get, Post };

struct Route
{
    Verb verb;
    QString path;        // OpenAPI form: "/api/v1/alarms/{alarmId}/history"
    QString operationId; // as in the OpenAPI document
    QString method;      // the plug-in's request method; empty for the API's own routes
};

const QString kPrefix = QStringLiteral("/api/v1");
const QString kEventsPath = QStringLiteral("/api/v1/events");
const QString kOpenApiPath = QStringLiteral("/api/v1/openapi.json");

const QList<Route>& all();
QString verbName(Verb verb);
// The OpenAPI 3 document of the whole API (a resource of the program).
QByteArray openApiDocument();

} // namespace ApiRoutes
