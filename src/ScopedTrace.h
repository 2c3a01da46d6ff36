#pragma once

// Traces "<function>, Enter" when made and "<function>, Leave" when gone, exceptions included.
class ScopedTrace {
public:
    ScopedTrace(const char* function, const char* sourceFile, int line);
    ~ScopedTrace();

    ScopedTrace(const ScopedTrace&) = delete;
    ScopedTrace& operator=(const ScopedTrace&) = delete;

private:
    const char* function;
    const char* sourceFile;
};
