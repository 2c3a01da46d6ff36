#include "WendrelWorker.h"

#include "Wendrel.h"
#include "WendrelLog.h"
#include "WendrelRequestWriter.h"
#include "WendrelUrl.h"

#include <QCoreApplication>

#include <algorithm>
#include <climits>
#include <openssl/crypto.h>
#include <utility>

#if !defined(_WIN32)
#include <sys/resource.h>
#endif

namespace {

qint64 millisecondsSince(std::chrono::steady_clock::time_point then,
                         std::chrono::steady_clock::time_point now) {
    return std::chrono::duration_cast<std::chrono::milliseconds>(now - then).count();
}

// Half the descriptors the process may open, so that the rest of the host keeps its share.
int connectionLimit(int wanted) {
#if !defined(_WIN32)
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur != RLIM_INFINITY)
        wanted = int(std::min<rlim_t>(rlim_t(wanted), limit.rlim_cur / 2));
#endif
    return std::max(wanted, 1);
}

} // namespace

WendrelWorker::WendrelWorker(const WendrelSettings& settings)
    : tls(settings)
    , idleTimeout(std::max(settings.idleTimeoutMs, 0))
    , maxConnections(connectionLimit(settings.maxConnections))
    , deadlineTimer(this)
    , idleTimer(this) {
    deadlineTimer.setSingleShot(true);
    deadlineTimer.setTimerType(Qt::PreciseTimer);
    connect(&deadlineTimer, &QTimer::timeout, this, &WendrelWorker::expireDeadlines);
    idleTimer.setSingleShot(true);
    connect(&idleTimer, &QTimer::timeout, this, &WendrelWorker::closeIdleConnections);
}

WendrelWorker::~WendrelWorker() {
    // The connections and their sockets first, then the thread's OpenSSL state, which would
    // otherwise be freed only after QThread::wait() returned: a process that ends right after
    // destroying its client would then leave it behind.
    const QObjectList owned = children();
    for (QObject* child : owned) {
        // Every child but the timers is a connection.
        if (child != &deadlineTimer && child != &idleTimer)
            delete child;
    }
    OPENSSL_thread_stop();
}

void WendrelWorker::start(WendrelRequest request) {
    WendrelFailure refusal;
    if (closing)
        refusal = {QNetworkReply::OperationCanceledError, "cancelled: the client is shutting down"};
    else if (request.url.host().isEmpty())
        refusal = {QNetworkReply::HostNotFoundError, "no host given"};
    else if (!WendrelUrl::isHttp(request.url))
        refusal = {QNetworkReply::ProtocolUnknownError, "only http and https are served"};
    else if (const char* field = WendrelRequestWriter::unsafeField(request))
        refusal = {QNetworkReply::ProtocolInvalidOperationError,
                   QByteArray("refused without sending: ") + field};
    else if (request.deadline && *request.deadline <= Clock::now())
        refusal = {QNetworkReply::TimeoutError, "timed out before it could start"};
    if (refusal.failed()) {
        answer(request, refusal, {}, {}, false);
        return;
    }

    const Id id = nextId++;
    QString key = WendrelUrl::origin(request.url);
    const auto [found, added] = origins.try_emplace(key);
    Origin& origin = found->second;
    if (added)
        origin.key = key;
    ++origin.requests;
    const auto deadline =
        request.deadline ? deadlines.emplace(*request.deadline, id) : deadlines.end();
    pending.emplace(id, Pending{WendrelExchange(std::move(request), std::move(key)), &origin,
                                nullptr, std::nullopt, deadline});
    if (deadline != deadlines.end() && deadline == deadlines.begin())
        armDeadlineTimer();
    // Behind those already waiting for the server.
    origin.waiting.push_back(id);
    launchWaiting(origin);
}

void WendrelWorker::shutdown() {
    closing = true;
    // Requests posted before the client stopped accepting, when shutdown does not run as a
    // queued call behind them.
    QCoreApplication::sendPostedEvents(this, QEvent::MetaCall);
    std::vector<Id> ids;
    ids.reserve(pending.size());
    for (const auto& entry : pending)
        ids.push_back(entry.first);
    for (const Id id : ids)
        abortRequest(id, QNetworkReply::OperationCanceledError);
    deadlineTimer.stop();
    idleTimer.stop();
    for (const Idle& idle : idleConnections)
        idle.connection->close();
    idleConnections.clear();
    for (auto& origin : origins)
        origin.second.idle.clear();
}

// Room for one more exchange with origin's server: an idle connection, or one more under both
// limits, made by closing the longest idle connection to another server when need be.
bool WendrelWorker::hasRoom(Origin& origin) {
    if (!origin.idle.empty())
        return true;
    if (origin.open >= connectionsPerOrigin)
        return false;
    if (openConnections < maxConnections)
        return true;
    if (idleConnections.empty())
        return false;
    closeIdle(idleConnections.begin());
    return true;
}

