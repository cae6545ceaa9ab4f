#pragma once

// Binary interface of the trace library "libZoltLogUtl.dylib": the global object that
// LogTrace_GetGlobalObject hands out. Only the words below are part of the interface; each word
// is 8 bytes and the rest is the library's own.

#include <cstdarg>
#include <cstddef>
#include <cstdint>

extern "C" {

// Registers a module; writes the module id the library gives it to *moduleId.
typedef void (*ZoltLogRegisterModuleFn)(void* context, int32_t kind, const char* moduleName,
                                        int32_t* moduleId);
// Returns 0 when a line of levelCode ((module id << 8) | level) at file:line is to be written.
typedef int32_t (*ZoltLogCheckLevelFn)(void* context, int64_t levelCode, int64_t reserved,
                                       const char* file, int32_t line);
// Writes one printf-style line.
typedef void (*ZoltLogOutputFn)(void* context, const char* format, va_list args);

struct TraceGlobalObject
{
    void* reserved0[3];
    void* context; // byte 24
    void* reserved1[5];
    ZoltLogRegisterModuleFn registerModule; // byte 72
    void* reserved2[4];
    ZoltLogCheckLevelFn checkLevel; // byte 112
    ZoltLogOutputFn output;         // byte 120
};

// Entry point: stores the library's global object in *object. The first argument is reserved
// and always 0.
typedef int32_t (*LogTrace_GetGlobalObjectFn)(int32_t reserved, TraceGlobalObject** object);
}

static_assert(offsetof(TraceGlobalObject, context) == 24, "trace object layout");
static_assert(offsetof(TraceGlobalObject, registerModule) == 72, "trace object layout");
static_assert(offsetof(TraceGlobalObject, checkLevel) == 112, "trace object layout");
static_assert(offsetof(TraceGlobalObject, output) == 120, "trace object layout");
