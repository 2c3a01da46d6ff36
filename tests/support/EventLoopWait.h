#pragma once

#include <functional>

// Runs the thread's event loop until done() holds or timeoutMs pass; returns done(). Wakes up
// every few milliseconds to look, so done() may watch state that changes without an event.
bool runEventLoopUntil(const std::function<bool()>& done, int timeoutMs = 10000);
