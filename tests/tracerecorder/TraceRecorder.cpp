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

std::mutex mutex;
std::string journal;
std::string handedOut; // what TraceRecorder_journal last handed out
std::set<int64_t> refused;
int contextTag = 0;
TraceGlobalObject object{};

// One journal line per call; a context other than the one handed out marks the line.
void record(void* context, const std::string& entry)
{
    const std::lock_guard<std::mutex> lock(mutex);
    journal += entry + (context == &contextTag ? "\n" : " [foreign context]\n");
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
    const std::lock_guard<std::mutex> lock(mutex);
    return refused.count(levelCode) ? 1 : 0;
}

void output(void* context, const char* format, va_list args)
{
    char text[1024];
    std::vsnprintf(text, sizeof text, format, args);
    record(context, std::string("out ") + text);
}

} // namespace

TRACERECORDER_EXPORT int32_t LogTrace_GetGlobalObject(int32_t, TraceGlobalObject** handed)
{
    const char* noRegister = std::getenv("TRACERECORDER_NO_REGISTER");
    const bool registers = !noRegister || std::string(noRegister) != "1";
    object = TraceGlobalObject{};
    object.context = &contextTag;
    object.registerModule = registers ? registerModule : nullptr;
    object.checkLevel = checkLevel;
    object.output = output;
    *handed = &object;
    return 0;
}

// The journal, one entry a line; valid until the next call.
TRACERECORDER_EXPORT const char* TraceRecorder_journal()
{
    const std::lock_guard<std::mutex> lock(mutex);
    handedOut = journal;
    return handedOut.c_str();
}

// Empties the journal and forgets every refused level code.
TRACERECORDER_EXPORT void TraceRecorder_reset()
{
    const std::lock_guard<std::mutex> lock(mutex);
    journal.clear();
    refused.clear();
}

// Makes the level check answer 1 (do not write) for this level code.
TRACERECORDER_EXPORT void TraceRecorder_refuse(int64_t levelCode)
{
    const std::lock_guard<std::mutex> lock(mutex);
    refused.insert(levelCode);
}
