#pragma once

#include "ClientAnswer.h"
#include "PluginFramework.h"

#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>

// The answer slot of one client request. The plugin fills it once, on any thread; the front
// waits for it. A plugin that drops every copy of the callback without calling it can never
// answer, so the request then counts as abandoned and nobody has to wait out the deadline.
class PendingAnswer : public std::enable_shared_from_this<PendingAnswer> {
public:
    enum class State { Waiting, Answered, Abandoned };

    static std::shared_ptr<PendingAnswer> create();

    // The callback to hand to the plugin; one per request.
    ResponseCallback callback();
    // Called once, on the thread that answers or abandons; set it before sending the request.
    void setListener(std::function<void()> listener);
    // Blocks until the request is answered or abandoned, or the timeout passes.
    State waitFor(std::chrono::milliseconds timeout);
    State state() const;
    ClientAnswer answer() const;

private:
    PendingAnswer() = default;
    void settle(State outcome, const ClientAnswer& answer);

    mutable std::mutex mutex;
    std::condition_variable settled;
    State current = State::Waiting;
    ClientAnswer result;
    std::function<void()> listener;
};
