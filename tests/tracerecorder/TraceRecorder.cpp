// Recording trace library that tests put in place of "libZoltLogUtl.dylib". Its journal holds one
// entry a call: "register <kind> <module>", "check <level code> <reserved> <file>:<line>",
// "out <line>". Registration gives the module id 42; TRACERECORDER_NO_REGISTER=1 leaves the
// registration entry null.

#include <ZoltLogUtl.h>

#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <set>
#include <string>

#define TRACERECORDER_EXPORT extern "C" __attribute__((visibility("default")))

namespace {

struct Recorder
{
    std::mutex mutex;
    std::string journal;
    std::string copy; // what TraceRecorder_journal last handed out
    std::set<int64_t> refused;
    TraceGlobalObject object{};
    int contextTag = 0;
};

Recorder& recorder()
{
    static Recorder instance;
    return instance;
}

// One journal line per call; a context other than the one handed out marks the line.
void record(void* context, std::string entry)
{
    Recorder& r = recorder();
    const std::lock_guard<std::mutex> lock(r.mutex);
    r.journal += entry + (context == &r.contextTag ? "\n" : " [foreign context]\n");
}

void registerModule(void* context, int32_t kind, const char* moduleName, int32_t* moduleId)
{
    record(context,
           "register " + std::to_string(kind) + ' ' + (moduleName ? moduleName : "(null)"));
    if (moduleId)
        *moduleId = 42;
}

int32_t checkLevel(void* context, int64_t levelCode, int64_t reserved, const char* file,
                   int32_t line)
{
    record(context, "check " + std::to_string(levelCode) + ' ' + std::to_string(reserved) + ' ' +
                        (file ? file : "(null)") + ':' + std::to_string(line));
    const std::lock_guard<std::mutex> lock(recorder().mutex);
    return recorder().refused.count(levelCode) ? 1 : 0;
}

void output(void* context, const char* format, va_list args)
{
    char text[1024];
    std::vsnprintf(text, sizeof text, format, args);
    record(context, std::string("out ") + text);
}

} // namespace

TRACERECORDER_EXPORT int32_t LogTrace_GetGlobalObject(int32_t, TraceGlobalObject** object)
{
    Recorder& r = recorder();
    const char* noRegister = std::getenv("TRACERECORDER_NO_REGISTER");
    const bool registers = !noRegister || std::string(noRegister) != "1";
    r.object = TraceGlobalObject{};
    r.object.context = &r.contextTag;
    r.object.registerModule = registers ? registerModule : nullptr;
    r.object.checkLevel = checkLevel;
    r.object.output = output;
    *object = &r.object;
    return 0;
}

// The journal, one entry a line; valid until the next call.
TRACERECORDER_EXPORT const char* TraceRecorder_journal()
{
    Recorder& r = recorder();
    const std::lock_guard<std::mutex> lock(r.mutex);
    r.copy = r.journal;
    return r.copy.c_str();
}

// Empties the journal and forgets every refused level code.
TRACERECORDER_EXPORT void TraceRecorder_reset()
{
    Recorder& r = recorder();
    const std::lock_guard<std::mutex> lock(r.mutex);
    r.journal.clear();
    r.refused.clear();
}

// Makes the level check answer 1 (do not write) for this level code.
TRACERECORDER_EXPORT void TraceRecorder_refuse(int64_t levelCode)
{
    const std::lock_guard<std::mutex> lock(recorder().mutex);
    recorder().refused.insert(levelCode);
}
