#include "DeliveryGate.h"

#include <algorithm>

bool DeliveryGate::enter() {
    std::lock_guard<std::mutex> lock(mutex);
    if (closed)
        return false;
    inside.push_back(std::this_thread::get_id());
    return true;
}

void DeliveryGate::leave() {
    {
        std::lock_guard<std::mutex> lock(mutex);
        inside.erase(std::find(inside.begin(), inside.end(), std::this_thread::get_id()));
    }
    left.notify_all();
}

bool DeliveryGate::othersInside() const {
    const auto self = std::this_thread::get_id();
    return std::any_of(inside.begin(), inside.end(), [self](auto id) { return id != self; });
}

void DeliveryGate::close() {
    std::unique_lock<std::mutex> lock(mutex);
    closed = true;
    left.wait(lock, [this] { return !othersInside(); });
}
