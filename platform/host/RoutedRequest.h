#pragma once

#include "PluginFramework.h"

#include <mutex>

// One request from a plugin to another. The sender's reply callback is called exactly once, by
// whichever comes first of the answer, the time-out and the host's refusal; later ones are
// dropped, and the callback is released once called.
class RoutedRequest {
public:
    explicit RoutedRequest(PluginReplyCallback callback);

    // Returns whether this call was the one that answered.
    bool deliver(bool success, const QString& message, const QString& relayPath,
                 const QString& statusCode, const QString& replyText, bool flag);

private:
    std::mutex mutex;
    PluginReplyCallback callback;
    bool answered = false;
};
