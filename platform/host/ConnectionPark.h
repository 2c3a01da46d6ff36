#pragma once

#include <mutex>

struct MHD_Connection;

// The suspend-and-resume handshake of one connection of the HTTP front, so that a connection
// waiting for an answer or an event holds no thread. park() runs on the server's thread, in a
// callback of that connection; wake(), tick() and close() on any thread.
class ConnectionPark {
public:
    explicit ConnectionPark(MHD_Connection* connection);
    ConnectionPark(const ConnectionPark&) = delete;
    ConnectionPark& operator=(const ConnectionPark&) = delete;

    // Suspends the connection and returns true, unless a wake came since the last park or the
    // park is closed: then the caller looks at its work again instead.
    bool park();
    // Resumes the connection when it is parked; otherwise the next park() returns false.
    void wake();
    // A wake from the front's clock, which takeTick() then reports once.
    void tick();
    bool takeTick();
    // Wakes the connection for good: park() refuses from now on. Called when the server stops
    // and when the connection is done, so that no later wake reaches a connection that is gone.
    void close();
    bool isClosed() const;

private:
    enum class State { Running, Parked, Woken, Closed };

    void wakeLocked();

    mutable std::mutex mutex;
    MHD_Connection* connection;
    State state = State::Running;
    bool ticked = false;
};
