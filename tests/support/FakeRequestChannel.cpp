#include "FakeRequestChannel.h"

bool FakeRequestChannel::SendRequest(const QString& pluginID, Context context, int kind,
                                     const QString& command, PluginRequestInfo& info) {
    std::lock_guard<std::mutex> lock(mutex);
    requests.append(Sent{pluginID, context, kind, command, info});
    return true;
}

QList<FakeRequestChannel::Sent> FakeRequestChannel::sent() const {
    std::lock_guard<std::mutex> lock(mutex);
    return requests;
}

void FakeRequestChannel::reply(int index, bool success, const QString& message,
                               const QString& relayPath, const QString& statusCode,
                               const QString& replyText, bool flag) const {
    sent().at(index).info.callback(success, message, relayPath, statusCode, replyText, flag);
}
