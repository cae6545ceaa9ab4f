#pragma once

#include <QHash>
#include <QString>

// The operators of a server and their bearer tokens, read from a users file:
//   {"users": [{"name": "alice", "token": "at least 16 characters"}, ...]}
// Names are 1 to 64 printable characters; tokens 16 to 256 printable ASCII characters, each used
// once. Without a file (empty()), the server knows one operator, "local".
class UserTokens
{
public:
    static constexpr qint64 kMaxFileBytes = 1024 * 1024;
    static constexpr int kMaxUsers = 10000;
    static const QString kLocalUser;

    bool load(const QString& fileName, QString* errorMessage);
    bool isEmpty() const { return m_users.isEmpty(); }
    // The operator with this token; empty when none has it.
    QString userOf(const QString& token) const;
    // The operator of an "Authorization" header value ("Bearer TOKEN").
    QString userOfAuthorization(const QByteArray& header) const;

private:
    QHash<QString, QString> m_users; // name by token
};
