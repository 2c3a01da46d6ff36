// Stands in for the plugin module: one logging client, made when the module is loaded and
// destroyed when it is unloaded.
#include "KalbLogClient.h"

#include <cstdint>

namespace {

const KalbLogClient moduleLog("WinModule");

} // namespace

// Prints one failure and one trace; gives the lines they were printed from.
extern "C" __declspec(dllexport) void logMessages(int* failureLine, int* traceLine) {
    *failureLine = __LINE__ + 1;
    moduleLog.print(KalbLogClient::Failure, __FILE__, __LINE__, "failed, %s, %d, %lld",
                    "ip: 10.0.0.7", -7, static_cast<long long>(INT64_C(1) << 40));
    *traceLine = __LINE__ + 1;
    moduleLog.print(KalbLogClient::Trace, __FILE__, __LINE__, "%s, Enter", "logMessages");
}
