#pragma once

#include "ConnectionPark.h"

#include <memory>
#include <mutex>
#include <set>

// The parks of the HTTP front's connections, so that its clock can tick them and its stop can
// wake them all: the server library must not be stopped while a connection is suspended. Safe to
// use from any thread.
class ParkingLot {
public:
    // A park for connection; null once closeAll() has run.
    std::shared_ptr<ConnectionPark> enter(MHD_Connection* connection);
    // Closes the park and forgets it.
    void leave(const std::shared_ptr<ConnectionPark>& park);
    void tickAll();
    // Closes every park; enter() refuses from now on.
    void closeAll();

private:
    std::mutex mutex;
    std::set<std::shared_ptr<ConnectionPark>> parks;
    bool closed = false;
};
