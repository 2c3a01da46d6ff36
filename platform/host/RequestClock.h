#pragma once

#include <chrono>
#include <mutex>
#include <unordered_map>

// The time each connection of the HTTP front has to send a request whole, counted from its
// opening or from the end of its last exchange: a client that trickles its request in is cut
// off instead of holding a connection and its descriptor for as long as it likes (the server
// library's own time-out counts from the last byte, not the first). Connections are known by
// any pointer unique while they are open. Safe to use from any thread.
class RequestClock {
public:
    using Clock = std::chrono::steady_clock;

    explicit RequestClock(std::chrono::milliseconds allowed);

    // A connection opened on descriptor fd; its clock runs.
    void opened(const void* connection, int fd);
    // Its request is in, or refused before its body: the clock stops.
    void received(const void* connection);
    // Its exchange is over; the clock runs for the next request on the connection.
    void restart(const void* connection);
    // Called before the descriptor closes, which is then no longer touched.
    void closed(const void* connection);
    // Shuts the overdue connections down, which the server then closes; returns how many.
    int cutOverdue(Clock::time_point now);

private:
    struct Entry {
        int fd = -1;
        bool running = true;
        Clock::time_point since;
    };

    const std::chrono::milliseconds allowed;
    std::mutex mutex;
    std::unordered_map<const void*, Entry> entries;
};
