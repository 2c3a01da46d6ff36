#include "AnswerLedger.h"

#include "EventLoopWait.h"

AnswerLedger::AnswerLedger()
    : shared(std::make_shared<Shared>()) {
    shared->clock.start();
}

ResponseCallback AnswerLedger::callback(int id) {
    {
        std::lock_guard<std::mutex> lock(shared->mutex);
        shared->entries[id];
    }
    return [shared = shared, id](bool handled, const QString& code, const QString& message,
                                 const QVariant& payload) {
        std::lock_guard<std::mutex> lock(shared->mutex);
        if (shared->closed)
            ++shared->late;
        Entry& entry = shared->entries[id];
        if (entry.calls++ == 0)
            entry = Entry{1, shared->clock.elapsed(), handled, code, message, payload};
    };
}

bool AnswerLedger::waitForAll(int timeoutMs) const {
    return runEventLoopUntil([this] { return unanswered() == 0; }, timeoutMs);
}

AnswerLedger::Entry AnswerLedger::entry(int id) const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    const auto found = shared->entries.find(id);
    return found == shared->entries.end() ? Entry() : found->second;
}

int AnswerLedger::answeredTwice() const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    int count = 0;
    for (const auto& [id, entry] : shared->entries)
        count += entry.calls > 1 ? 1 : 0;
    return count;
}

int AnswerLedger::unanswered() const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    int count = 0;
    for (const auto& [id, entry] : shared->entries)
        count += entry.calls == 0 ? 1 : 0;
    return count;
}

void AnswerLedger::close() {
    std::lock_guard<std::mutex> lock(shared->mutex);
    shared->closed = true;
}

int AnswerLedger::late() const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    return shared->late;
}
