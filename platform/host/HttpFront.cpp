#include "HttpFront.h"

#include "HostJson.h"
#include "HostLog.h"
#include "HttpEventStream.h"
#include "PendingAnswer.h"
#include "PluginHost.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <arpa/inet.h>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <microhttpd.h>
#include <netdb.h>
#include <sys/socket.h>
#include <unistd.h>

namespace {

const char JSON_TYPE[] = "application/json";
// How much of an event stream the server asks for at a time.
const size_t STREAM_BLOCK = 4096;
const int MAX_SUBSCRIBER_LENGTH = 128;

QByteArray errorJson(const QByteArray& reason) {
    return QJsonDocument(QJsonObject{{QStringLiteral("error"), QString::fromUtf8(reason)}})
        .toJson(QJsonDocument::Compact);
}

const char* header(MHD_Connection* connection, const char* name) {
    return MHD_lookup_connection_value(connection, MHD_HEADER_KIND, name);
}

// "application/json", with parameters such as charset or without.
bool isJson(const char* contentType) {
    return contentType && QByteArray(contentType).split(';').first().trimmed().toLower() ==
                              QByteArrayLiteral("application/json");
}

// A subscriber id the plugins and the logs can take as it is.
bool isSubscriberId(const QString& id) {
    if (id.isEmpty() || id.size() > MAX_SUBSCRIBER_LENGTH)
        return false;
    for (const QChar c : id) {
        if (c.category() == QChar::Other_Control || c.category() == QChar::Other_Format)
            return false;
    }
    return true;
}

RequestSenderInfo senderOf(MHD_Connection* connection) {
    const MHD_ConnectionInfo* info =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    char address[INET6_ADDRSTRLEN] = "?";
    unsigned port = 0;
    if (info && info->client_addr && info->client_addr->sa_family == AF_INET) {
        const auto* ip4 = reinterpret_cast<const sockaddr_in*>(info->client_addr);
        inet_ntop(AF_INET, &ip4->sin_addr, address, sizeof address);
        port = ntohs(ip4->sin_port);
    } else if (info && info->client_addr && info->client_addr->sa_family == AF_INET6) {
        const auto* ip6 = reinterpret_cast<const sockaddr_in6*>(info->client_addr);
        inet_ntop(AF_INET6, &ip6->sin6_addr, address, sizeof address);
        port = ntohs(ip6->sin6_port);
    }
    return RequestSenderInfo{QStringLiteral("http"),
                             QStringLiteral("%1:%2").arg(QLatin1String(address)).arg(port)};
}

} // namespace

// One request of the front, from its headers to its answer, in the library's per-request slot.
// Used on the server's thread only; the park is what other threads reach.
struct HttpFront::Exchange {
    enum class State { Receiving, Waiting, Answered };

    State state = State::Receiving;
    QByteArray body;
    std::shared_ptr<PendingAnswer> pending;
    std::shared_ptr<ConnectionPark> park;
    RequestClock::Clock::time_point deadline;
};

// The library's callbacks, each with the front as its closure.
struct HttpFront::Callbacks {
    static MHD_Result request(void* front, MHD_Connection* connection, const char* url,
                              const char* method, const char*, const char* upload,
                              size_t* uploadSize, void** slot) {
        return static_cast<HttpFront*>(front)->handle(connection, url, method, upload, uploadSize,
                                                      slot)
                   ? MHD_YES
                   : MHD_NO;
    }

    static void completed(void* front, MHD_Connection* connection, void** slot,
                          MHD_RequestTerminationCode) {
        static_cast<HttpFront*>(front)->finish(connection, static_cast<Exchange*>(*slot));
        *slot = nullptr;
    }

