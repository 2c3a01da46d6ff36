#pragma once

#include "EventLoopWait.h"
#include "PluginFramework.h"

#include <QElapsedTimer>
#include <QJsonObject>

#include <algorithm>
#include <map>
#include <memory>
#include <mutex>

// Counts the answers that each client request gets, on any thread, keeping the first one and when
// it came, and those that came after close(). The callbacks share the state, so they may outlive
// the ledger.
class AnswerLedger {
public:
    struct Entry {
        int calls = 0;
        qint64 elapsedMs = -1; // from the ledger's creation to the first answer
        QJsonObject first;     // handled, code, message and payload
    };

    AnswerLedger() { shared->clock.start(); }

    // The callback for request id; the request then counts as expected.
    ResponseCallback callback(int id) {
        std::lock_guard<std::mutex> lock(shared->mutex);
        shared->entries[id];
        return [shared = shared, id](bool handled, const QString& code, const QString& message,
                                     const QVariant& payload) {
            std::lock_guard<std::mutex> lock(shared->mutex);
            ++shared->calls;
            if (shared->closed)
                ++shared->late;
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

    // Runs the Qt event loop until every expected request has an answer or timeoutMs passed.
    bool waitForAll(int timeoutMs) const {
        return runEventLoopUntil(
            [this] {
                std::lock_guard<std::mutex> lock(shared->mutex);
                return std::all_of(shared->entries.begin(), shared->entries.end(),
                                   [](const auto& entry) { return entry.second.calls > 0; });
            },
            timeoutMs);
    }

    Entry entry(int id) const {
        std::lock_guard<std::mutex> lock(shared->mutex);
        const auto found = shared->entries.find(id);
        return found == shared->entries.end() ? Entry() : found->second;
    }

    // Answers from now on count as late, such as those after a plugin's destructor returned.
    void close() {
        std::lock_guard<std::mutex> lock(shared->mutex);
        shared->closed = true;
    }
    int late() const {
        std::lock_guard<std::mutex> lock(shared->mutex);
        return shared->late;
    }

    // All answers so far, to any request.
    int calls() const {
        std::lock_guard<std::mutex> lock(shared->mutex);
        return shared->calls;
    }

private:
    struct Shared {
        std::mutex mutex;
        QElapsedTimer clock;
        std::map<int, Entry> entries;
        int calls = 0;
        bool closed = false;
        int late = 0;
    };
    std::shared_ptr<Shared> shared = std::make_shared<Shared>();
};
