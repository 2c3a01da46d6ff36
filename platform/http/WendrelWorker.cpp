#include "WendrelWorker.h"

#include "Wendrel.h"
#include "WendrelAuth.h"
#include "WendrelLog.h"
#include "WendrelUrl.h"

#include <QCoreApplication>
#include <QSslCertificate>

#include <algorithm>
#include <climits>
#include <utility>
#include <vector>

namespace {

// Headers the request line and body settle.
bool framingHeader(const QByteArray& name) {
    for (const char* framing : {"Host", "Content-Length", "Transfer-Encoding", "Connection"}) {
        if (name.compare(framing, Qt::CaseInsensitive) == 0)
            return true;
    }
    return false;
}

// As Qt maps HTTP statuses of 400 and above.
QNetworkReply::NetworkError statusError(int status) {
    switch (status) {
    case 400:
    case 418:
        return QNetworkReply::ProtocolInvalidOperationError;
    case 401:
        return QNetworkReply::AuthenticationRequiredError;
    case 403:
        return QNetworkReply::ContentAccessDenied;
    case 404:
        return QNetworkReply::ContentNotFoundError;
    case 405:
        return QNetworkReply::ContentOperationNotPermittedError;
    case 407:
        return QNetworkReply::ProxyAuthenticationRequiredError;
    case 409:
        return QNetworkReply::ContentConflictError;
    case 410:
        return QNetworkReply::ContentGoneError;
    case 500:
        return QNetworkReply::InternalServerError;
    case 501:
        return QNetworkReply::OperationNotImplementedError;
    case 503:
        return QNetworkReply::ServiceUnavailableError;
    default:
        if (status > 500)
            return QNetworkReply::UnknownServerError;
        return status >= 400 ? QNetworkReply::UnknownContentError : QNetworkReply::NoError;
    }
}

bool isRedirect(int status) {
    return status == 301 || status == 302 || status == 303 || status == 305 || status == 307 ||
           status == 308;
}

// Bearer requests carry their token and answer no challenge.
bool hasCredentials(const WendrelRequest& request) {
    return !request.bearer && !(request.user.isEmpty() && request.password.isEmpty());
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
    if (closing) {
        answer(request.callback, QNetworkReply::OperationCanceledError, {}, {}, false);
        return;
    }
    if (request.url.host().isEmpty()) {
        answer(request.callback, QNetworkReply::HostNotFoundError, {}, {}, false);
        return;
    }
    if (!WendrelUrl::isHttp(request.url)) {
        answer(request.callback, QNetworkReply::ProtocolUnknownError, {}, {}, false);
        return;
    }
    if (request.deadline && *request.deadline <= Clock::now()) {
        answer(request.callback, QNetworkReply::TimeoutError, {}, {}, false);
        return;
    }

    const Id id = nextId++;
    Pending& entry = pending[id];
    entry.origin = WendrelUrl::origin(request.url);
    entry.slot = &origins[entry.origin];
    entry.deadline = request.deadline ? deadlines.emplace(*request.deadline, id) : deadlines.end();
    entry.request = std::move(request);
    if (entry.deadline != deadlines.end() && entry.deadline == deadlines.begin())
        armDeadlineTimer();

    if (hasRoom(*entry.slot))
        launch(id, {});
    else
        entry.slot->waiting.push_back(id);
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

// The whole request. Nothing carries over from one request to the next: no credentials but the
// request's own (WendrelAuth answers challenges), and no cookies.
QByteArray WendrelWorker::message(Pending& entry, const QByteArray& authorization) {
    const WendrelRequest& request = entry.request;
    const QByteArray target = WendrelAuth::target(request.url);
    QByteArray result;
    result.reserve(256 + request.body.size());
    result.append(request.method).append(' ').append(target).append(" HTTP/1.1\r\nHost: ");
    result.append(WendrelUrl::hostHeader(request.url)).append("\r\n");
    for (const QString& header : request.headers) {
        const qsizetype colon = header.indexOf(QLatin1Char(':'));
        const QByteArray name = header.left(colon).trimmed().toLatin1();
        if (colon > 0 && !framingHeader(name))
            result.append(name)
                .append(": ")
                .append(header.mid(colon + 1).trimmed().toLatin1())
                .append("\r\n");
    }
    if (!request.contentType.isEmpty())
        result.append("Content-Type: ").append(request.contentType.toLatin1()).append("\r\n");
    if (request.bearer) {
        result.append("Authorization: Bearer ").append(request.password.toUtf8()).append("\r\n");
    } else {
        const QByteArray sent = authorization.isEmpty() && hasCredentials(request)
                                    ? authentication.before(entry.origin, request.method, target,
                                                            request.user, request.password)
                                    : authorization;
        entry.digestSent = sent.startsWith("Digest ");
        if (!sent.isEmpty())
            result.append("Authorization: ").append(sent).append("\r\n");
    }
    if (!request.body.isEmpty() || (request.method != "GET" && request.method != "HEAD"))
        result.append("Content-Length: ")
            .append(QByteArray::number(request.body.size()))
            .append("\r\n");
    result.append("\r\n").append(request.body);
    return result;
}

bool WendrelWorker::hasRoom(const Origin& origin) {
    return !origin.idle.empty() || origin.open < connectionsPerOrigin;
}

void WendrelWorker::launch(Id id, const QByteArray& authorization) {
    Pending& entry = pending.at(id);
    Origin& origin = *entry.slot;
    WendrelConnection* connection = nullptr;
    if (!origin.idle.empty()) {
        connection = origin.idle.back();
        origin.idle.pop_back();
    } else {
        const QUrl& url = entry.request.url;
        const bool https = WendrelUrl::isHttps(url);
        connection = new WendrelConnection(
            url.host(), WendrelUrl::port(url), https, https ? tlsConfiguration() : std::nullopt,
            maxBodySize,
            [this, slot = entry.slot](WendrelConnection* gone) { dropped(*slot, gone); }, this);
        ++origin.open;
    }
    entry.connection = connection;
    connection->send(message(entry, authorization),
                     [this, id](WendrelConnection* ended, WendrelConnection::Answer answer) {
                         exchangeEnded(id, ended, std::move(answer));
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
        launch(id, {});
    }
}

void WendrelWorker::exchangeEnded(Id id, WendrelConnection* connection,
                                  WendrelConnection::Answer answer) {
    Pending& entry = pending.at(id);
    entry.connection = nullptr;
    Origin& origin = *entry.slot;
    release(origin, connection);

    // A kept-alive connection that the server had closed in the meantime: once more on a new
    // one, as browsers and Qt do.
    if (answer.error != QNetworkReply::NoError && !answer.answerBegan && answer.connectionReused &&
        !entry.resent && !closing) {
        entry.resent = true;
        launch(id, {});
        return;
    }
    if (answer.error == QNetworkReply::NoError && answer.status != 401 && entry.digestSent)
        authentication.accepted(entry.origin, entry.request.user, entry.request.password);
    if (answer.error == QNetworkReply::NoError && !closing) {
        if (answer.status == 401 && answerChallenge(id, answer.challenges))
            return;
        if (isRedirect(answer.status) && !answer.location.isEmpty() && followRedirect(id, answer))
            return;
    }
    const QNetworkReply::NetworkError error =
        answer.error != QNetworkReply::NoError ? answer.error : statusError(answer.status);
    complete(id, error, answer.headers, answer.body, answer.reachedServer);
    launchWaiting(origin);
}

void WendrelWorker::release(Origin& origin, WendrelConnection* connection) {
    if (connection->reusable() && !closing) {
        origin.idle.push_back(connection);
    } else {
        connection->close();
        --origin.open;
    }
}

void WendrelWorker::dropped(Origin& origin, WendrelConnection* connection) {
    connection->close();
    origin.idle.erase(std::remove(origin.idle.begin(), origin.idle.end(), connection),
                      origin.idle.end());
    --origin.open;
    launchWaiting(origin);
}

// Sends the request again with an answer to the challenge: once, so that rejected credentials
// end the request with AuthenticationRequiredError.
bool WendrelWorker::answerChallenge(Id id, const QByteArray& challenges) {
    Pending& entry = pending.at(id);
    const WendrelRequest& request = entry.request;
    if (!hasCredentials(request))
        return false;
    if (entry.challengeAnswered) {
        authentication.forget(entry.origin, request.user, request.password);
        return false;
    }
    const WendrelAuth::Answer answered = authentication.answer(
        entry.origin, challenges, request.method, WendrelAuth::target(request.url), request.user,
        request.password, WendrelUrl::isHttps(request.url));
    if (answered.refusal == WendrelAuth::Answer::Refusal::Downgrade)
        wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                           "downgrade refused: Basic asked at %s over plain HTTP, where Digest "
                           "had worked with the same credentials",
                           qPrintable(entry.origin));
    if (answered.authorization.isEmpty())
        return false;
    entry.challengeAnswered = true;
    launch(id, answered.authorization);
    return true;
}

// Follows a redirect to the same scheme, host and port, with the same credentials; ends the
// request when it leads elsewhere or too far.
bool WendrelWorker::followRedirect(Id id, const WendrelConnection::Answer& answer) {
    Pending& entry = pending.at(id);
    const QUrl target = entry.request.url.resolved(QUrl::fromEncoded(answer.location));
    QNetworkReply::NetworkError refusal = QNetworkReply::NoError;
    if (!target.isValid() || !WendrelUrl::isHttp(target))
        refusal = QNetworkReply::ProtocolFailure;
    else if (WendrelUrl::origin(target) != entry.origin)
        refusal = QNetworkReply::InsecureRedirectError;
    else if (++entry.redirects > maxRedirects)
        refusal = QNetworkReply::TooManyRedirectsError;
    if (refusal != QNetworkReply::NoError) {
        Origin& origin = *entry.slot;
        complete(id, refusal, answer.headers, answer.body, answer.reachedServer);
        launchWaiting(origin);
        return true;
    }
    WendrelRequest& request = entry.request;
    if (answer.status == 303 ||
        ((answer.status == 301 || answer.status == 302) && request.method == "POST")) {
        request.method = "GET";
        request.body.clear();
        request.contentType.clear();
    }
    request.url = target;
    entry.challengeAnswered = false;
    launch(id, {});
    return true;
}

void WendrelWorker::abortRequest(Id id, QNetworkReply::NetworkError reason) {
    const auto found = pending.find(id);
    if (found == pending.end())
        return;
    Pending& entry = found->second;
    WendrelConnection* connection = std::exchange(entry.connection, nullptr);
    if (!connection) {
        // Still waiting for its turn: its place in the queue is skipped later.
        complete(id, reason, {}, {}, false);
        return;
    }
    Origin& origin = *entry.slot;
    const bool reachedServer = connection->reachedServer();
    connection->close();
    --origin.open;
    complete(id, reason, {}, {}, reachedServer);
    launchWaiting(origin);
}

void WendrelWorker::complete(Id id, QNetworkReply::NetworkError error, const QByteArray& headers,
                             const QByteArray& body, bool reachedServer) {
    const auto found = pending.find(id);
    Pending entry = std::move(found->second);
    pending.erase(found);
    if (entry.deadline != deadlines.end())
        deadlines.erase(entry.deadline);
    answer(entry.request.callback, error, headers, body, reachedServer);
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

void WendrelWorker::answer(const HttpReplyCallback& callback, QNetworkReply::NetworkError error,
                           const QByteArray& headers, const QByteArray& body, bool reachedServer) {
    if (!callback)
        return;
    // Nothing may unwind into the event loop.
    try {
        callback(error, headers, body, reachedServer);
    } catch (...) {
        wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                           "a reply callback threw; the exception was dropped");
    }
}
