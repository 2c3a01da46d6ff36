#include "ParkingLot.h"

std::shared_ptr<ConnectionPark> ParkingLot::enter(MHD_Connection* connection) {
    std::lock_guard<std::mutex> lock(mutex);
    if (closed)
        return nullptr;
    auto park = std::make_shared<ConnectionPark>(connection);
    parks.insert(park);
    return park;
}

void ParkingLot::leave(const std::shared_ptr<ConnectionPark>& park) {
    park->close();
    std::lock_guard<std::mutex> lock(mutex);
    parks.erase(park);
}

void ParkingLot::tickAll() {
    std::lock_guard<std::mutex> lock(mutex);
    for (const auto& park : parks)
        park->tick();
}

void ParkingLot::closeAll() {
    std::lock_guard<std::mutex> lock(mutex);
    closed = true;
    for (const auto& park : parks)
        park->close();
}
