#include "AnswerLedger.h"

#include "EventLoopWait.h"

#include <algorithm>

AnswerLedger::AnswerLedger() {
    shared->clock.start();
}

ResponseCallback AnswerLedger::callback(int id) {
    std::lock_guard<std::mutex> lock(shared->mutex);
    shared->entries[id];
    return [shared = shared, id](bool handled, const QString& code, const QString& message,
                                 const QVariant& payload) {
        std::lock_guard<std::mutex> lock(shared->mutex);
        ++shared->calls;
        Entry& entry = shared->entries[id];
        if (entry.calls++ == 0)
            entry = Entry{1,
                          shared->clock.elapsed(),
                          {{"handled", handled},
                           {"code", code},
                           {"message", message},
                           {"payload", QJsonValue::fromVariant(payload)}}};
    };
}

bool AnswerLedger::waitForAll(int timeoutMs) const {
    return runEventLoopUntil(
        [this] {
            std::lock_guard<std::mutex> lock(shared->mutex);
            return std::all_of(shared->entries.begin(), shared->entries.end(),
                               [](const auto& entry) { return entry.second.calls > 0; });
        },
        timeoutMs);
}

AnswerLedger::Entry AnswerLedger::entry(int id) const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    const auto found = shared->entries.find(id);
    return found == shared->entries.end() ? Entry() : found->second;
}

int AnswerLedger::calls() const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    return shared->calls;
}
