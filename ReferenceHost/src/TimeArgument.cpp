#include "TimeArgument.h"

#include <QRegularExpression>
#include <QTimeZone>

namespace {

const QString kServerFormat = QStringLiteral("yyyy-MM-ddTHH:mm:ss");

qint64 secondsPerUnit(QChar unit)
{
    switch (unit.unicode()) {
    case 's':
        return 1;
    case 'm':
        return 60;
    case 'h':
        return 3600;
    case 'd':
        return 86400;
    case 'w':
        return 7 * 86400;
    }
    return 0;
}

} // namespace

QString TimeArgument::toServerTime(const QDateTime& time)
{
    return time.toUTC().toString(kServerFormat);
}

bool TimeArgument::parse(const QString& text, Bound bound, const QDateTime& now,
                         QString* serverTime, QString* errorMessage)
{
    const QString input = text.trimmed();
    if (input.compare(QLatin1String("now"), Qt::CaseInsensitive) == 0) {
        *serverTime = toServerTime(now);
        return true;
    }

    static const QRegularExpression age(QStringLiteral("^(\\d{1,6})([smhdw])$"));
    const QRegularExpressionMatch ageMatch = age.match(input);
    if (ageMatch.hasMatch()) {
        const qint64 seconds =
            ageMatch.captured(1).toLongLong() * secondsPerUnit(ageMatch.captured(2).at(0));
        *serverTime = toServerTime(now.addSecs(-seconds));
        return true;
    }

    QString withoutZone = input;
    if (withoutZone.endsWith(QLatin1Char('Z')))
        withoutZone.chop(1);
    QDateTime time = QDateTime::fromString(withoutZone, kServerFormat);
    if (!time.isValid()) {
        const QDate date = QDate::fromString(input, QStringLiteral("yyyy-MM-dd"));
        if (date.isValid())
            time = QDateTime(date, bound == Bound::Start ? QTime(0, 0, 0) : QTime(23, 59, 59));
    }
    if (!time.isValid()) {
        *errorMessage = QStringLiteral("bad time \"%1\": expected yyyy-MM-ddTHH:mm:ss, "
                                       "yyyy-MM-dd, now, or an age like 24h or 7d")
                            .arg(text);
        return false;
    }
    time.setTimeZone(QTimeZone::utc());
    *serverTime = toServerTime(time);
    return true;
}
