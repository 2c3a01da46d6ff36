#include "ConnectionPark.h"

#include <microhttpd.h>

ConnectionPark::ConnectionPark(MHD_Connection* connection)
    : connection(connection) {}

bool ConnectionPark::park() {
    std::lock_guard<std::mutex> lock(mutex);
    switch (state) {
    case State::Running:
        state = State::Parked;
        MHD_suspend_connection(connection);
        return true;
    case State::Woken:
        state = State::Running;
        return false;
    case State::Closed:
        return false;
    case State::Parked:
        // The server calls back only into a running connection.
        break;
    }
    return true;
}

void ConnectionPark::wake() {
    std::lock_guard<std::mutex> lock(mutex);
    wakeLocked();
}

void ConnectionPark::tick() {
    std::lock_guard<std::mutex> lock(mutex);
    ticked = true;
    wakeLocked();
}

bool ConnectionPark::takeTick() {
    std::lock_guard<std::mutex> lock(mutex);
    const bool was = ticked;
    ticked = false;
    return was;
}

void ConnectionPark::close() {
    std::lock_guard<std::mutex> lock(mutex);
    if (state == State::Parked)
        MHD_resume_connection(connection);
    state = State::Closed;
}

bool ConnectionPark::isClosed() const {
    std::lock_guard<std::mutex> lock(mutex);
    return state == State::Closed;
}

void ConnectionPark::wakeLocked() {
    if (state == State::Parked) {
        MHD_resume_connection(connection);
        state = State::Running;
    } else if (state == State::Running) {
        state = State::Woken;
    }
}
