#pragma once

// Trace glue: loads the trace library "libZoltLogUtl.dylib" when the plug-in library is loaded,
// registers the module "AlarmSearchSrv" and writes lines through it. Without the library every
// check fails and nothing is written.

#include <ZoltLogUtl.h>

#include <QByteArray>
#include <QString>
#include <QtGlobal>

class AUTOLOGGER_AlarmSearchSrv
{
public:
    AUTOLOGGER_AlarmSearchSrv();
    ~AUTOLOGGER_AlarmSearchSrv();
    Q_DISABLE_COPY_MOVE(AUTOLOGGER_AlarmSearchSrv)

private:
    void* m_handle = nullptr;
};

extern "C" {
Q_DECL_EXPORT extern TraceGlobalObject* g_ptTraceInfoAlarmSearchSrv;
Q_DECL_EXPORT extern int32_t g_nGivenModIdAlarmSearchSrv;
Q_DECL_EXPORT extern AUTOLOGGER_AlarmSearchSrv g_AlarmSearchSrv;

// Writes one printf-style line through the trace library, when it is loaded.
Q_DECL_EXPORT void LocalTraceOutFuncAlarmSearchSrv(const char* format, ...)
    Q_ATTRIBUTE_FORMAT_PRINTF(1, 2);
}

namespace AlarmSearchTrace {

enum Level : int {
    LevelFailure = 2,
    LevelEntry = 5,
};

// True when the trace library wants a line of this level from file:line.
bool check(int level, const char* file, int line);

// A QString as the local 8-bit text the trace lines carry (a null string gives "").
inline QByteArray local8Bit(const QString& s)
{
    return s.toLocal8Bit();
}

} // namespace AlarmSearchTrace

// Writes a failure line; the arguments are evaluated only when the check passes.
#define ALARMSEARCH_TRACE_FAILURE(...)                                                             \
    do {                                                                                           \
        if (AlarmSearchTrace::check(AlarmSearchTrace::LevelFailure, __FILE__, __LINE__))           \
            LocalTraceOutFuncAlarmSearchSrv(__VA_ARGS__);                                          \
    } while (false)

// Writes "<name>, Enter" on construction and "<name>, Leave" on destruction (also when the scope
// is left by an exception).
class EntryLog
{
public:
    EntryLog(const char* file, const char* name, int line);
    ~EntryLog();
    Q_DISABLE_COPY_MOVE(EntryLog)

private:
    const char* m_file;
    const char* m_name;
    int m_line;
};
