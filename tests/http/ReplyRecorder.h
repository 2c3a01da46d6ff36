#pragma once

#include "ISimpleHTTPClient.h"

#include <QThread>

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

    // The callback holds the recorder's state, not the recorder, so it may outlive it.
    HttpReplyCallback callback(int id = 0) const;
    // Runs this thread's event loop until count distinct ids were answered, or timeoutMs passed.
    bool waitFor(int count, int timeoutMs = 5000) const;
    // By id, every callback as "Error reached: body" (the body's size when large), joined by
    // " | ": exactly one is the contract; "" for an id not answered. Without details, the errors'
    // names alone, for where timing decides the rest.
    std::vector<std::string> said(bool details = true) const;
    Reply first(int id = 0) const;
    // Request ids in the order their first callback arrived.
    std::vector<int> order() const;

private:
    struct Shared {
        // A standard mutex, which ThreadSanitizer sees, unlike Qt's.
        std::mutex mutex;
        std::map<int, std::vector<Reply>> replies;
        std::vector<int> order;
    };
    std::shared_ptr<Shared> shared = std::make_shared<Shared>();
};
