#include "RequestLog.h"

RequestLog::~RequestLog() {
    if (file)
        std::fclose(file);
}

bool RequestLog::open(const std::string& path) {
    std::lock_guard<std::mutex> lock(mutex);
    file = std::fopen(path.c_str(), "a");
    return file != nullptr;
}

void RequestLog::write(const std::string& method, const std::string& target,
                       const std::string& body) {
    const std::string line = method + '\t' + target + '\t' + escape(body) + '\n';
    std::lock_guard<std::mutex> lock(mutex);
    if (!file)
        return;
    std::fwrite(line.data(), 1, line.size(), file);
    std::fflush(file);
}

std::string RequestLog::escape(const std::string& text) {
    std::string result;
    result.reserve(text.size());
    for (const char c : text) {
        switch (c) {
        case '\\':
            result += "\\\\";
            break;
        case '\n':
            result += "\\n";
            break;
        case '\r':
            result += "\\r";
            break;
        case '\t':
            result += "\\t";
            break;
        default:
            result += c;
        }
    }
    return result;
}
