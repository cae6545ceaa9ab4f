#pragma once

class QHttpServer;
class QObject;

// The operator console: its page at "/" and its style sheet and script modules at
// "/console/NAME", read from the resources compiled into the server. Every response of the
// server also gets the headers that keep a browser from running anything but those files: a
// Content-Security-Policy without inline scripts, no MIME sniffing, no referrer.
namespace ConsolePages {

void addRoutes(QHttpServer& http, QObject* context);

} // namespace ConsolePages
