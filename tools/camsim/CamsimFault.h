#pragma once

#include <string>

// A fault that the simulated camera applies to every camera request (not to /_sim/...).
struct CamsimFault {
    enum class Mode { None, Status, Delay, Close, Oversize };

    Mode mode = Mode::None;
    int status = 500;                    // Status: the answer's status, with a short text body
    int delayMs = 15000;                 // Delay: the wait before the normal answer
    long long bytes = 9LL * 1024 * 1024; // Oversize: the body's length

    static bool parseMode(const std::string& text, Mode* mode);
    static const char* modeName(Mode mode);
};
