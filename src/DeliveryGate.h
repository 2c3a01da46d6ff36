#pragma once

#include "QuenvarExport.h"

#include <condition_variable>
#include <mutex>
#include <thread>
#include <vector>

// Lets answers and events into the host only while the plugin lives. Closing waits for those
// already under way on other threads, so none is still running once the plugin is destroyed;
// one under way on the closing thread itself (a callback that destroys the plugin) is not waited
// for.
class QUENVAR_EXPORT DeliveryGate {
public:
    // Runs deliver unless the gate is closed.
    template <typename Deliver>
    void pass(Deliver&& deliver) {
        if (!enter())
            return;
        const Inside inside{*this};
        deliver();
    }

    void close();

private:
    struct Inside {
        DeliveryGate& gate;
        ~Inside() { gate.leave(); }
    };

    bool enter();
    void leave();
    bool othersInside() const;

    std::mutex mutex;
    std::condition_variable left;
    bool closed = false;
    std::vector<std::thread::id> inside;
};
