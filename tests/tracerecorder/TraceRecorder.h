#pragma once

// C interface of the recording trace library that tests put in place of "libZoltLogUtl.dylib".
// It keeps a journal of every call the trace glue makes, one text entry per call:
//   "register <kind> <module name>"
//   "check <level code> <reserved> <file>:<line>"
//   "out <formatted line>"
// An entry whose context argument is not the context the library handed out ends in
// " [context <pointer>]".
//
// Registration gives the module id 42. TRACERECORDER_NO_REGISTER=1, read when
// LogTrace_GetGlobalObject is called, leaves the registration entry null.
//
// Tests find these functions with dlopen("libZoltLogUtl.dylib", RTLD_NOLOAD) and dlsym.

#include <cstdint>

extern "C" {
// Number of journal entries.
typedef int32_t (*TraceRecorder_journalSizeFn)();
// Entry at index (null when out of range); valid until the next reset.
typedef const char* (*TraceRecorder_journalEntryFn)(int32_t index);
// Empties the journal and forgets every refused level code.
typedef void (*TraceRecorder_resetFn)();
// Makes the level check answer 1 (do not write) for this level code.
typedef void (*TraceRecorder_refuseFn)(int64_t levelCode);
}
