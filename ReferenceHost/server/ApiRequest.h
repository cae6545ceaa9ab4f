#pragma once

#include <QueryArguments.h>

#include <QByteArray>
#include <QDateTime>
#include <QJsonObject>
#include <QString>
#include <QStringList>

// Reads the JSON bodies of the network API into what the plug-in's requests take, checking
// every field: unknown fields, wrong types, values out of range and bad times are refused with
// the field's name (e.g. "states[1]") and the problem.
namespace ApiRequest {

constexpr qsizetype kMaxBodyBytes = 64 * 1024;
constexpr int kMaxIds = 1000;
constexpr int kMaxIdLength = 64;
constexpr int kMaxNoteLength = 4096;
constexpr int kMaxListItems = 1000;
constexpr int kMaxTextLength = 256;
constexpr int kMaxMuteSeconds = 365 * 86400;

struct FieldError
{
    QString field;
    QString problem;
};

struct Search
{
    QString method;   // QryAlarmList or QryUnhandledAlarm
    QVariantMap args; // the request's argument map
    QJsonObject body; // the body as asked, to derive the next page's from
    QStringList exclude;
    bool keepXml = false;
};

struct Update
{
    QStringList ids;
    QString state;
    QString note;
};

struct Mute
{
    QStringList ids;
    int seconds = 0;
};

// The body as a JSON object; an empty body is an empty object.
bool object(const QByteArray& body, QJsonObject* object, FieldError* error);
bool search(const QJsonObject& body, bool unhandledOnly, const QDateTime& now, Search* search,
            FieldError* error);
bool update(const QJsonObject& body, Update* update, FieldError* error);
bool mute(const QJsonObject& body, bool isMute, Mute* mute, FieldError* error);
bool alarmId(const QString& id, FieldError* error);

} // namespace ApiRequest
