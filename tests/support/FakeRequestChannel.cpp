#include "FakeRequestChannel.h"

namespace {
int contextTag;
}

IPluginRequestChannel::Context FakeRequestChannel::contextValue() {
    return &contextTag;
}

IPluginRequestChannel::Context FakeRequestChannel::GetRequestContext() {
    return contextValue();
}

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

int FakeRequestChannel::count() const {
    std::lock_guard<std::mutex> lock(mutex);
    return requests.size();
}

void FakeRequestChannel::reply(int index, bool success, const QString& message,
                               const QString& relayPath, const QString& statusCode,
                               const QString& replyText, bool flag) const {
    PluginReplyCallback callback;
    {
        std::lock_guard<std::mutex> lock(mutex);
        callback = requests.at(index).info.callback;
    }
    callback(success, message, relayPath, statusCode, replyText, flag);
}
