#pragma once

#include <cstdio>
#include <mutex>
#include <string>

// One line per accepted request: METHOD, TAB, the target as received, TAB, the body with
// backslash, LF, CR and TAB escaped as \\, \n, \r and \t. Flushed line by line, so that a
// test can read what the camera accepted while the simulator runs.
class RequestLog {
public:
    RequestLog() = default;
    ~RequestLog();
    RequestLog(const RequestLog&) = delete;
    RequestLog& operator=(const RequestLog&) = delete;

    // Appends to path; false when the file cannot be opened.
    bool open(const std::string& path);
    void write(const std::string& method, const std::string& target, const std::string& body);

    static std::string escape(const std::string& text);

private:
    std::mutex mutex;
    FILE* file = nullptr; // guarded by mutex
};