    static void connection(void* front, MHD_Connection* connection, void**,
                           MHD_ConnectionNotificationCode code) {
        RequestClock& clock = static_cast<HttpFront*>(front)->requestClock;
        if (code == MHD_CONNECTION_NOTIFY_STARTED) {
            const MHD_ConnectionInfo* info =
                MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD);
            if (info)
                clock.opened(connection, info->connect_fd);
        } else {
            clock.closed(connection);
        }
    }

    static ssize_t readStream(void* stream, uint64_t, char* buffer, size_t max) {
        const ssize_t count = static_cast<HttpEventStream*>(stream)->read(buffer, max);
        return count < 0 ? MHD_CONTENT_READER_END_OF_STREAM : count;
    }

    static void endStream(void* stream) { delete static_cast<HttpEventStream*>(stream); }

    // The library's own messages, cut to a line and without control characters.
    static void log(void*, const char* format, va_list args) {
        char text[256];
        std::vsnprintf(text, sizeof text, format, args);
        for (char* c = text; *c; ++c) {
            if (static_cast<unsigned char>(*c) < 0x20 || *c == 0x7f)
                *c = ' ';
        }
        hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "HTTP server: %s", text);
    }
};

HttpFront::HttpFront(PluginHost& host, IPluginObjectBase& plugin)
    : host(host)
    , plugin(plugin) {}

HttpFront::~HttpFront() {
    stop();
}

bool HttpFront::listen(const QString& address, quint16 port, QString* error) {
    addrinfo hints{};
    hints.ai_family = AF_UNSPEC;
    hints.ai_socktype = SOCK_STREAM;
    hints.ai_flags = AI_PASSIVE | AI_NUMERICSERV;
    addrinfo* found = nullptr;
    const int resolved = getaddrinfo(address.toUtf8().constData(),
                                     QByteArray::number(port).constData(), &hints, &found);
    if (resolved != 0) {
        *error = QStringLiteral("cannot listen on %1:%2: %3")
                     .arg(address)
                     .arg(port)
                     .arg(QString::fromLocal8Bit(gai_strerror(resolved)));
        return false;
    }
    int failure = 0;
    for (const addrinfo* candidate = found; candidate && listenFd < 0;
         candidate = candidate->ai_next) {
        const int fd = ::socket(candidate->ai_family,
                                candidate->ai_socktype | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
        const int on = 1;
        if (fd >= 0 && ::setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) == 0 &&
            ::bind(fd, candidate->ai_addr, candidate->ai_addrlen) == 0 &&
            ::listen(fd, SOMAXCONN) == 0) {
            listenFd = fd;
        } else {
            failure = errno;
            if (fd >= 0)
                ::close(fd);
        }
    }
    freeaddrinfo(found);
    if (listenFd < 0) {
        *error = QStringLiteral("cannot listen on %1:%2: %3")
                     .arg(address)
                     .arg(port)
                     .arg(QString::fromLocal8Bit(std::strerror(failure)));
        return false;
    }
    sockaddr_storage bound{};
    socklen_t length = sizeof bound;
    ::getsockname(listenFd, reinterpret_cast<sockaddr*>(&bound), &length);
    boundPort =
        ntohs(bound.ss_family == AF_INET6 ? reinterpret_cast<const sockaddr_in6*>(&bound)->sin6_port
                                          : reinterpret_cast<const sockaddr_in*>(&bound)->sin_port);
    return true;
}

quint16 HttpFront::port() const {
    return boundPort;
}

bool HttpFront::start(const FrontGate& gate, QString* error) {
    this->gate = gate;
    const unsigned timeoutSeconds =
        std::chrono::duration_cast<std::chrono::seconds>(REQUEST_TIME).count();
    // The logger first, so that no message goes to the library's own.
    daemon = MHD_start_daemon(
        MHD_USE_EPOLL_INTERNAL_THREAD | MHD_ALLOW_SUSPEND_RESUME | MHD_USE_ERROR_LOG, 0, nullptr,
        nullptr, &Callbacks::request, this, MHD_OPTION_EXTERNAL_LOGGER, &Callbacks::log, this,
        MHD_OPTION_LISTEN_SOCKET, listenFd, MHD_OPTION_CONNECTION_LIMIT, MAX_CONNECTIONS,
        MHD_OPTION_CONNECTION_TIMEOUT, timeoutSeconds, MHD_OPTION_CONNECTION_MEMORY_LIMIT,
        CONNECTION_MEMORY, MHD_OPTION_NOTIFY_COMPLETED, &Callbacks::completed, this,
        MHD_OPTION_NOTIFY_CONNECTION, &Callbacks::connection, this, MHD_OPTION_END);
    if (!daemon) {
        *error = QStringLiteral("cannot start the HTTP server on port %1").arg(boundPort);
        return false;
    }
    clockThread = std::thread([this]() { runClock(); });
    return true;
}

