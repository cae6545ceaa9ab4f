#pragma once

// The fixed vocabulary shared by the plug-in, its clients and the management server: request
// method names, the event name, argument and result keys, ready-made trigger-event filters and
// the plug-in identifier. Each including unit gets its own copies (internal linkage).

#include <QString>

// Plug-in identifier: plug-in metadata "PluginID", the pluginId of every published event and
// the first argument of every tunnel request.
static const char PALARMSEARCH_PLUGINID[] = "C758778662E44060AC6E2EC5C9AD349B";

namespace PluginAlarmSearchCommon {

// Request methods (and, where noted, tunnel command names).
static const QString METHOD_QUERY_UNHANDLED_ALARM = QStringLiteral("QryUnhandledAlarm");
static const QString METHOD_QUERY_ALARM_LIST = QStringLiteral("QryAlarmList"); // also a command
static const QString METHOD_UPDATE_ALARM = QStringLiteral("UpdateAlarm");
static const QString METHOD_PROCESS_ALARM = QStringLiteral("ProcessAlarm"); // command only
static const QString METHOD_GET_ALARM_HISTORY = QStringLiteral("GetAlarmHistory");
static const QString METHOD_GET_ALARM_HISTORY_FOR_EXPORT =
    QStringLiteral("GetAlarmHistoryForExport");
static const QString METHOD_GET_ALARM_INFO = QStringLiteral("GetAlarmInfo"); // command only
static const QString METHOD_MUTE_ALARM = QStringLiteral("MuteAlarm");        // also a command

static const QString EVENT_ALARM_UPDATED = QStringLiteral("AlarmUpdated");

// Keys of argument and result maps.
static const QString ARG_TRIGGER_EVENT_FILTER = QStringLiteral("triggerEventFilter");
static const QString ARG_STATE_FILTER = QStringLiteral("stateFilter");
static const QString ARG_START_TIME = QStringLiteral("startTime");
static const QString ARG_END_TIME = QStringLiteral("endTime");
static const QString ARG_RULES = QStringLiteral("rules");
// Keys of one ARG_RULES entry: which field its tags match, and the tags.
static const QString ARG_RULE_TYPE = QStringLiteral("type");
static const QString ARG_RULE_TAG_LIST = QStringLiteral("tagList");
static const QString ARG_RELAY_PATH = QStringLiteral("relayPath");
static const QString ARG_QUERY_RESULT = QStringLiteral("queryResult");
static const QString ARG_ALARM_ID = QStringLiteral("alarmId");
static const QString ARG_ALARM_STATUS = QStringLiteral("alarmStatus");
static const QString ARG_ALARM_COMMENT = QStringLiteral("alarmComment");
static const QString ARG_UPDATE_RESULT = QStringLiteral("updateResult");
static const QString ARG_ALARM_UPDATED_RESULTS = QStringLiteral("alarmUpdatedResults");
static const QString ARG_ALARM_ID_LIST = QStringLiteral("alarmIdList");
static const QString ARG_IS_MUTE = QStringLiteral("isMute");
static const QString ARG_MUTE_TIME_SECOND = QStringLiteral("muteTimeSecond");
static const QString ARG_ALARMINFO_ID_LIST = QStringLiteral("alarmInfoIdList");
static const QString ARG_ALARMINFO_STATUS = QStringLiteral("alarmInfoStatus");
static const QString ARG_ALARMINFO_NOTE = QStringLiteral("alarmInfoNote");
static const QString ARG_CHANGE_LOGS = QStringLiteral("changeLogs");
static const QString ARG_EXPORT_ID = QStringLiteral("exportId");

// Values of ARG_RULE_TYPE: the tags match alarm names, or trigger-device names.
enum RuleType { RULE_TYPE_NAME = 0, RULE_TYPE_DEVICE_NAME = 1 };

// Trigger-event filters a client can put under ARG_TRIGGER_EVENT_FILTER: runs of Event elements,
// one per line. The attribute narrows an event class to one of its sub-events.
static const QString CAMERA_TRIGGER_EVENT_FILTER_STRING =
    QStringLiteral("\n"
                   "<Event CameraEvent=\"DI\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"DO\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"Motion\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"VideoLossRestore\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"PIR\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"Tampering\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"Temperature\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"IR\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"SmartSD\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"AudioDetection\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"ShockDetection\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"PPTZTrigger\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"BruteForceAttack\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"CyberAttack\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"QuarantineEvent\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"Guardian\">CamEvent</Event>\n"
                   "<Event CameraEvent=\"Thermal\">CamEvent</Event>\n"
                   "<Event VCAEvent=\"LineDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"FieldDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"Loitering\">VCA</Event>\n"
                   "<Event VCAEvent=\"CrowdDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"FaceDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"ZoneDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"MissingObject\">VCA</Event>\n"
                   "<Event VCAEvent=\"AbandonObject\">VCA</Event>\n"
                   "<Event VCAEvent=\"SmartTracking\">VCA</Event>\n"
                   "<Event VCAEvent=\"RunningDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"ParkingViolationDetection\">VCA</Event>\n"
                   "<Event VCAEvent=\"RestrictedZoneDetection\">VCA</Event>\n"
                   "<Event>CamConn</Event>\n"
                   "<Event>RecStatus</Event>\n"
                   "<Event>RecErr</Event>");

static const QString SYSTEM_TRIGGER_EVENT_FILTER_STRING =
    QStringLiteral("\n"
                   "<Event>StationConn</Event>\n"
                   "<Event>StorageConn</Event>\n"
                   "<Event>StorageCapacity</Event>\n"
                   "<Event>SysLicense</Event>\n"
                   "<Event>SysNetwork</Event>\n"
                   "<Event>SysVirMem</Event>\n"
                   "<Event>FanStatus</Event>\n"
                   "<Event>GpsConn</Event>\n"
                   "<Event>GpsSpeed</Event>\n"
                   "<Event>Gsensor</Event>\n"
                   "<Event>SysVcaAreaReport</Event>\n"
                   "<Event>BruteForceAttack</Event>\n"
                   "<Event>CyberAttack</Event>\n"
                   "<Event>QuarantineEvent</Event>\n");

static const QString EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING =
    QStringLiteral("\n"
                   "<Event ExtDeviceEvent=\"DI\">ExtIODevice</Event>\n"
                   "<Event ExtDeviceEvent=\"DO\">ExtIODevice</Event>\n"
                   "<Event ExtDeviceEvent=\"DI\">DIOStatus</Event>\n"
                   "<Event ExtDeviceEvent=\"DO\">DIOStatus</Event>\n"
                   "<Event>ExtTCPMessage</Event>\n"
                   "<Event>ExtDataMagnet</Event>\n"
                   "<Event>ExtAccessRule</Event>\n"
                   "<Event>VirtualTrigger</Event>\n"
                   "<Event>ManualEvent</Event>");

} // namespace PluginAlarmSearchCommon
