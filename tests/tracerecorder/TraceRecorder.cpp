#include "TraceRecorder.h"

#include <ZoltLogUtl.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <mutex>
#include <set>
#include <string>

#define TRACERECORDER_EXPORT extern "C" __attribute__((visibility("default")))

namespace {

constexpr int32_t ModuleId = 42;

// Recorder state; a deque keeps the entries' text in place while new entries are added.
struct Recorder
{
    std::mutex mutex;
    std::deque<std::string> journal;
    std::set<int64_t> refused;
    TraceGlobalObject object{};
    int contextTag = 0;
};

Recorder& recorder()
{
    static Recorder instance;
    return instance;
}

bool envFlag(const char* name)
{
    const char* value = std::getenv(name);
    return value && std::strcmp(value, "1") == 0;
}

void record(void* context, std::string entry)
{
    Recorder& r = recorder();
    if (context != r.object.context) {
        char pointer[32];
        std::snprintf(pointer, sizeof pointer, "%p", context);
        entry += " [context ";
        entry += pointer;
        entry += ']';
    }
    std::lock_guard<std::mutex> lock(r.mutex);
    r.journal.push_back(std::move(entry));
}

void registerModule(void* context, int32_t kind, const char* moduleName, int32_t* moduleId)
{
    record(context,
           "register " + std::to_string(kind) + ' ' + (moduleName ? moduleName : "(null)"));
    if (moduleId)
        *moduleId = ModuleId;
}

int32_t checkLevel(void* context, int64_t levelCode, int64_t reserved, const char* file,
                   int32_t line)
{
    record(context, "check " + std::to_string(levelCode) + ' ' + std::to_string(reserved) + ' ' +
                        (file ? file : "(null)") + ':' + std::to_string(line));
    Recorder& r = recorder();
    std::lock_guard<std::mutex> lock(r.mutex);
    return r.refused.count(levelCode) ? 1 : 0;
}

void output(void* context, const char* format, va_list args)
{
    va_list sizing;
    va_copy(sizing, args);
    const int size = std::vsnprintf(nullptr, 0, format, sizing);
    va_end(sizing);
    std::string text(static_cast<size_t>(size < 0 ? 0 : size), '\0');
    std::vsnprintf(text.data(), text.size() + 1, format, args);
    record(context, "out " + text);
}

} // namespace

TRACERECORDER_EXPORT int32_t LogTrace_GetGlobalObject(int32_t /*reserved*/,
                                                      TraceGlobalObject** object)
{
    Recorder& r = recorder();
    r.object = TraceGlobalObject{};
    r.object.context = &r.contextTag;
    r.object.registerModule = envFlag("TRACERECORDER_NO_REGISTER") ? nullptr : registerModule;
    r.object.checkLevel = checkLevel;
    r.object.output = output;
    *object = &r.object;
    return 0;
}

TRACERECORDER_EXPORT int32_t TraceRecorder_journalSize()
{
    Recorder& r = recorder();
    std::lock_guard<std::mutex> lock(r.mutex);
    return static_cast<int32_t>(r.journal.size());
}

TRACERECORDER_EXPORT const char* TraceRecorder_journalEntry(int32_t index)
{
    Recorder& r = recorder();
    std::lock_guard<std::mutex> lock(r.mutex);
    if (index < 0 || static_cast<size_t>(index) >= r.journal.size())
        return nullptr;
    return r.journal[static_cast<size_t>(index)].c_str();
}

TRACERECORDER_EXPORT void TraceRecorder_reset()
{
    Recorder& r = recorder();
    std::lock_guard<std::mutex> lock(r.mutex);
    r.journal.clear();
    r.refused.clear();
}

TRACERECORDER_EXPORT void TraceRecorder_refuse(int64_t levelCode)
{
    Recorder& r = recorder();
    std::lock_guard<std::mutex> lock(r.mutex);
    r.refused.insert(levelCode);
}
