#include "RequestClock.h"

#include <sys/socket.h>

RequestClock::RequestClock(std::chrono::milliseconds allowed)
    : allowed(allowed) {}

void RequestClock::opened(const void* connection, int fd) {
    std::lock_guard<std::mutex> lock(mutex);
    entries[connection] = Entry{fd, true, Clock::now()};
}

void RequestClock::received(const void* connection) {
    std::lock_guard<std::mutex> lock(mutex);
    const auto found = entries.find(connection);
    if (found != entries.end())
        found->second.running = false;
}

void RequestClock::restart(const void* connection) {
    std::lock_guard<std::mutex> lock(mutex);
    const auto found = entries.find(connection);
    if (found != entries.end()) {
        found->second.running = true;
        found->second.since = Clock::now();
    }
}

void RequestClock::closed(const void* connection) {
    std::lock_guard<std::mutex> lock(mutex);
    entries.erase(connection);
}

int RequestClock::cutOverdue(Clock::time_point now) {
    std::lock_guard<std::mutex> lock(mutex);
    int cut = 0;
    for (auto& entry : entries) {
        Entry& state = entry.second;
        if (!state.running || now - state.since < allowed)
            continue;
        // The descriptor is still open: closed() takes the same lock before it is closed.
        ::shutdown(state.fd, SHUT_RDWR);
        state.running = false;
        ++cut;
    }
    return cut;
}
