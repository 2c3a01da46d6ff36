#pragma once

#include "HostEvent.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>

// The events on their way to one event stream: filled on the thread that delivers them, drained
// by the stream's reader.
class EventQueue {
public:
    // A stream whose reader falls this many events behind is closed rather than buffered
    // without bound; its client sees the stream end and may open another.
    static const int CAPACITY = 1024;

    void push(const HostEvent& event);
    // The next event, or nothing when the timeout passes first or the queue is closed.
    std::optional<HostEvent> next(std::chrono::milliseconds timeout);
    // Wakes the reader; later pushes are dropped.
    void close();
    bool isClosed() const;
    // Called after each push and on closing, on the thread that pushes or closes. Pushes before
    // it is set go unannounced, so the reader looks at the queue once after setting it.
    void setListener(std::function<void()> listener);

private:
    void notify();

    mutable std::mutex mutex;
    std::condition_variable changed;
    std::deque<HostEvent> events;
    bool closed = false;
    std::function<void()> listener;
};