void HttpFront::stop() {
    if (stopped.exchange(true))
        return;
    {
        std::lock_guard<std::mutex> lock(clockMutex);
        clockStopping = true;
    }
    clockStop.notify_all();
    if (clockThread.joinable())
        clockThread.join();
    host.closeEventStreams();
    // No connection may stay suspended when the server stops.
    parking.closeAll();
    if (daemon) {
        // The listening socket comes back to us, to close once the server's thread is gone.
        const MHD_socket returned = MHD_quiesce_daemon(daemon);
        MHD_stop_daemon(daemon);
        daemon = nullptr;
        if (returned != MHD_INVALID_SOCKET)
            ::close(returned);
    } else if (listenFd >= 0) {
        ::close(listenFd);
    }
    listenFd = -1;
}

bool HttpFront::handle(MHD_Connection* connection, const char* url, const char* method,
                       const char* upload, size_t* uploadSize, void** slot) {
    auto* exchange = static_cast<Exchange*>(*slot);
    if (!exchange) {
        // The headers are in: whatever is refused is refused before its body is read.
        exchange = new Exchange;
        *slot = exchange;
        return begin(connection, *exchange, url, method);
    }
    switch (exchange->state) {
    case Exchange::State::Receiving:
        if (*uploadSize > 0) {
            // Content-Length was checked against the limit; this keeps the client to it.
            if (exchange->body.size() + static_cast<qsizetype>(*uploadSize) > MAX_BODY)
                return false;
            exchange->body.append(upload, static_cast<qsizetype>(*uploadSize));
            *uploadSize = 0;
            return true;
        }
        requestClock.received(connection);
        return sendRequest(connection, *exchange);
    case Exchange::State::Waiting:
        return awaitAnswer(connection, *exchange);
    case Exchange::State::Answered:
        break;
    }
    *uploadSize = 0;
    return true;
}

