#include "OpenRequests.h"

#include "ClientResponse.h"
#include "LogText.h"
#include "QuenvarLog.h"

#include <exception>

namespace {

const char SOURCE_FILE[] = "src/OpenRequests";

void logFailure(const QString& command, const char* error) {
    quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, answer to %s failed, %s",
                     "OpenRequests::deliver", LogText::of(command).constData(),
                     LogText::ofError(error).constData());
}

} // namespace

OpenRequests::Id OpenRequests::open(const QString& command, ResponseCallback callback) {
    std::lock_guard<std::mutex> lock(mutex);
    const Id id = next++;
    requests.emplace(id, Request{command, std::move(callback)});
    return id;
}

bool OpenRequests::take(Id id, Request& request) {
    std::lock_guard<std::mutex> lock(mutex);
    const auto found = requests.find(id);
    if (found == requests.end())
        return false;
    request = std::move(found->second);
    requests.erase(found);
    return true;
}

void OpenRequests::answer(Id id, bool handled, const QString& code, const QString& message,
                          const QVariant& payload) {
    gate.pass([&] {
        Request request;
        if (take(id, request))
            deliver(request, handled, code, message, payload);
    });
}

void OpenRequests::fail(Id id) {
    answer(id, true, ClientResponse::CODE_FAILED, QString(), QVariant());
}

void OpenRequests::close() {
    gate.close();
    std::map<Id, Request> unanswered;
    {
        std::lock_guard<std::mutex> lock(mutex);
        unanswered.swap(requests);
    }
    for (const auto& entry : unanswered)
        deliver(entry.second, true, ClientResponse::CODE_FAILED, QString(), QVariant());
}

void OpenRequests::deliver(const Request& request, bool handled, const QString& code,
                           const QString& message, const QVariant& payload) {
    if (!request.callback)
        return;
    try {
        request.callback(handled, code, message, payload);
    } catch (const std::exception& error) {
        logFailure(request.command, error.what());
    } catch (...) {
        logFailure(request.command, nullptr);
    }
}
