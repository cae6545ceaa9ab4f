#include "ConsolePages.h"

#include <QFile>
#include <QHttpServer>
#include <QJsonDocument>
#include <QJsonObject>
#include <QRegularExpression>

#include <array>
#include <utility>

namespace {

using Header = std::pair<const char*, const char*>;

// Scripts only from this server's own files, so that text slipped into the page never runs.
constexpr std::array<Header, 4> kSecurityHeaders{{
    {"Content-Security-Policy",
     "default-src 'self'; script-src 'self'; style-src 'self'; img-src 'self' data:; "
     "connect-src 'self'; object-src 'none'; base-uri 'none'; form-action 'self'; "
     "frame-ancestors 'none'"},
    {"X-Content-Type-Options", "nosniff"},
    {"Referrer-Policy", "no-referrer"},
    {"X-Frame-Options", "DENY"},
}};

void setHeader(QHttpServerResponse& response, const QByteArray& name, const QByteArray& value)
{
#if QT_VERSION >= QT_VERSION_CHECK(6, 8, 0)
    QHttpHeaders headers = response.headers();
    headers.replaceOrAppend(name, value);
    response.setHeaders(std::move(headers));
#else
    response.setHeader(name, value);
#endif
}

QByteArray mimeTypeOf(const QString& name)
{
    if (name.endsWith(QLatin1String(".html")))
        return QByteArrayLiteral("text/html; charset=utf-8");
    if (name.endsWith(QLatin1String(".css")))
        return QByteArrayLiteral("text/css; charset=utf-8");
    return QByteArrayLiteral("text/javascript; charset=utf-8");
}

QHttpServerResponse consoleFile(const QString& name)
{
    // Plain file names only: the resources hold the console's files and nothing else.
    static const QRegularExpression plainName(QStringLiteral("^[a-z]+\\.(html|css|js)$"));
    QFile file(QStringLiteral(":/console/") + name);
    if (!plainName.match(name).hasMatch() || !file.open(QIODevice::ReadOnly)) {
        const QJsonObject body{{QStringLiteral("error"), QStringLiteral("not found")},
                               {QStringLiteral("path"), QStringLiteral("/console/") + name}};
        return QHttpServerResponse(QByteArrayLiteral("application/json"),
                                   QJsonDocument(body).toJson(QJsonDocument::Compact),
                                   QHttpServerResponse::StatusCode::NotFound);
    }
    QHttpServerResponse response(mimeTypeOf(name), file.readAll());
    // The files change with the server: the browser asks again on every load.
    setHeader(response, QByteArrayLiteral("Cache-Control"), QByteArrayLiteral("no-cache"));
    return response;
}

} // namespace

void ConsolePages::addSecurityHeaders(QHttpServerResponse& response)
{
    for (const Header& header : kSecurityHeaders)
        setHeader(response, header.first, header.second);
}

QByteArray ConsolePages::securityHeaderLines()
{
    QByteArray lines;
    for (const Header& header : kSecurityHeaders)
        lines += QByteArray(header.first) + ": " + header.second + "\r\n";
    return lines;
}

void ConsolePages::addRoutes(QHttpServer& http, QObject* context)
{
    http.route(QStringLiteral("/"), QHttpServerRequest::Method::Get,
               [] { return consoleFile(QStringLiteral("index.html")); });
    http.route(QStringLiteral("/console/<arg>"), QHttpServerRequest::Method::Get,
               [](const QString& name) { return consoleFile(name); });
#if QT_VERSION >= QT_VERSION_CHECK(6, 8, 0)
    http.addAfterRequestHandler(context,
                                [](const QHttpServerRequest&, QHttpServerResponse& response) {
                                    addSecurityHeaders(response);
                                });
#else
    Q_UNUSED(context);
    http.afterRequest([](QHttpServerResponse&& response) {
        addSecurityHeaders(response);
        return std::move(response);
    });
#endif
}
