#include "EventQueue.h"

#include "HostLog.h"

void EventQueue::push(const HostEvent& event) {
    {
        std::lock_guard<std::mutex> lock(mutex);
        if (closed)
            return;
        if (events.size() >= CAPACITY) {
            closed = true;
            events.clear();
            hostLog().print(KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                            qUtf8Printable(QStringLiteral("closing an event stream of subscriber "
                                                          "%1: %2 events wait for its reader")
                                               .arg(event.subscriberId)
                                               .arg(CAPACITY)));
        } else {
            events.push_back(event);
        }
    }
    notify();
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
        if (closed)
            return;
        closed = true;
        events.clear();
    }
    notify();
}

bool EventQueue::isClosed() const {
    std::lock_guard<std::mutex> lock(mutex);
    return closed;
}

void EventQueue::setListener(std::function<void()> listener) {
    std::lock_guard<std::mutex> lock(mutex);
    this->listener = std::move(listener);
}

void EventQueue::notify() {
    changed.notify_all();
    std::function<void()> callback;
    {
        std::lock_guard<std::mutex> lock(mutex);
        callback = listener;
    }
    if (callback)
        callback();
}
