#pragma once

#include "PluginFramework.h"

#include <QElapsedTimer>
#include <QJsonObject>

#include <map>
#include <memory>
#include <mutex>

// Counts the answers that each client request gets, on any thread, keeping the first one and when
// it came. The callbacks share the state, so they may outlive the ledger.
class AnswerLedger {
public:
    struct Entry {
        int calls = 0;
        qint64 elapsedMs = -1; // from the ledger's creation to the first answer
        QJsonObject first;     // handled, code, message and payload
    };

    AnswerLedger();
    // The callback for request id; the request then counts as expected.
    ResponseCallback callback(int id);
    // Runs the Qt event loop until every expected request has an answer or timeoutMs passed.
    bool waitForAll(int timeoutMs) const;
    Entry entry(int id) const;
    // All answers so far, to any request.
    int calls() const;

private:
    struct Shared {
        std::mutex mutex;
        QElapsedTimer clock;
        std::map<int, Entry> entries;
        int calls = 0;
    };
    std::shared_ptr<Shared> shared = std::make_shared<Shared>();
};