void WendrelWorker::launch(Id id, bool newConnection) {
    Pending& entry = pending.at(id);
    Origin& origin = *entry.origin;
    WendrelConnection* connection = nullptr;
    if (!newConnection && !origin.idle.empty()) {
        const IdleList::iterator idle = origin.idle.back();
        origin.idle.pop_back();
        connection = idle->connection;
        idleConnections.erase(idle);
    } else {
        const QUrl& url = entry.exchange.request().url;
        connection = new WendrelConnection(
            url.host(), WendrelUrl::port(url), WendrelUrl::isHttps(url) ? &tls : nullptr,
            maxBodySize,
            [this, server = &origin](WendrelConnection* gone) { dropped(*server, gone); }, this);
        ++origin.open;
        ++openConnections;
    }
    if (!entry.firstConnection)
        entry.firstConnection = Clock::now();
    entry.connection = connection;
    connection->send(entry.exchange.message(authentication),
                     [this, id](WendrelConnection* ended, WendrelConnection::Outcome outcome) {
                         exchangeEnded(id, ended, std::move(outcome));
                     });
}

// A launch never ends inside the call: connections report from the event loop.
void WendrelWorker::launchWaiting(Origin& origin) {
    const Clock::time_point now = Clock::now();
    while (!closing && !origin.waiting.empty()) {
        const auto entry = pending.find(origin.waiting.front());
        // One whose deadline passed while it waited is left to expireDeadlines, unsent.
        if (entry == pending.end() ||
            (entry->second.deadline != deadlines.end() && entry->second.deadline->first <= now)) {
            origin.waiting.pop_front();
            continue;
        }
        if (!hasRoom(origin)) {
            // Held by the limit on all connections, not by its own: another server's
            // connection that closes makes room for it.
            if (origin.open < connectionsPerOrigin &&
                std::find(blocked.begin(), blocked.end(), origin.key) == blocked.end())
                blocked.push_back(origin.key);
            return;
        }
        origin.waiting.pop_front();
        launch(entry->first, false);
    }
}

// Room under the limit on all connections, or an idle connection to close for it.
void WendrelWorker::launchBlocked() {
    while (!closing && !blocked.empty() &&
           (openConnections < maxConnections || !idleConnections.empty())) {
        const auto found = origins.find(blocked.front());
        blocked.pop_front();
        if (found != origins.end())
            launchWaiting(found->second);
    }
}

void WendrelWorker::exchangeEnded(Id id, WendrelConnection* connection,
                                  WendrelConnection::Outcome outcome) {
    Pending& entry = pending.at(id);
    entry.connection = nullptr;
    Origin& origin = *entry.origin;
    const WendrelExchange::Next next = entry.exchange.next(outcome, authentication);
    // One that cannot carry another exchange has closed itself.
    if (connection->state() == WendrelConnection::State::Idle) {
        idleConnections.push_back({connection, &origin, Clock::now()});
        origin.idle.push_back(std::prev(idleConnections.end()));
        if (!idleTimer.isActive())
            armIdleTimer();
    } else {
        closed(origin);
    }
    switch (next.action) {
    case WendrelExchange::Action::Send:
        launch(id, false);
        return;
    case WendrelExchange::Action::SendOnNewConnection:
        launch(id, true);
        return;
    case WendrelExchange::Action::Complete:
        break;
    }
    complete(id, next.failure, outcome.answer.headers, outcome.answer.body, outcome.reachedServer);
    launchWaiting(origin);
    launchBlocked();
    forgetIfUnused(origin);
}

void WendrelWorker::dropped(Origin& origin, WendrelConnection* connection) {
    connection->close();
    const auto idle =
        std::find_if(origin.idle.begin(), origin.idle.end(),
                     [connection](IdleList::iterator it) { return it->connection == connection; });
    if (idle != origin.idle.end()) {
        idleConnections.erase(*idle);
        origin.idle.erase(idle);
    }
    closed(origin);
    launchWaiting(origin);
    launchBlocked();
    forgetIfUnused(origin);
}

void WendrelWorker::closed(Origin& origin) {
    --origin.open;
    --openConnections;
}

void WendrelWorker::closeIdle(IdleList::iterator idle) {
    Origin& origin = *idle->origin;
    idle->connection->close();
    origin.idle.erase(std::find(origin.idle.begin(), origin.idle.end(), idle));
    idleConnections.erase(idle);
    closed(origin);
    forgetIfUnused(origin);
}

