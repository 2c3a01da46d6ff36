#pragma once

#include "PluginFramework.h"

#include <QElapsedTimer>

#include <map>
#include <memory>
#include <mutex>

// Counts the answers that each client request gets, on any thread, with the first one and when
// it came. Once closed, every further answer is counted as late. The callbacks share the state,
// so they may outlive the ledger.
class AnswerLedger {
public:
    struct Entry {
        int calls = 0;
        qint64 elapsedMs = -1; // from the ledger's creation to the first answer
        bool handled = false;
        QString code;
        QString message;
        QVariant payload;
    };

    AnswerLedger();

    // The callback for request id; the request then counts as expected.
    ResponseCallback callback(int id);
    // Runs the Qt event loop until every expected request has an answer or timeoutMs passed.
    bool waitForAll(int timeoutMs) const;
    Entry entry(int id) const;
    // How many requests were answered more than once, and how many not at all.
    int answeredTwice() const;
    int unanswered() const;

    void close();
    int late() const;

private:
    struct Shared {
        std::mutex mutex;
        QElapsedTimer clock;
        std::map<int, Entry> entries;
        bool closed = false;
        int late = 0;
    };
    std::shared_ptr<Shared> shared;
};
