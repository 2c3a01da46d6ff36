#include "HostLog.h"

#include "KalbLog.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>

extern "C" int LogTrace_GetGlobalObject(int reserved, KalbTraceObject** traceObject);

namespace {

const unsigned TRACE_LEVEL = 5;

struct HostTracer {
    KalbTraceObject* object = nullptr;
    unsigned moduleId = 0;

    HostTracer() {
        if (LogTrace_GetGlobalObject(0, &object) != 0 || !object)
            object = nullptr;
        else if (object->RegisterModule)
            object->RegisterModule(object->context, KALBLOG_REGISTER_VERSION, "QuenvarHost",
                                   &moduleId);
    }

    void print(const char* format, ...) const {
        va_list args;
        va_start(args, format);
        object->Print(object->context, format, args);
        va_end(args);
    }
};

// Created on first use, after main has set KALBLOG_LEVEL.
const HostTracer& tracer() {
    static const HostTracer instance;
    return instance;
}

// Source paths are shown from the repository's top, as the plugin shows its own.
const char* repositoryPath(const char* sourceFile) {
    const char* found = std::strstr(sourceFile, "platform/host/");
    return found ? found : sourceFile;
}

} // namespace

void HostLog::warning(const QString& message) {
    static std::mutex mutex;
    const QByteArray line = "quenvar-host: " + message.toLocal8Bit() + '\n';
    std::lock_guard<std::mutex> lock(mutex);
    std::fwrite(line.constData(), 1, static_cast<size_t>(line.size()), stderr);
    std::fflush(stderr);
}

void HostLog::trace(const char* sourceFile, int line, const QString& message) {
    const HostTracer& log = tracer();
    const KalbTraceObject* object = log.object;
    if (!object || !object->context || !object->Filter || !object->Print)
        return;
    if (object->Filter(object->context, (log.moduleId << 8) | TRACE_LEVEL, 0,
                       repositoryPath(sourceFile), line) != 0)
        return;
    log.print("%s", message.toLocal8Bit().constData());
}
