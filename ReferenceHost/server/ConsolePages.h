#pragma once

#include <QByteArray>

class QHttpServer;
class QHttpServerResponse;
class QObject;

// The operator console: its page at "/" and its style sheet and script modules at
// "/console/NAME", read from the resources compiled into the server. Every response of the
// server also gets the headers that keep a browser from running anything but those files: a
// Content-Security-Policy without inline scripts, no MIME sniffing, no referrer.
namespace ConsolePages {

void addRoutes(QHttpServer& http, QObject* context);
// For responses written past the routes (the missing handler's).
void addSecurityHeaders(QHttpServerResponse& response);
// The same headers as lines of a response written by hand, each ending in CR LF.
QByteArray securityHeaderLines();

} // namespace ConsolePages
