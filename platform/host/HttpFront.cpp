#include "HttpFront.h"

#include "HostJson.h"
#include "HostLog.h"
#include "PendingAnswer.h"
#include "PluginHost.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <httplib.h>

#include <algorithm>

namespace {

const int THREAD_COUNT = 16;
const char JSON_TYPE[] = "application/json";
const char TEXT_TYPE[] = "text/plain; charset=utf-8";

void reply(httplib::Response& response, int status, const QByteArray& body, const char* type) {
    response.status = status;
    response.set_content(body.toStdString() + "\n", type);
}

RequestSenderInfo senderOf(const httplib::Request& request) {
    return RequestSenderInfo{QStringLiteral("http"),
                             QStringLiteral("%1:%2")
                                 .arg(QString::fromStdString(request.remote_addr))
                                 .arg(request.remote_port)};
}

QByteArray sseEvent(const HostEvent& event) {
    return "event: " + event.eventName.toUtf8() + "\ndata: " + HostJson::event(event) + "\n\n";
}

} // namespace

HttpFront::HttpFront(PluginHost& host, IPluginObjectBase& plugin)
    : host(host)
    , plugin(plugin)
    , server(std::make_unique<httplib::Server>()) {
    server->new_task_queue = []() { return new httplib::ThreadPool(THREAD_COUNT); };
    server->Post("/api/request",
                 [this](const httplib::Request& request, httplib::Response& response) {
                     handleRequest(request, response);
                 });
    server->Get("/api/events",
                [this](const httplib::Request& request, httplib::Response& response) {
                    handleEvents(request, response);
                });
    server->Get("/api/plugins",
                [this](const httplib::Request& request, httplib::Response& response) {
                    handlePlugins(request, response);
                });
}

HttpFront::~HttpFront() {
    stop();
}

bool HttpFront::listen(const QString& address, quint16 port, QString* error) {
    const std::string host = address.toStdString();
    if (port == 0) {
        const int chosen = server->bind_to_any_port(host);
        if (chosen > 0)
            boundPort = static_cast<quint16>(chosen);
    } else if (server->bind_to_port(host, port)) {
        boundPort = port;
    }
    if (boundPort == 0) {
        *error = QStringLiteral("cannot listen on %1:%2").arg(address).arg(port);
        return false;
    }
    return true;
}

quint16 HttpFront::port() const {
    return boundPort;
}

void HttpFront::start() {
    serverThread = std::thread([this]() {
        server->listen_after_bind();
        serverDone = true;
    });
    // The server ignores stop() until its loop runs; wait for that, briefly.
    while (!server->is_running() && !serverDone)
        std::this_thread::yield();
}

void HttpFront::stop() {
    if (stopping.exchange(true))
        return;
    host.closeEventStreams();
    server->stop();
    if (serverThread.joinable())
        serverThread.join();
}

void HttpFront::handleRequest(const httplib::Request& request, httplib::Response& response) {
    QJsonParseError parseError{};
    const QJsonDocument document =
        QJsonDocument::fromJson(QByteArray::fromStdString(request.body), &parseError);
    if (parseError.error != QJsonParseError::NoError || !document.isObject()) {
        reply(response, 400,
              "expected a JSON object {\"command\": \"...\", \"params\": ...}: " +
                  (parseError.error != QJsonParseError::NoError
                       ? parseError.errorString().toUtf8()
                       : QByteArray("the body is not an object")),
              TEXT_TYPE);
        return;
    }
    const QJsonObject body = document.object();
    const QJsonValue command = body.value(QStringLiteral("command"));
    if (!command.isString()) {
        reply(response, 400, "\"command\" must be a string", TEXT_TYPE);
        return;
    }

    auto pending = PendingAnswer::create();
    plugin.Request(command.toString(), HostJson::parameter(body.value(QStringLiteral("params"))),
                   senderOf(request), pending->callback());
    // Waits in slices so that stop() need not wait for a slow answer.
    const auto deadline = std::chrono::steady_clock::now() + ANSWER_TIMEOUT;
    PendingAnswer::State state = PendingAnswer::State::Waiting;
    while (state == PendingAnswer::State::Waiting && !stopping) {
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
            deadline - std::chrono::steady_clock::now());
        if (left.count() <= 0)
            break;
        state = pending->waitFor(std::min(left, HEARTBEAT));
    }
    if (state == PendingAnswer::State::Answered)
        reply(response, 200, HostJson::answer(pending->answer()), JSON_TYPE);
    else
        reply(response, 504, HostJson::notAnswered(), JSON_TYPE);
}

void HttpFront::handleEvents(const httplib::Request& request, httplib::Response& response) {
    const QString subscriberId = QString::fromStdString(request.get_param_value("subscriber"));
    if (subscriberId.isEmpty()) {
        reply(response, 400, "missing the subscriber: /api/events?subscriber=ID", TEXT_TYPE);
        return;
    }
    std::shared_ptr<EventQueue> queue = host.openEventStream(subscriberId, senderOf(request));
    PluginHost* owner = &host;
    response.set_header("Cache-Control", "no-cache");
    response.set_chunked_content_provider(
        "text/event-stream",
        [queue](size_t offset, httplib::DataSink& sink) {
            // A comment first, so that the client knows the subscription stands.
            if (offset == 0) {
                static const char opened[] = ": subscribed\n\n";
                return sink.write(opened, sizeof opened - 1);
            }
            const std::optional<HostEvent> event = queue->next(HEARTBEAT);
            if (queue->isClosed()) {
                sink.done();
                return true;
            }
            if (!event) {
                static const char heartbeat[] = ":\n\n";
                return sink.write(heartbeat, sizeof heartbeat - 1);
            }
            const QByteArray text = sseEvent(*event);
            return sink.write(text.constData(), static_cast<size_t>(text.size()));
        },
        [owner, subscriberId, queue](bool) { owner->closeEventStream(subscriberId, queue); });
}

void HttpFront::handlePlugins(const httplib::Request&, httplib::Response& response) {
    reply(response, 200, HostJson::plugins(host.plugins()), JSON_TYPE);
}
