// Entry of the run-time-loaded logging library (KalbLogUtl) and its trace object's layout.
#pragma once

#include <cstdarg>
#include <cstddef>

extern "C" {

typedef int (*KalbRegisterModuleFn)(void* context, int version, const char* name,
                                    unsigned* moduleId);
// Returns 0 when a message of this code ((moduleId << 8) | level) is to be printed.
typedef int (*KalbFilterFn)(void* context, unsigned code, int reserved, const char* sourceFile,
                            int line);
typedef void (*KalbPrintFn)(void* context, const char* format, va_list args);

// A record of pointer-sized words; only words 3, 9, 14 and 15 are part of the contract.
struct KalbTraceObject {
    void* reserved0[3];
    void* context;
    void* reserved4[5];
    KalbRegisterModuleFn RegisterModule;
    void* reserved10[4];
    KalbFilterFn Filter;
    KalbPrintFn Print;
};

typedef int (*LogTrace_GetGlobalObjectFn)(int reserved, KalbTraceObject** traceObject);
}

#define KALBLOG_ENTRY_NAME "LogTrace_GetGlobalObject"
#define KALBLOG_REGISTER_VERSION 19

static_assert(offsetof(KalbTraceObject, context) == 3 * sizeof(void*), "word 3");
static_assert(offsetof(KalbTraceObject, RegisterModule) == 9 * sizeof(void*), "word 9");
static_assert(offsetof(KalbTraceObject, Filter) == 14 * sizeof(void*), "word 14");
static_assert(offsetof(KalbTraceObject, Print) == 15 * sizeof(void*), "word 15");
