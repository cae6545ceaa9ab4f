#include "PluginAlarmSearchSrv_Log.h"

#include <dlfcn.h>

namespace {

constexpr char TraceLibraryName[] = "libZoltLogUtl.dylib";
constexpr char EntryPointName[] = "LogTrace_GetGlobalObject";
constexpr char ModuleName[] = "AlarmSearchSrv";
constexpr int32_t ModuleKind = 19;

// The trace object while tracing is on (object and context present), otherwise null.
TraceGlobalObject* activeTrace()
{
    TraceGlobalObject* trace = g_ptTraceInfoAlarmSearchSrv;
    return trace && trace->context ? trace : nullptr;
}

} // namespace

extern "C" {
TraceGlobalObject* g_ptTraceInfoAlarmSearchSrv = nullptr;
int32_t g_nGivenModIdAlarmSearchSrv = 0;
AUTOLOGGER_AlarmSearchSrv g_AlarmSearchSrv;

void LocalTraceOutFuncAlarmSearchSrv(const char* format, ...)
{
    TraceGlobalObject* trace = activeTrace();
    if (!trace || !trace->output || !format)
        return;
    va_list args;
    va_start(args, format);
    trace->output(trace->context, format, args);
    va_end(args);
}
}

// Runs while the library's static objects are built, before any entry point can be called, so
// the globals need no lock: afterwards they are only read.
AUTOLOGGER_AlarmSearchSrv::AUTOLOGGER_AlarmSearchSrv()
{
    m_handle = dlopen(TraceLibraryName, RTLD_LAZY);
    if (!m_handle)
        return;
    const auto getGlobalObject =
        reinterpret_cast<LogTrace_GetGlobalObjectFn>(dlsym(m_handle, EntryPointName));
    if (!getGlobalObject)
        return;
    TraceGlobalObject* object = nullptr;
    getGlobalObject(0, &object);
    if (!object)
        return;
    if (object->registerModule)
        object->registerModule(object->context, ModuleKind, ModuleName,
                               &g_nGivenModIdAlarmSearchSrv);
    g_ptTraceInfoAlarmSearchSrv = object;
}

AUTOLOGGER_AlarmSearchSrv::~AUTOLOGGER_AlarmSearchSrv()
{
    // The object lives inside the library: once it is closed, later lines (from static objects
    // destroyed after this one) must find tracing off instead of calling into unmapped code.
    g_ptTraceInfoAlarmSearchSrv = nullptr;
    if (m_handle)
        dlclose(m_handle);
}

bool AlarmSearchTrace::check(int level, const char* file, int line)
{
    TraceGlobalObject* trace = activeTrace();
    if (!trace || !trace->checkLevel)
        return false;
    // Computed unsigned so that a large module id wraps into the sign bit instead of overflowing.
    const auto levelCode =
        static_cast<int32_t>(static_cast<uint32_t>(g_nGivenModIdAlarmSearchSrv) << 8 |
                             static_cast<uint32_t>(level & 0xff));
    return trace->checkLevel(trace->context, levelCode, 0, file, line) == 0;
}

EntryLog::EntryLog(const char* file, const char* name, int line)
    : m_file(file), m_name(name), m_line(line)
{
    if (AlarmSearchTrace::check(AlarmSearchTrace::LevelEntry, m_file, m_line))
        LocalTraceOutFuncAlarmSearchSrv("%s, Enter", m_name);
}

EntryLog::~EntryLog()
{
    if (AlarmSearchTrace::check(AlarmSearchTrace::LevelEntry, m_file, 0))
        LocalTraceOutFuncAlarmSearchSrv("%s, Leave", m_name);
}
