// The logging library: one trace object for the process, filtered by KALBLOG_LEVEL (messages of
// level <= N are printed; default 2) and written to KALBLOG_FILE (appended) or standard error.
// Line format: "2026-12-06 11:12:13.456 [Module] L2 src/File:42 message".
#include "KalbLog.h"

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <mutex>
#include <string>
#include <vector>

#if defined(_WIN32)
#define KALBLOG_API extern "C" __declspec(dllexport)
#else
#define KALBLOG_API extern "C" __attribute__((visibility("default")))
#endif

namespace {

const int DEFAULT_LEVEL = 2;

struct Logger {
    std::mutex mutex;
    std::vector<std::string> modules{"-"}; // id 0 is the unregistered module
    int maxLevel = DEFAULT_LEVEL;
    FILE* out = stderr;
    bool ownsOut = false;

    Logger() {
        if (const char* level = std::getenv("KALBLOG_LEVEL")) {
            char* end = nullptr;
            const long value = std::strtol(level, &end, 10);
            if (end != level && *end == '\0')
                maxLevel = static_cast<int>(value);
        }
        if (const char* path = std::getenv("KALBLOG_FILE")) {
            if (*path) {
                if (FILE* file = std::fopen(path, "a")) {
                    out = file;
                    ownsOut = true;
                }
            }
        }
    }

    ~Logger() {
        if (ownsOut)
            std::fclose(out);
    }
};

Logger& logger() {
    static Logger instance;
    return instance;
}

// Filter and Print come in pairs on one thread: Filter records where the message comes from.
struct PendingMessage {
    unsigned code = 0;
    const char* sourceFile = nullptr;
    int line = 0;
};
thread_local PendingMessage pending;

int registerModule(void* context, int, const char* name, unsigned* moduleId) {
    auto* log = static_cast<Logger*>(context);
    if (!log || !name || !moduleId)
        return -1;
    std::lock_guard<std::mutex> lock(log->mutex);
    for (size_t i = 1; i < log->modules.size(); ++i) {
        if (log->modules[i] == name) {
            *moduleId = static_cast<unsigned>(i);
            return 0;
        }
    }
    log->modules.emplace_back(name);
    *moduleId = static_cast<unsigned>(log->modules.size() - 1);
    return 0;
}

int filter(void* context, unsigned code, int, const char* sourceFile, int line) {
    auto* log = static_cast<Logger*>(context);
    if (!log || static_cast<int>(code & 0xffu) > log->maxLevel)
        return 1;
    pending = PendingMessage{code, sourceFile, line};
    return 0;
}

std::string timestamp() {
    using namespace std::chrono;
    const auto now = system_clock::now();
    const std::time_t seconds = system_clock::to_time_t(now);
    const auto millis = duration_cast<milliseconds>(now.time_since_epoch()).count() % 1000;
    std::tm local{};
#if defined(_WIN32)
    localtime_s(&local, &seconds);
#else
    localtime_r(&seconds, &local);
#endif
    char text[32];
    const size_t length = std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &local);
    char withMillis[40];
    std::snprintf(withMillis, sizeof withMillis, "%.*s.%03d", static_cast<int>(length), text,
                  static_cast<int>(millis));
    return withMillis;
}

void print(void* context, const char* format, va_list args) {
    auto* log = static_cast<Logger*>(context);
    if (!log || !format)
        return;
    va_list copy;
    va_copy(copy, args);
    const int size = std::vsnprintf(nullptr, 0, format, copy);
    va_end(copy);
    std::string message(size > 0 ? static_cast<size_t>(size) : 0, '\0');
    if (size > 0)
        std::vsnprintf(message.data(), message.size() + 1, format, args);

    const PendingMessage from = pending;
    pending = PendingMessage{};
    const unsigned moduleId = from.code >> 8;
    std::lock_guard<std::mutex> lock(log->mutex);
    const std::string& module =
        moduleId < log->modules.size() ? log->modules[moduleId] : log->modules[0];
    std::string line = timestamp() + " [" + module + "] L" + std::to_string(from.code & 0xffu) +
                       " " + (from.sourceFile ? from.sourceFile : "?") + ":" +
                       std::to_string(from.line) + " " + message + "\n";
    std::fwrite(line.data(), 1, line.size(), log->out);
    std::fflush(log->out);
}

KalbTraceObject makeTraceObject() {
    KalbTraceObject object{};
    object.context = &logger();
    object.RegisterModule = &registerModule;
    object.Filter = &filter;
    object.Print = &print;
    return object;
}

} // namespace

KALBLOG_API int LogTrace_GetGlobalObject(int, KalbTraceObject** traceObject) {
    static KalbTraceObject object = makeTraceObject();
    if (!traceObject)
        return -1;
    *traceObject = &object;
    return 0;
}