bool HttpFront::begin(MHD_Connection* connection, Exchange& exchange, const char* url,
                      const char* method) {
    if (MHD_get_connection_values(connection, MHD_HEADER_KIND, nullptr, nullptr) > MAX_HEADERS)
        return refuse(connection, exchange, MHD_HTTP_REQUEST_HEADER_FIELDS_TOO_LARGE,
                      "too many header fields");
    const FrontGate::Verdict verdict =
        gate.admit(header(connection, "Host"), header(connection, "Origin"),
                   header(connection, "Authorization"));
    if (verdict.status == MHD_HTTP_UNAUTHORIZED)
        return refuse(connection, exchange, MHD_HTTP_UNAUTHORIZED, verdict.reason,
                      MHD_HTTP_HEADER_WWW_AUTHENTICATE, "Bearer");
    if (verdict.status != 0)
        return refuse(connection, exchange, static_cast<unsigned>(verdict.status), verdict.reason);

    const QByteArray path(url);
    const bool isGet = std::strcmp(method, MHD_HTTP_METHOD_GET) == 0;
    if (path == "/api/request") {
        if (std::strcmp(method, MHD_HTTP_METHOD_POST) != 0)
            return refuse(connection, exchange, MHD_HTTP_METHOD_NOT_ALLOWED, "use POST",
                          MHD_HTTP_HEADER_ALLOW, MHD_HTTP_METHOD_POST);
        if (!isJson(header(connection, MHD_HTTP_HEADER_CONTENT_TYPE)))
            return refuse(connection, exchange, MHD_HTTP_UNSUPPORTED_MEDIA_TYPE,
                          "the body must be application/json");
        if (header(connection, MHD_HTTP_HEADER_TRANSFER_ENCODING))
            return refuse(connection, exchange, MHD_HTTP_LENGTH_REQUIRED,
                          "send the body with a Content-Length");
        const char* length = header(connection, MHD_HTTP_HEADER_CONTENT_LENGTH);
        bool valid = true;
        if (length && QByteArray(length).toULongLong(&valid) > static_cast<quint64>(MAX_BODY))
            return refuse(connection, exchange, MHD_HTTP_CONTENT_TOO_LARGE,
                          "the body may be at most 64 KiB");
        if (!valid)
            return refuse(connection, exchange, MHD_HTTP_BAD_REQUEST, "a bad Content-Length");
        return true;
    }
    if (path == "/api/events" || path == "/api/plugins") {
        if (!isGet)
            return refuse(connection, exchange, MHD_HTTP_METHOD_NOT_ALLOWED, "use GET",
                          MHD_HTTP_HEADER_ALLOW, MHD_HTTP_METHOD_GET);
        if (path == "/api/events")
            return openStream(connection, exchange);
        return answer(connection, exchange, MHD_HTTP_OK, HostJson::plugins(host.plugins()));
    }
    return refuse(connection, exchange, MHD_HTTP_NOT_FOUND,
                  "no such path; there are /api/request, /api/events and /api/plugins");
}

bool HttpFront::sendRequest(MHD_Connection* connection, Exchange& exchange) {
    QJsonParseError parseError{};
    const QJsonDocument document = QJsonDocument::fromJson(exchange.body, &parseError);
    exchange.body = QByteArray();
    if (parseError.error != QJsonParseError::NoError || !document.isObject()) {
        const QByteArray why = parseError.error != QJsonParseError::NoError
                                   ? parseError.errorString().toUtf8()
                                   : QByteArrayLiteral("the body is not an object");
        return refuse(connection, exchange, MHD_HTTP_BAD_REQUEST,
                      "expected a JSON object {\"command\": \"...\", \"params\": ...}: " + why);
    }
    const QJsonObject body = document.object();
    const QJsonValue command = body.value(QStringLiteral("command"));
    if (!command.isString())
        return refuse(connection, exchange, MHD_HTTP_BAD_REQUEST, "\"command\" must be a string");
    exchange.park = parking.enter(connection);
    if (!exchange.park)
        return refuse(connection, exchange, MHD_HTTP_SERVICE_UNAVAILABLE, "the server is stopping");

    exchange.pending = PendingAnswer::create();
    const std::shared_ptr<ConnectionPark> park = exchange.park;
    exchange.pending->setListener([park]() { park->wake(); });
    exchange.deadline = RequestClock::Clock::now() + ANSWER_TIMEOUT;
    exchange.state = Exchange::State::Waiting;
    plugin.Request(command.toString(), HostJson::parameter(body.value(QStringLiteral("params"))),
                   senderOf(connection), exchange.pending->callback());
    return awaitAnswer(connection, exchange);
}

bool HttpFront::awaitAnswer(MHD_Connection* connection, Exchange& exchange) {
    for (;;) {
        const PendingAnswer::State state = exchange.pending->state();
        if (state == PendingAnswer::State::Answered)
            return answer(connection, exchange, MHD_HTTP_OK,
                          HostJson::answer(exchange.pending->answer()));
        if (state == PendingAnswer::State::Abandoned || exchange.park->isClosed() ||
            RequestClock::Clock::now() >= exchange.deadline)
            return answer(connection, exchange, MHD_HTTP_GATEWAY_TIMEOUT, HostJson::notAnswered());
        // Woken by the answer, the clock or the stop.
        if (exchange.park->park())
            return true;
    }
}

