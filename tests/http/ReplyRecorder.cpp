#include "ReplyRecorder.h"

#include <QDeadlineTimer>
#include <QMutexLocker>

ReplyRecorder::ReplyRecorder()
    : shared(std::make_shared<Shared>()) {}

HttpReplyCallback ReplyRecorder::callback(int id) const {
    return [shared = shared, id](QNetworkReply::NetworkError error, const QByteArray& headers,
                                 const QByteArray& body, bool reachedServer) {
        QMutexLocker lock(&shared->mutex);
        std::vector<Reply>& replies = shared->replies[id];
        if (replies.empty())
            shared->order.push_back(id);
        replies.push_back({error, headers, body, reachedServer, QThread::currentThread()});
        shared->changed.wakeAll();
    };
}

bool ReplyRecorder::waitFor(int count, int timeoutMs) const {
    const QDeadlineTimer deadline(timeoutMs);
    QMutexLocker lock(&shared->mutex);
    while (static_cast<int>(shared->replies.size()) < count) {
        if (!shared->changed.wait(&shared->mutex, deadline))
            return static_cast<int>(shared->replies.size()) >= count;
    }
    return true;
}

int ReplyRecorder::answered() const {
    QMutexLocker lock(&shared->mutex);
    return static_cast<int>(shared->replies.size());
}

int ReplyRecorder::calls(int id) const {
    QMutexLocker lock(&shared->mutex);
    const auto found = shared->replies.find(id);
    return found == shared->replies.end() ? 0 : static_cast<int>(found->second.size());
}

ReplyRecorder::Reply ReplyRecorder::reply(int id) const {
    QMutexLocker lock(&shared->mutex);
    const auto found = shared->replies.find(id);
    return found == shared->replies.end() || found->second.empty() ? Reply{}
                                                                   : found->second.front();
}

std::vector<int> ReplyRecorder::order() const {
    QMutexLocker lock(&shared->mutex);
    return shared->order;
}
