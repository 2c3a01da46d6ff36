#pragma once

#include "HostEvent.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <optional>

// The events on their way to one event stream: filled on the thread that delivers them, drained
// by the stream's own thread.
class EventQueue {
public:
    void push(const HostEvent& event);
    // The next event, or nothing when the timeout passes first or the queue is closed.
    std::optional<HostEvent> next(std::chrono::milliseconds timeout);
    // Wakes the reader; later pushes are dropped.
    void close();
    bool isClosed() const;

private:
    mutable std::mutex mutex;
    std::condition_variable changed;
    std::deque<HostEvent> events;
    bool closed = false;
};
