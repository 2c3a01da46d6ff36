#include "EventQueue.h"

void EventQueue::push(const HostEvent& event) {
    {
        std::lock_guard<std::mutex> lock(mutex);
        if (closed)
            return;
        events.push_back(event);
    }
    changed.notify_all();
}

std::optional<HostEvent> EventQueue::next(std::chrono::milliseconds timeout) {
    std::unique_lock<std::mutex> lock(mutex);
    changed.wait_for(lock, timeout, [this]() { return closed || !events.empty(); });
    if (closed || events.empty())
        return std::nullopt;
    HostEvent event = std::move(events.front());
    events.pop_front();
    return event;
}

void EventQueue::close() {
    {
        std::lock_guard<std::mutex> lock(mutex);
        closed = true;
        events.clear();
    }
    changed.notify_all();
}

bool EventQueue::isClosed() const {
    std::lock_guard<std::mutex> lock(mutex);
    return closed;
}