void WendrelWorker::closeIdleConnections() {
    const Clock::time_point now = Clock::now();
    while (!idleConnections.empty() && idleConnections.front().since + idleTimeout <= now)
        closeIdle(idleConnections.begin());
    armIdleTimer();
}

// A server's entry lives while it has a connection or a request. Entries stay once the worker
// is closing: a callback that destroys the client runs inside calls that still use them.
void WendrelWorker::forgetIfUnused(Origin& origin) {
    if (closing || origin.open > 0 || origin.requests > 0)
        return;
    const QString key = origin.key;
    blocked.erase(std::remove(blocked.begin(), blocked.end(), key), blocked.end());
    origins.erase(key);
}

void WendrelWorker::abortRequest(Id id, QNetworkReply::NetworkError reason) {
    const auto found = pending.find(id);
    if (found == pending.end())
        return;
    Pending& entry = found->second;
    Origin& origin = *entry.origin;
    const WendrelFailure failure = abortFailure(entry, reason);
    WendrelConnection* connection = std::exchange(entry.connection, nullptr);
    bool reachedServer = false;
    if (connection) {
        reachedServer = connection->reachedServer();
        connection->close();
        closed(origin);
    }
    // One still waiting for its turn leaves its place in the queue, skipped later.
    complete(id, failure, {}, {}, reachedServer);
    launchWaiting(origin);
    launchBlocked();
    forgetIfUnused(origin);
}

WendrelFailure WendrelWorker::abortFailure(const Pending& entry,
                                           QNetworkReply::NetworkError reason) const {
    if (reason != QNetworkReply::TimeoutError)
        return {reason, "cancelled: the client is shutting down"};
    const WendrelRequest& request = entry.exchange.request();
    const Clock::time_point now = Clock::now();
    QByteArray text =
        "timed out after " + QByteArray::number(millisecondsSince(request.submitted, now)) + " ms ";
    if (!entry.firstConnection)
        return {reason, text + "waiting for a free connection (" +
                            QByteArray::number(entry.origin->open) + " open to this server, " +
                            QByteArray::number(openConnections) + " of " +
                            QByteArray::number(maxConnections) + " in all)"};
    text += entry.connection ? entry.connection->activity() : QByteArray("between attempts");
    return {reason,
            text + " (it waited " +
                QByteArray::number(millisecondsSince(request.submitted, *entry.firstConnection)) +
                " ms for a connection)"};
}

void WendrelWorker::complete(Id id, const WendrelFailure& failure, const QByteArray& headers,
                             const QByteArray& body, bool reachedServer) {
    const auto found = pending.find(id);
    Pending entry = std::move(found->second);
    pending.erase(found);
    if (entry.deadline != deadlines.end())
        deadlines.erase(entry.deadline);
    --entry.origin->requests;
    answer(entry.exchange.request(), failure, headers, body, reachedServer);
}

void WendrelWorker::expireDeadlines() {
    const Clock::time_point now = Clock::now();
    std::vector<Id> expired;
    for (auto it = deadlines.begin(); it != deadlines.end() && it->first <= now; ++it)
        expired.push_back(it->second);
    for (const Id id : expired)
        abortRequest(id, QNetworkReply::TimeoutError);
    armDeadlineTimer();
}

void WendrelWorker::armDeadlineTimer() {
    if (deadlines.empty()) {
        deadlineTimer.stop();
        return;
    }
    const auto wait =
        std::chrono::ceil<std::chrono::milliseconds>(deadlines.begin()->first - Clock::now());
    deadlineTimer.start(static_cast<int>(std::clamp<qint64>(wait.count(), 0, INT_MAX)));
}

void WendrelWorker::armIdleTimer() {
    if (idleConnections.empty()) {
        idleTimer.stop();
        return;
    }
    const auto wait = std::chrono::ceil<std::chrono::milliseconds>(idleConnections.front().since +
                                                                   idleTimeout - Clock::now());
    idleTimer.start(static_cast<int>(std::clamp<qint64>(wait.count(), 0, INT_MAX)));
}

void WendrelWorker::answer(const WendrelRequest& request, const WendrelFailure& failure,
                           const QByteArray& headers, const QByteArray& body, bool reachedServer) {
    if (failure.failed())
        wendrelLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s %s failed after %lld ms: %s",
            WendrelFailure::peerText(request.method).constData(),
            WendrelFailure::peerText(WendrelUrl::forLog(request.url)).constData(),
            static_cast<long long>(millisecondsSince(request.submitted, Clock::now())),
            failure.reason.constData());
    if (!request.callback)
        return;
    // Nothing may unwind into the event loop.
    try {
        request.callback(failure.error, headers, body, reachedServer);
    } catch (...) {
        wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                           "a reply callback threw; the exception was dropped");
    }
}
