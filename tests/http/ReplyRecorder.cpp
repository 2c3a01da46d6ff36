#include "ReplyRecorder.h"

#include "EventLoopWait.h"

#include <QMetaEnum>

HttpReplyCallback ReplyRecorder::callback(int id) const {
    return [shared = shared, id](QNetworkReply::NetworkError error, const QByteArray& headers,
                                 const QByteArray& body, bool reachedServer) {
        std::lock_guard<std::mutex> lock(shared->mutex);
        std::vector<Reply>& replies = shared->replies[id];
        if (replies.empty())
            shared->order.push_back(id);
        replies.push_back({error, headers, body, reachedServer, QThread::currentThread()});
    };
}

bool ReplyRecorder::waitFor(int count, int timeoutMs) const {
    return runEventLoopUntil([this, count] { return int(order().size()) >= count; }, timeoutMs);
}

std::vector<std::string> ReplyRecorder::said(bool details) const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    std::vector<std::string> said(shared->replies.empty() ? 0
                                                          : shared->replies.rbegin()->first + 1);
    for (const auto& [id, replies] : shared->replies) {
        for (const Reply& reply : replies) {
            std::string& text = said[id];
            text += std::string(text.empty() ? "" : " | ") +
                    QMetaEnum::fromType<QNetworkReply::NetworkError>().valueToKey(reply.error);
            if (!details)
                continue;
            text += reply.reachedServer ? " reached" : " unreached";
            if (reply.body.size() > 256)
                text += ": " + std::to_string(reply.body.size()) + " bytes";
            else if (!reply.body.isEmpty())
                text += ": " + reply.body.toStdString();
        }
    }
    return said;
}

ReplyRecorder::Reply ReplyRecorder::first(int id) const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    const auto found = shared->replies.find(id);
    return found == shared->replies.end() ? Reply{} : found->second.front();
}

std::vector<int> ReplyRecorder::order() const {
    std::lock_guard<std::mutex> lock(shared->mutex);
    return shared->order;
}
