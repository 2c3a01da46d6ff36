#pragma once

#include "ISimpleHTTPClient.h"

#include <QThread>

#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

// Collects reply callbacks, which arrive on the client's worker thread, per request id.
class ReplyRecorder {
public:
    struct Reply {
        QNetworkReply::NetworkError error = QNetworkReply::NoError;
        QByteArray headers;
        QByteArray body;
        bool reachedServer = false;
        QThread* thread = nullptr;
    };

    ReplyRecorder();

    // The callback holds the recorder's state, not the recorder, so it may outlive it.
    HttpReplyCallback callback(int id = 0) const;
    // Waits until callbacks for count distinct ids arrived, or timeoutMs passed.
    bool waitFor(int count, int timeoutMs = 5000) const;
    // Per id, every callback as "Error reached: body" (the body's size when it is large), joined
    // by " | ": exactly one is the contract. Without details, the errors' names alone, for where
    // timing decides the rest.
    std::map<int, std::string> said(bool details = true) const;
    Reply first(int id = 0) const;
    // Request ids in the order their first callback arrived.
    std::vector<int> order() const;

private:
    struct Shared {
        // Standard primitives, which ThreadSanitizer sees, unlike Qt's.
        std::mutex mutex;
        std::condition_variable changed;
        std::map<int, std::vector<Reply>> replies;
        std::vector<int> order;
    };
    std::shared_ptr<Shared> shared;
};
