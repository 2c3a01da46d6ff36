#include "ReplyRecorder.h"

#include <QMetaEnum>

#include <chrono>

ReplyRecorder::ReplyRecorder()
    : shared(std::make_shared<Shared>()) {}

HttpReplyCallback ReplyRecorder::callback(int id) const {
    return [shared = shared, id](QNetworkReply::NetworkError error, const QByteArray& headers,
                                 const QByteArray& body, bool reachedServer) {
        std::unique_lock<std::mutex> lock(shared->mutex);
        std::vector<Reply>& replies = shared->replies[id];
        if (replies.empty())
            shared->order.push_back(id);
        replies.push_back({error, headers, body, reachedServer, QThread::currentThread()});
        shared->changed.notify_all();
    };
}

bool ReplyRecorder::waitFor(int count, int timeoutMs) const {
    std::unique_lock<std::mutex> lock(shared->mutex);
    return shared->changed.wait_for(lock, std::chrono::milliseconds(timeoutMs), [&] {
        return static_cast<int>(shared->replies.size()) >= count;
    });
}

std::map<int, std::string> ReplyRecorder::said(bool details) const {
    std::unique_lock<std::mutex> lock(shared->mutex);
    std::map<int, std::string> said;
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
    std::unique_lock<std::mutex> lock(shared->mutex);
    const auto found = shared->replies.find(id);
    return found == shared->replies.end() ? Reply{} : found->second.front();
}

std::vector<int> ReplyRecorder::order() const {
    std::unique_lock<std::mutex> lock(shared->mutex);
    return shared->order;
}
