#pragma once

#include <QString>

#include <functional>

// The host's client for the tunnel to the management server.
class IOrvoTunnelClient
{
public:
    // Reply to a request: exchange succeeded, a text plug-ins ignore, relay path, status text
    // (hexadecimal; bit 31 set means failure), reply XML, last-reply flag. May be called on any
    // thread and more than once per request.
    using ReplyCallback =
        std::function<void(bool ok, const QString& info, const QString& relayPath,
                           const QString& statusText, const QString& replyText, bool isLast)>;

    enum RequestKind : int {
        RequestNoReply = 2,   // fire and forget: no reply callback
        RequestWithReply = 4, // the reply callback is called with the server's answer
    };

    // One request. It lives only for the InsertRequest call: a client copies what it keeps.
    struct InsertRequestInfo
    {
        bool urgent = false;
        int timeoutMs = 15000;
        QString commandText;
        QString relayPath;
        ReplyCallback replyCallback;
    };

    virtual ~IOrvoTunnelClient() = default;

    // Queues a command for the server. Returns false when the request was refused; no reply
    // callback follows then.
    virtual bool InsertRequest(const QString& pluginId, void* clientID, int requestKind,
                               const QString& method, InsertRequestInfo& info) = 0;
};
