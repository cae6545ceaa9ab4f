#pragma once

#include <QString>
#include <QtGlobal>

// Who sent a request. Plug-ins pass clientHandle through to the tunnel client unchanged.
struct RequestSenderInfo
{
    Qt::HANDLE clientHandle = nullptr;
    QString clientName;
};
