#include "TimeArgument.h"

#include <QRegularExpression>

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

// "Z", "+01:00", "-0530" or "+01"; invalid for anything else.
QTimeZone offsetZone(const QString& text)
{
    if (text.compare(QLatin1String("Z"), Qt::CaseInsensitive) == 0)
        return QTimeZone::utc();
    static const QRegularExpression offset(QStringLiteral("^([+-])(\\d{2}):?(\\d{2})?$"));
    const QRegularExpressionMatch match = offset.match(text);
    if (!match.hasMatch())
        return QTimeZone();
    const int hours = match.captured(2).toInt();
    const int minutes = match.captured(3).toInt();
    if (hours > 14 || minutes > 59)
        return QTimeZone();
    const int seconds = (hours * 3600 + minutes * 60) * (match.captured(1) == u"-" ? -1 : 1);
    return QTimeZone(seconds);
}

} // namespace

QString TimeArgument::acceptedForms()
{
    return QStringLiteral("expected ISO 8601 (2026-11-20T08:15:30Z, with an offset such as "
                          "+01:00, fractional seconds allowed), \"2026-11-20 08:15[:30]\", a date "
                          "2026-11-20, now, or an age such as 30m, 24h, 7d or 2w");
}

QString TimeArgument::toServerTime(const QDateTime& time)
{
    return time.toUTC().toString(kServerFormat);
}

QString TimeArgument::display(const QString& serverTime, const QTimeZone& zone)
{
    if (!zone.isValid() || zone == QTimeZone::utc())
        return serverTime;
    const QDateTime time = QDateTime::fromString(serverTime, Qt::ISODate);
    if (!time.isValid())
        return serverTime;
    return time.toTimeZone(zone).toString(Qt::ISODate);
}

QTimeZone TimeArgument::zoneNamed(const QString& name)
{
    const QString trimmed = name.trimmed();
    if (trimmed.compare(QLatin1String("UTC"), Qt::CaseInsensitive) == 0)
        return QTimeZone::utc();
    const QTimeZone offset = offsetZone(trimmed);
    if (offset.isValid())
        return offset;
    return QTimeZone(trimmed.toUtf8());
}

bool TimeArgument::parse(const QString& text, Bound bound, const QDateTime& now,
                         const QTimeZone& zone, QString* serverTime, QString* errorMessage)
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

    static const QRegularExpression form(QStringLiteral(
        "^(\\d{4}-\\d{2}-\\d{2})(?:[Tt ](\\d{2}):(\\d{2})(?::(\\d{2})(?:[.,]\\d{1,9})?)?"
        "\\s*([Zz]|[+-]\\d{2}(?::?\\d{2})?)?)?$"));
    const QRegularExpressionMatch match = form.match(input);
    const QDate date = QDate::fromString(match.captured(1), QStringLiteral("yyyy-MM-dd"));
    QTimeZone timeZone = zone;
    if (match.hasMatch() && !match.captured(5).isEmpty())
        timeZone = offsetZone(match.captured(5));
    QTime time;
    if (match.captured(2).isEmpty()) {
        time = bound == Bound::Start ? QTime(0, 0, 0) : QTime(23, 59, 59);
    } else {
        const bool withSeconds = !match.captured(4).isEmpty();
        time = QTime(match.captured(2).toInt(), match.captured(3).toInt(),
                     withSeconds ? match.captured(4).toInt() : (bound == Bound::End ? 59 : 0));
    }
    const QDateTime dateTime(date, time, timeZone);
    if (!match.hasMatch() || !date.isValid() || !time.isValid() || !timeZone.isValid() ||
        !dateTime.isValid()) {
        *errorMessage = QStringLiteral("bad time \"%1\": %2").arg(text, acceptedForms());
        return false;
    }
    *serverTime = toServerTime(dateTime);
    return true;
}
