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
    const QDateTime time = QDateTime::fromSecsSinceEpoch(secondsSinceEpoch, QTimeZone::utc());
    const QDate date = time.date();
    const QTime clock = time.time();
    if (!time.isValid() || date.year() < 1 || date.year() > 9999)
        return time.toString(QStringLiteral("yyyy-MM-ddTHH:mm:ss'Z'"));
    // Written digit by digit: an export formats a few times per alarm, and a format string is
    // read anew on each use.
    char text[] = "0000-00-00T00:00:00Z";
    const auto put = [&text](int at, int value, int digits) {
        for (int i = digits - 1; i >= 0; --i, value /= 10)
            text[at + i] = char('0' + value % 10);
    };
    put(0, date.year(), 4);
    put(5, date.month(), 2);
    put(8, date.day(), 2);
    put(11, clock.hour(), 2);
    put(14, clock.minute(), 2);
    put(17, clock.second(), 2);
    return QString::fromLatin1(text, sizeof(text) - 1);
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
