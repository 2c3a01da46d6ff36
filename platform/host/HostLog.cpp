#include "HostLog.h"

const KalbLogClient& hostLog() {
    static const KalbLogClient client("QuenvarHost");
    return client;
}
