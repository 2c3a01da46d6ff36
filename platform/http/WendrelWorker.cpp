#include "WendrelWorker.h"

#include "Wendrel.h"
#include "WendrelLog.h"
#include "WendrelUrl.h"

#include <QCoreApplication>
#include <QSslCertificate>

#include <algorithm>
#include <climits>
#include <utility>

namespace {

qint64 millisecondsSince(std::chrono::steady_clock::time_point then,
                         std::chrono::steady_clock::time_point now) {
    return std::chrono::duration_cast<std::chrono::milliseconds>(now - then).count();
}

} // namespace

WendrelWorker::WendrelWorker(const WendrelTlsSettings& tls)
    : caFile(tls.caFile)
    , insecure(tls.insecure)
    , deadlineTimer(this) {
    deadlineTimer.setSingleShot(true);
    deadlineTimer.setTimerType(Qt::PreciseTimer);
    connect(&deadlineTimer, &QTimer::timeout, this, &WendrelWorker::expireDeadlines);
    if (insecure)
        wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                           "TLS certificate verification is off: any server is trusted");
}

void WendrelWorker::start(WendrelRequest request) {
    WendrelFailure refusal;
    if (closing)
        refusal = {QNetworkReply::OperationCanceledError, "cancelled: the client is shutting down"};
    else if (request.url.host().isEmpty())
        refusal = {QNetworkReply::HostNotFoundError, "no host given"};
    else if (!WendrelUrl::isHttp(request.url))
        refusal = {QNetworkReply::ProtocolUnknownError, "only http and https are served"};
    else if (request.deadline && *request.deadline <= Clock::now())
        refusal = {QNetworkReply::TimeoutError, "timed out before it could start"};
    if (refusal.failed()) {
        answer(request, refusal, {}, {}, false);
        return;
    }

    const Id id = nextId++;
    QString origin = WendrelUrl::origin(request.url);
    Origin* slot = &origins[origin];
    const auto deadline =
        request.deadline ? deadlines.emplace(*request.deadline, id) : deadlines.end();
    pending.emplace(id, Pending{WendrelExchange(std::move(request), std::move(origin)), slot,
                                nullptr, std::nullopt, deadline});
    if (deadline != deadlines.end() && deadline == deadlines.begin())
        armDeadlineTimer();

    if (hasRoom(*slot))
        launch(id, false);
    else
        slot->waiting.push_back(id);
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
    for (auto& origin : origins) {
        for (WendrelConnection* connection : origin.second.idle)
            connection->close();
        origin.second.idle.clear();
    }
}

const std::optional<QSslConfiguration>& WendrelWorker::tlsConfiguration() {
    if (tlsConfigured)
        return sslConfiguration;
    tlsConfigured = true;
    if (insecure) {
        QSslConfiguration configuration = QSslConfiguration::defaultConfiguration();
        configuration.setPeerVerifyMode(QSslSocket::VerifyNone);
        sslConfiguration = configuration;
    } else if (!caFile.isEmpty()) {
        const QList<QSslCertificate> extra = QSslCertificate::fromPath(caFile, QSsl::Pem);
        if (extra.isEmpty())
            wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                               "no PEM certificate read from CA file %s", qPrintable(caFile));
        // Adding certificates stops Qt's on-demand loading of the system's roots: keep them.
        QSslConfiguration configuration = QSslConfiguration::defaultConfiguration();
        configuration.setCaCertificates(QSslConfiguration::systemCaCertificates() + extra);
        sslConfiguration = configuration;
    }
    return sslConfiguration;
}

bool WendrelWorker::hasRoom(const Origin& origin) {
    return !origin.idle.empty() || origin.open < connectionsPerOrigin;
}

void WendrelWorker::launch(Id id, bool newConnection) {
    Pending& entry = pending.at(id);
    Origin& origin = *entry.slot;
    WendrelConnection* connection = nullptr;
    if (!newConnection && !origin.idle.empty()) {
        connection = origin.idle.back();
        origin.idle.pop_back();
    } else {
        const QUrl& url = entry.exchange.request().url;
        const bool https = WendrelUrl::isHttps(url);
        connection = new WendrelConnection(
            url.host(), WendrelUrl::port(url), https, https ? tlsConfiguration() : std::nullopt,
            maxBodySize,
            [this, slot = entry.slot](WendrelConnection* gone) { dropped(*slot, gone); }, this);
        ++origin.open;
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
    while (!closing && !origin.waiting.empty() && hasRoom(origin)) {
        const Id id = origin.waiting.front();
        origin.waiting.pop_front();
        const auto entry = pending.find(id);
        if (entry == pending.end())
            continue;
        // One whose deadline passed while it waited is left to expireDeadlines, unsent.
        const Deadlines::iterator deadline = entry->second.deadline;
        if (deadline != deadlines.end() && deadline->first <= now)
            continue;
        launch(id, false);
    }
}

void WendrelWorker::exchangeEnded(Id id, WendrelConnection* connection,
                                  WendrelConnection::Outcome outcome) {
    Pending& entry = pending.at(id);
    entry.connection = nullptr;
    Origin& origin = *entry.slot;
    // One that cannot carry another exchange has closed itself.
    if (connection->state() == WendrelConnection::State::Idle)
        origin.idle.push_back(connection);
    else
        --origin.open;

    const WendrelExchange::Next next = entry.exchange.next(outcome, authentication);
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
}

void WendrelWorker::dropped(Origin& origin, WendrelConnection* connection) {
    connection->close();
    origin.idle.erase(std::remove(origin.idle.begin(), origin.idle.end(), connection),
                      origin.idle.end());
    --origin.open;
    launchWaiting(origin);
}

void WendrelWorker::abortRequest(Id id, QNetworkReply::NetworkError reason) {
    const auto found = pending.find(id);
    if (found == pending.end())
        return;
    Pending& entry = found->second;
    const WendrelFailure failure = abortFailure(entry, reason);
    WendrelConnection* connection = std::exchange(entry.connection, nullptr);
    if (!connection) {
        // Still waiting for its turn: its place in the queue is skipped later.
        complete(id, failure, {}, {}, false);
        return;
    }
    Origin& origin = *entry.slot;
    const bool reachedServer = connection->reachedServer();
    connection->close();
    --origin.open;
    complete(id, failure, {}, {}, reachedServer);
    launchWaiting(origin);
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
                            QByteArray::number(connectionsPerOrigin) +
                            " to this server, all busy)"};
    if (entry.connection)
        text += entry.connection->activity();
    else
        text += "between attempts";
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

void WendrelWorker::answer(const WendrelRequest& request, const WendrelFailure& failure,
                           const QByteArray& headers, const QByteArray& body, bool reachedServer) {
    if (failure.failed()) {
        wendrelLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s %s failed after %lld ms: %s",
            WendrelFailure::peerText(request.method).constData(),
            WendrelFailure::peerText(WendrelUrl::forLog(request.url)).constData(),
            static_cast<long long>(millisecondsSince(request.submitted, Clock::now())),
            failure.reason.constData());
    }
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
