#include "PendingAnswer.h"

namespace {

// Shared by every copy of one callback: its destruction means no copy is left to answer.
class AnswerGuard {
public:
    explicit AnswerGuard(std::function<void()> onDropped)
        : onDropped(std::move(onDropped)) {}
    ~AnswerGuard() { onDropped(); }
    AnswerGuard(const AnswerGuard&) = delete;
    AnswerGuard& operator=(const AnswerGuard&) = delete;

private:
    std::function<void()> onDropped;
};

} // namespace

std::shared_ptr<PendingAnswer> PendingAnswer::create() {
    return std::shared_ptr<PendingAnswer>(new PendingAnswer());
}

ResponseCallback PendingAnswer::callback() {
    std::shared_ptr<PendingAnswer> self = shared_from_this();
    auto guard =
        std::make_shared<AnswerGuard>([self]() { self->settle(State::Abandoned, ClientAnswer()); });
    return [self, guard](bool handled, const QString& code, const QString& message,
                         const QVariant& payload) {
        self->settle(State::Answered, ClientAnswer{handled, code, message, payload});
    };
}

void PendingAnswer::setListener(std::function<void()> listener) {
    std::lock_guard<std::mutex> lock(mutex);
    this->listener = std::move(listener);
}

PendingAnswer::State PendingAnswer::waitFor(std::chrono::milliseconds timeout) {
    std::unique_lock<std::mutex> lock(mutex);
    settled.wait_for(lock, timeout, [this]() { return current != State::Waiting; });
    return current;
}

PendingAnswer::State PendingAnswer::state() const {
    std::lock_guard<std::mutex> lock(mutex);
    return current;
}

ClientAnswer PendingAnswer::answer() const {
    std::lock_guard<std::mutex> lock(mutex);
    return result;
}

void PendingAnswer::settle(State outcome, const ClientAnswer& answer) {
    std::function<void()> notify;
    {
        std::lock_guard<std::mutex> lock(mutex);
        if (current != State::Waiting)
            return;
        current = outcome;
        result = answer;
        notify = std::move(listener);
    }
    settled.notify_all();
    if (notify)
        notify();
}
