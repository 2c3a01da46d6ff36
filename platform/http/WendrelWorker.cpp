#include "WendrelWorker.h"

#include "Wendrel.h"
#include "WendrelAuth.h"
#include "WendrelLog.h"
#include "WendrelUrl.h"

#include <QCoreApplication>
#include <QNetworkAccessManager>
#include <QSslCertificate>
#include <QtGlobal>
#if QT_VERSION >= QT_VERSION_CHECK(6, 5, 0)
#include <QHttp1Configuration>
#endif

#include <algorithm>
#include <climits>
#include <vector>

namespace {

QString originOf(const QUrl& url) {
    const bool tls = url.scheme() == QLatin1String("https");
    return url.scheme() + QLatin1Char(' ') + url.host() + QLatin1Char(' ') +
           QString::number(url.port(tls ? 443 : 80));
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
        WendrelLog::failure(__FILE__, __LINE__,
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
    entry.origin = originOf(request.url);
    entry.deadline = request.deadline ? deadlines.emplace(*request.deadline, id) : deadlines.end();
    entry.request = std::move(request);
    if (entry.deadline != deadlines.end() && entry.deadline == deadlines.begin())
        armDeadlineTimer();

    Origin& origin = origins[entry.origin];
    if (origin.active < activePerOrigin) {
        ++origin.active;
        launch(id, {});
    } else {
        origin.waiting.push_back(id);
    }
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
    // Shutdown may run inside one of the manager's own signals: it goes when the thread ends.
    if (network)
        network->deleteLater();
    network = nullptr;
}

QNetworkAccessManager* WendrelWorker::manager() {
    if (!network) {
        network = new QNetworkAccessManager(this);
        // Credentials are per request: never follow a redirect to another origin with them.
        network->setRedirectPolicy(QNetworkRequest::SameOriginRedirectPolicy);
        connect(network, &QNetworkAccessManager::finished, this, &WendrelWorker::finish);
    }
    return network;
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
            WendrelLog::failure(__FILE__, __LINE__, "no PEM certificate read from CA file %s",
                                qPrintable(caFile));
        // Adding certificates stops Qt's on-demand loading of the system's roots: keep them.
        QSslConfiguration configuration = QSslConfiguration::defaultConfiguration();
        configuration.setCaCertificates(QSslConfiguration::systemCaCertificates() + extra);
        sslConfiguration = configuration;
    }
    return sslConfiguration;
}

QNetworkRequest WendrelWorker::networkRequest(const WendrelRequest& request) {
    QNetworkRequest result(request.url);
    // Nothing carries over from one request to the next: Qt neither sends nor caches
    // credentials of its own (WendrelAuth answers challenges), and keeps no cookies.
    result.setAttribute(QNetworkRequest::AuthenticationReuseAttribute, QNetworkRequest::Manual);
    result.setAttribute(QNetworkRequest::CookieLoadControlAttribute, QNetworkRequest::Manual);
    result.setAttribute(QNetworkRequest::CookieSaveControlAttribute, QNetworkRequest::Manual);
#if QT_VERSION >= QT_VERSION_CHECK(6, 5, 0)
    QHttp1Configuration http1;
    http1.setNumberOfConnectionsPerHost(connectionsPerOrigin);
    result.setHttp1Configuration(http1);
#endif
    for (const QString& header : request.headers) {
        const qsizetype colon = header.indexOf(QLatin1Char(':'));
        if (colon > 0)
            result.setRawHeader(header.left(colon).trimmed().toLatin1(),
                                header.mid(colon + 1).trimmed().toLatin1());
    }
    if (!request.contentType.isEmpty())
        result.setHeader(QNetworkRequest::ContentTypeHeader, request.contentType);
    if (request.bearer)
        result.setRawHeader("Authorization", "Bearer " + request.password.toUtf8());
    if (request.url.scheme() == QLatin1String("https") && tlsConfiguration())
        result.setSslConfiguration(*tlsConfiguration());
    return result;
}

void WendrelWorker::launch(Id id, const QByteArray& authorization) {
    Pending& entry = pending.at(id);
    const WendrelRequest& request = entry.request;
    QNetworkAccessManager* network = manager();
    QNetworkRequest message = networkRequest(request);
    const QByteArray sentAuthorization =
        authorization.isEmpty() && hasCredentials(request)
            ? authentication.before(entry.origin, request.method, WendrelAuth::target(request.url),
                                    request.user, request.password)
            : authorization;
    if (!sentAuthorization.isEmpty())
        message.setRawHeader("Authorization", sentAuthorization);
    QNetworkReply* reply = nullptr;
    if (request.method == "GET")
        reply = network->get(message);
    else if (request.method == "POST")
        reply = network->post(message, request.body);
    else if (request.method == "PUT")
        reply = network->put(message, request.body);
    else
        reply = network->sendCustomRequest(message, request.method, request.body);
    entry.reply = reply;
    replies.emplace(reply, id);

    connect(reply, &QNetworkReply::readyRead, this, [this, reply] { checkBodySize(reply); });
    connect(reply, &QNetworkReply::requestSent, this, [this, reply] {
        const auto found = replies.find(reply);
        if (found != replies.end())
            pending.at(found->second).reachedServer = true;
    });
    // Qt may report some failures before the reply is handed out; finish() skipped it then.
    if (reply->isFinished())
        finish(reply);
}

void WendrelWorker::launchWaiting(const QString& originKey) {
    // A launch can finish at once and come back here: the outer loop carries on instead.
    if (launching)
        return;
    launching = true;
    const Clock::time_point now = Clock::now();
    while (!closing) {
        const auto found = origins.find(originKey);
        if (found == origins.end())
            break;
        Origin& origin = found.value();
        if (origin.waiting.empty()) {
            if (origin.active == 0)
                origins.erase(found);
            break;
        }
        if (origin.active >= activePerOrigin)
            break;
        const Id id = origin.waiting.front();
        origin.waiting.pop_front();
        const auto entry = pending.find(id);
        if (entry == pending.end())
            continue;
        // One whose deadline passed while it waited is left to expireDeadlines, unsent: when a
        // whole queue expires together, launching each only to abort it would pile up replies
        // that are deleted only after the last of them, and delay every answer behind them.
        const Deadlines::iterator deadline = entry->second.deadline;
        if (deadline != deadlines.end() && deadline->first <= now)
            continue;
        ++origin.active;
        launch(id, {});
    }
    launching = false;
}

void WendrelWorker::finish(QNetworkReply* reply) {
    const auto found = replies.find(reply);
    if (found == replies.end())
        return;
    const Id id = found->second;
    replies.erase(found);
    reply->deleteLater();
    Pending& entry = pending.at(id);
    entry.reply = nullptr;

    const bool aborted = entry.abortedWith != QNetworkReply::NoError;
    if (!aborted && reply->error() == QNetworkReply::AuthenticationRequiredError &&
        answerChallenge(id, reply))
        return;

    entry.reachedServer =
        entry.reachedServer || reply->attribute(QNetworkRequest::HttpStatusCodeAttribute).isValid();
    QByteArray headers;
    for (const QNetworkReply::RawHeaderPair& header : reply->rawHeaderPairs())
        headers += header.first + ": " + header.second + "\r\n";
    const QString origin = entry.origin;
    complete(id, aborted ? entry.abortedWith : reply->error(), headers,
             aborted ? QByteArray() : reply->readAll());

    const auto slot = origins.find(origin);
    if (slot != origins.end())
        --slot.value().active;
    launchWaiting(origin);
}

// Sends the request again with an answer to the challenge in reply: once, so that rejected
// credentials end the request with AuthenticationRequiredError.
bool WendrelWorker::answerChallenge(Id id, QNetworkReply* reply) {
    Pending& entry = pending.at(id);
    const WendrelRequest& request = entry.request;
    if (!hasCredentials(request))
        return false;
    if (entry.challengeAnswered) {
        authentication.forget(entry.origin, request.user, request.password);
        return false;
    }
    const QByteArray authorization =
        authentication.answer(entry.origin, reply->rawHeader("WWW-Authenticate"), request.method,
                              WendrelAuth::target(request.url), request.user, request.password);
    if (authorization.isEmpty())
        return false;
    entry.challengeAnswered = true;
    launch(id, authorization);
    return true;
}

void WendrelWorker::abortRequest(Id id, QNetworkReply::NetworkError reason) {
    const auto found = pending.find(id);
    if (found == pending.end())
        return;
    Pending& entry = found->second;
    if (!entry.reply) {
        // Still waiting for its turn: its place in the queue is skipped later.
        complete(id, reason, {}, {});
        return;
    }
    entry.abortedWith = reason;
    QNetworkReply* reply = entry.reply;
    reply->abort();
    // abort() reports through finished; this covers a reply that had no more to report.
    finish(reply);
}

void WendrelWorker::complete(Id id, QNetworkReply::NetworkError error, const QByteArray& headers,
                             const QByteArray& body) {
    const auto found = pending.find(id);
    Pending entry = std::move(found->second);
    pending.erase(found);
    if (entry.deadline != deadlines.end())
        deadlines.erase(entry.deadline);
    answer(entry.request.callback, error, headers, body, entry.reachedServer);
}

void WendrelWorker::checkBodySize(QNetworkReply* reply) {
    if (reply->bytesAvailable() <= maxBodySize)
        return;
    const auto found = replies.find(reply);
    if (found != replies.end())
        abortRequest(found->second, QNetworkReply::UnknownContentError);
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
        WendrelLog::failure(__FILE__, __LINE__,
                            "a reply callback threw; the exception was dropped");
    }
}
