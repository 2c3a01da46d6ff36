#include "RoutedRequest.h"

RoutedRequest::RoutedRequest(PluginReplyCallback callback)
    : callback(std::move(callback)) {}

bool RoutedRequest::deliver(bool success, const QString& message, const QString& relayPath,
                            const QString& statusCode, const QString& replyText, bool flag) {
    PluginReplyCallback reply;
    {
        std::lock_guard<std::mutex> lock(mutex);
        if (answered)
            return false;
        answered = true;
        reply = std::move(callback);
        callback = nullptr;
    }
    if (reply)
        reply(success, message, relayPath, statusCode, replyText, flag);
    return true;
}
