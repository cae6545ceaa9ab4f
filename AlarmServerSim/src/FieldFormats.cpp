#include "FieldFormats.h"

#include <QDateTime>
#include <QRegularExpression>
#include <QSqlQuery>
#include <QTimeZone>

namespace AlarmServerSim {

QString formatAlarmId(qint64 number)
{
    return QStringLiteral("A%1").arg(number, 7, 10, QLatin1Char('0'));
}

std::optional<qint64> parseAlarmId(const QString& id)
{
    static const QRegularExpression pattern(QStringLiteral("^A(\\d{7})$"));
    const QRegularExpressionMatch match = pattern.match(id);
    if (!match.hasMatch())
        return std::nullopt;
    return match.captured(1).toLongLong();
}

QString formatTime(qint64 secondsSinceEpoch)
{
    return QDateTime::fromSecsSinceEpoch(secondsSinceEpoch, QTimeZone::utc())
        .toString(QStringLiteral("yyyy-MM-ddTHH:mm:ss'Z'"));
}

std::optional<qint64> parseTime(const QString& text, int offsetSeconds)
{
    QString local = text;
    if (local.endsWith(QLatin1Char('Z')))
        local.chop(1);
    // Date and time are read apart so that no local-time rule can shift them.
    const QDate date = QDate::fromString(local.left(10), QStringLiteral("yyyy-MM-dd"));
    const QTime time = QTime::fromString(local.mid(10), QStringLiteral("'T'HH:mm:ss"));
    if (!date.isValid() || !time.isValid())
        return std::nullopt;
    return QDateTime(date, time, QTimeZone(offsetSeconds)).toSecsSinceEpoch();
}

bool execWith(QSqlQuery& query, const QVariantList& values)
{
    for (int i = 0; i < values.size(); ++i) {
        const QVariant& value = values.at(i);
        // Qt binds a null QString as SQL NULL; texts are stored as '' when empty.
        const bool nullText = value.typeId() == QMetaType::QString && value.toString().isNull();
        query.bindValue(i, nullText ? QVariant(QLatin1String("")) : value);
    }
    return query.exec();
}

} // namespace AlarmServerSim
