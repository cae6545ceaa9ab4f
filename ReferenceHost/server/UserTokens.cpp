#include "UserTokens.h"

#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

const QString UserTokens::kLocalUser = QStringLiteral("local");

namespace {

bool printable(const QString& text, bool asciiOnly)
{
    for (const QChar c : text) {
        if (c.category() == QChar::Other_Control || (asciiOnly && (c < u'!' || c > u'~')))
            return false;
    }
    return true;
}

} // namespace

bool UserTokens::load(const QString& fileName, QString* errorMessage)
{
    QFile file(fileName);
    if (!file.open(QIODevice::ReadOnly)) {
        *errorMessage = QStringLiteral("cannot read %1: %2").arg(fileName, file.errorString());
        return false;
    }
    if (file.size() > kMaxFileBytes) {
        *errorMessage =
            QStringLiteral("%1 is larger than %2 bytes").arg(fileName).arg(kMaxFileBytes);
        return false;
    }
    QJsonParseError parseError;
    const QJsonDocument document = QJsonDocument::fromJson(file.readAll(), &parseError);
    const QJsonValue users = document.object().value(QLatin1String("users"));
    if (parseError.error != QJsonParseError::NoError || !users.isArray()) {
        *errorMessage = QStringLiteral("%1: expected {\"users\": [{\"name\": ..., \"token\": "
                                       "...}]}")
                            .arg(fileName);
        return false;
    }
    const QJsonArray list = users.toArray();
    if (list.size() > kMaxUsers) {
        *errorMessage = QStringLiteral("%1: more than %2 users").arg(fileName).arg(kMaxUsers);
        return false;
    }
    m_users.clear();
    for (qsizetype i = 0; i < list.size(); ++i) {
        const QString name = list[i].toObject().value(QLatin1String("name")).toString();
        const QString token = list[i].toObject().value(QLatin1String("token")).toString();
        QString problem;
        if (name.isEmpty() || name.size() > 64 || !printable(name, false))
            problem = QStringLiteral("a name of 1 to 64 printable characters");
        else if (token.size() < 16 || token.size() > 256 || !printable(token, true))
            problem = QStringLiteral("a token of 16 to 256 printable ASCII characters");
        else if (m_users.contains(token))
            problem = QStringLiteral("a token no other user has");
        if (!problem.isEmpty()) {
            *errorMessage =
                QStringLiteral("%1: user %2 needs %3").arg(fileName).arg(i).arg(problem);
            m_users.clear();
            return false;
        }
        m_users.insert(token, name);
    }
    if (m_users.isEmpty()) {
        *errorMessage = QStringLiteral("%1 names no users").arg(fileName);
        return false;
    }
    return true;
}

QString UserTokens::userOf(const QString& token) const
{
    return m_users.value(token);
}

QString UserTokens::userOfAuthorization(const QByteArray& header) const
{
    static const QByteArray scheme("bearer ");
    if (header.size() <= scheme.size() || header.left(scheme.size()).toLower() != scheme)
        return QString();
    return userOf(QString::fromLatin1(header.mid(scheme.size()).trimmed()));
}
