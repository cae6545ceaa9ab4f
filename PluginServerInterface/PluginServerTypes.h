#pragma once

#include <QString>
#include <QVariant>

#include <functional>

class PluginObjBase_EventSignalInfo;

// Answer to one client request: last-reply flag, result code ("0", "-1" or a server status
// text), a second text and the result. May be called on any thread.
using HDLR_DO_REQUEST_CB = std::function<void(bool isLast, const QString& resultCode,
                                              const QString& message, const QVariant& result)>;

// The host's event sink: called synchronously once per published record; the record lives only
// for the duration of the call.
using HDLR_EVENT_SIGNAL_CB = std::function<void(const PluginObjBase_EventSignalInfo* info)>;
