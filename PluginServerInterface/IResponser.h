#pragma once

#include <QString>
#include <QVariant>

// Answer channel of the host's blocking calls.
class IResponser
{
public:
    virtual ~IResponser() = default;
    virtual void Respond(bool isLast, const QString& resultCode, const QString& message,
                         const QVariant& result) = 0;
};
