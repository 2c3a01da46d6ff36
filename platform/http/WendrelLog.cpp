#include "WendrelLog.h"

const KalbLogClient& wendrelLog() {
    static const KalbLogClient client("Wendrel");
    return client;
}
