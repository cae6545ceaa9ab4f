#pragma once

// The management server's own names: the fields of an alarm and of a change-log entry in its
// replies, and the states an alarm moves through. The plug-in, the reference host and the
// simulated server read and write them; each including unit gets its own copies.

#include <QString>
#include <QStringList>

namespace PluginAlarmSearchCommon {

// Fields of an alarm, in the order the server writes them.
static const QString FIELD_ALARM_ID = QStringLiteral("AlarmID");
static const QString FIELD_EVENT_CLASS = QStringLiteral("EventClass");
static const QString FIELD_SUB_EVENT_TYPE = QStringLiteral("SubEventType");
static const QString FIELD_SUB_EVENT = QStringLiteral("SubEvent");
static const QString FIELD_ALARM_NAME = QStringLiteral("AlarmName");
static const QString FIELD_DEVICE_NAME = QStringLiteral("DeviceName");
static const QString FIELD_STATE = QStringLiteral("State"); // also of a change-log entry
static const QString FIELD_SERVER_TIME = QStringLiteral("ServerTime");
static const QString FIELD_NOTE = QStringLiteral("Note"); // also of a change-log entry
static const QString FIELD_MUTED = QStringLiteral("Muted");
static const QString FIELD_MUTE_UNTIL = QStringLiteral("MuteUntil");

static const QStringList ALARM_FIELDS{FIELD_ALARM_ID,  FIELD_EVENT_CLASS, FIELD_SUB_EVENT_TYPE,
                                      FIELD_SUB_EVENT, FIELD_ALARM_NAME,  FIELD_DEVICE_NAME,
                                      FIELD_STATE,     FIELD_SERVER_TIME, FIELD_NOTE,
                                      FIELD_MUTED,     FIELD_MUTE_UNTIL};

// Fields of a change-log entry besides FIELD_STATE and FIELD_NOTE, in the server's order
// Time, State, Note, User.
static const QString FIELD_TIME = QStringLiteral("Time");
static const QString FIELD_USER = QStringLiteral("User");

// The per-alarm outcome of a "ProcessAlarm" reply: the alarm's FIELD_ALARM_ID and this code.
static const QString FIELD_CODE = QStringLiteral("Code");

// The alarm states, in the order in which an alarm usually moves through them.
static const QString STATE_UNHANDLED = QStringLiteral("Unhandled");
static const QString STATE_PROCESSING = QStringLiteral("Processing");
static const QString STATE_HANDLED = QStringLiteral("Handled");
static const QString STATE_FALSE_ALARM = QStringLiteral("FalseAlarm");

static const QStringList ALARM_STATES{STATE_UNHANDLED, STATE_PROCESSING, STATE_HANDLED,
                                      STATE_FALSE_ALARM};

} // namespace PluginAlarmSearchCommon