bool HttpFront::openStream(MHD_Connection* connection, Exchange& exchange) {
    const QString subscriberId = QString::fromUtf8(
        MHD_lookup_connection_value(connection, MHD_GET_ARGUMENT_KIND, "subscriber"));
    if (!isSubscriberId(subscriberId))
        return refuse(connection, exchange, MHD_HTTP_BAD_REQUEST,
                      "expected /api/events?subscriber=ID, ID of 1 to 128 characters without "
                      "control characters");
    {
        std::lock_guard<std::mutex> lock(streamMutex);
        if (openStreams >= MAX_EVENT_STREAMS)
            return refuse(connection, exchange, MHD_HTTP_SERVICE_UNAVAILABLE,
                          "256 event streams are open already");
        ++openStreams;
    }
    const std::shared_ptr<ConnectionPark> park = parking.enter(connection);
    if (!park) {
        releaseStream();
        return refuse(connection, exchange, MHD_HTTP_SERVICE_UNAVAILABLE, "the server is stopping");
    }
    const std::shared_ptr<EventQueue> queue =
        host.openEventStream(subscriberId, senderOf(connection));
    queue->setListener([park]() { park->wake(); });
    PluginHost* owner = &host;
    auto* stream = new HttpEventStream(queue, park, [this, owner, subscriberId, queue, park]() {
        owner->closeEventStream(subscriberId, queue);
        parking.leave(park);
        releaseStream();
    });
    MHD_Response* response = MHD_create_response_from_callback(
        MHD_SIZE_UNKNOWN, STREAM_BLOCK, &Callbacks::readStream, stream, &Callbacks::endStream);
    if (!response) {
        delete stream;
        return false;
    }
    MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, "text/event-stream");
    MHD_add_response_header(response, MHD_HTTP_HEADER_CACHE_CONTROL, "no-cache");
    exchange.state = Exchange::State::Answered;
    requestClock.received(connection);
    const MHD_Result queued = MHD_queue_response(connection, MHD_HTTP_OK, response);
    MHD_destroy_response(response);
    return queued == MHD_YES;
}

bool HttpFront::answer(MHD_Connection* connection, Exchange& exchange, unsigned status,
                       const QByteArray& body, const char* header, const char* headerValue) {
    exchange.state = Exchange::State::Answered;
    requestClock.received(connection);
    const QByteArray text = body + '\n';
    MHD_Response* response =
        MHD_create_response_from_buffer(static_cast<size_t>(text.size()),
                                        const_cast<char*>(text.constData()), MHD_RESPMEM_MUST_COPY);
    if (!response)
        return false;
    MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, JSON_TYPE);
    if (header)
        MHD_add_response_header(response, header, headerValue);
    const MHD_Result queued = MHD_queue_response(connection, status, response);
    MHD_destroy_response(response);
    return queued == MHD_YES;
}

bool HttpFront::refuse(MHD_Connection* connection, Exchange& exchange, unsigned status,
                       const QByteArray& reason, const char* header, const char* headerValue) {
    return answer(connection, exchange, status, errorJson(reason), header, headerValue);
}

void HttpFront::finish(MHD_Connection* connection, Exchange* exchange) {
    if (exchange && exchange->park)
        parking.leave(exchange->park);
    delete exchange;
    requestClock.restart(connection);
}

void HttpFront::releaseStream() {
    std::lock_guard<std::mutex> lock(streamMutex);
    --openStreams;
}

void HttpFront::runClock() {
    std::unique_lock<std::mutex> lock(clockMutex);
    while (!clockStop.wait_for(lock, HEARTBEAT, [this]() { return clockStopping; })) {
        lock.unlock();
        parking.tickAll();
        const int cut = requestClock.cutOverdue(RequestClock::Clock::now());
        if (cut > 0)
            hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__,
                            "cut off %d connection(s) that sent no whole request within %lld ms",
                            cut, static_cast<long long>(REQUEST_TIME.count()));
        lock.lock();
    }
}
