#include "WendrelExchange.h"

#include "WendrelAuth.h"
#include "WendrelChallenge.h"
#include "WendrelRequestWriter.h"
#include "WendrelUrl.h"

#include <optional>
#include <utility>

namespace {

bool isRedirect(int status) {
    return status == 301 || status == 302 || status == 303 || status == 305 || status == 307 ||
           status == 308;
}

QByteArray schemeOf(const QByteArray& authorization) {
    return authorization.left(authorization.indexOf(' '));
}

} // namespace

WendrelExchange::WendrelExchange(WendrelRequest request, QString origin)
    : current(std::move(request))
    , originKey(std::move(origin)) {}

QByteArray WendrelExchange::message(WendrelAuth& auth) {
    QByteArray sent = std::exchange(authorization, QByteArray());
    if (current.bearer)
        sent = "Bearer " + current.password.toUtf8();
    else if (sent.isEmpty() && hasCredentials())
        sent = auth.before(originKey, current.method, target(), current.user, current.password);
    sentScheme = current.bearer ? QByteArray() : schemeOf(sent);
    return WendrelRequestWriter::write(current, target(), sent);
}

WendrelExchange::Next WendrelExchange::next(const WendrelConnection::Outcome& outcome,
                                            WendrelAuth& auth) {
    // A kept-alive connection that the server had closed in the meantime: once more on a new
    // one, as cameras close idle connections as a request arrives. Only a GET, which may run
    // twice (RFC 9110, 9.2.2): a POST that went out may have been acted on.
    if (outcome.failure.failed()) {
        if (outcome.failure.error == QNetworkReply::RemoteHostClosedError && !outcome.answerBegan &&
            outcome.connectionReused && !resent && current.method == "GET") {
            resent = true;
            return {Action::SendOnNewConnection, {}};
        }
        return {Action::Complete, outcome.failure};
    }
    const WendrelResponseReader::Answer& answer = outcome.answer;
    if (answer.status != 401 && sentScheme == "Digest")
        auth.accepted(originKey, current.user, current.password);
    if (answer.status == 401)
        return challenged(outcome, auth);
    if (isRedirect(answer.status) && !answer.location.isEmpty())
        return redirected(outcome);
    const QNetworkReply::NetworkError error = statusError(answer.status);
    if (error == QNetworkReply::NoError)
        return {Action::Complete, {}};
    return {Action::Complete,
            {error, "HTTP " + QByteArray::number(answer.status) + ' ' +
                        WendrelFailure::peerText(answer.reason)}};
}

QNetworkReply::NetworkError WendrelExchange::statusError(int status) {
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

// Bearer requests carry their token and answer no challenge.
bool WendrelExchange::hasCredentials() const {
    return !current.bearer && !(current.user.isEmpty() && current.password.isEmpty());
}

// Answers the challenge once, so that rejected credentials end the request; once more when the
// server only renewed its nonce (RFC 7616, stale=true).
WendrelExchange::Next WendrelExchange::challenged(const WendrelConnection::Outcome& outcome,
                                                  WendrelAuth& auth) {
    const QByteArray offered = WendrelFailure::peerText(outcome.answer.challenges);
    if (!hasCredentials())
        return {Action::Complete,
                {QNetworkReply::AuthenticationRequiredError,
                 current.bearer ? "bearer token rejected (HTTP 401)"
                                : "authentication required, but no credentials were given "
                                  "(the server offers: " +
                                      offered + ')'}};
    if (challengeAnswered) {
        const std::optional<WendrelChallenge> renewed =
            WendrelChallenge::choose(outcome.answer.challenges);
        if (staleAnswered || sentScheme != "Digest" || !renewed || !renewed->stale) {
            auth.forget(originKey, current.user, current.password);
            return {Action::Complete,
                    {QNetworkReply::AuthenticationRequiredError,
                     "credentials rejected (" + sentScheme + ")"}};
        }
        staleAnswered = true;
    }
    const WendrelAuth::Answer answered =
        auth.answer(originKey, outcome.answer.challenges, current.method, target(), current.user,
                    current.password, WendrelUrl::isHttps(current.url));
    if (answered.refusal == WendrelAuth::Answer::Refusal::Downgrade)
        return {Action::Complete,
                {QNetworkReply::AuthenticationRequiredError,
                 "credentials rejected: downgrade refused (the server asks for Basic over plain "
                 "HTTP, where Digest had worked with the same credentials)"}};
    if (answered.authorization.isEmpty())
        return {Action::Complete,
                {QNetworkReply::AuthenticationRequiredError,
                 "authentication required, but no challenge can be answered (the server "
                 "offers: " +
                     offered + ')'}};
    authorization = answered.authorization;
    challengeAnswered = true;
    return {Action::Send, {}};
}

// Follows a redirect to the same scheme, host and port, with the same credentials; ends the
// request when it leads elsewhere or too far.
WendrelExchange::Next WendrelExchange::redirected(const WendrelConnection::Outcome& outcome) {
    const WendrelResponseReader::Answer& answer = outcome.answer;
    const QUrl next = current.url.resolved(QUrl::fromEncoded(answer.location));
    const QByteArray location = WendrelFailure::peerText(answer.location);
    if (!next.isValid() || !WendrelUrl::isHttp(next))
        return {Action::Complete,
                {QNetworkReply::ProtocolFailure,
                 "redirect to an unsupported or invalid URL refused (Location: " + location + ')'}};
    if (WendrelUrl::origin(next) != originKey)
        return {Action::Complete,
                {QNetworkReply::InsecureRedirectError,
                 "redirect to another origin refused (Location: " + location + ')'}};
    if (++redirects > maxRedirects)
        return {Action::Complete,
                {QNetworkReply::TooManyRedirectsError,
                 "more than " + QByteArray::number(maxRedirects) + " redirects"}};
    if (answer.status == 303 ||
        ((answer.status == 301 || answer.status == 302) && current.method == "POST")) {
        current.method = "GET";
        current.body.clear();
        current.contentType.clear();
    }
    current.url = next;
    challengeAnswered = staleAnswered = false;
    return {Action::Send, {}};
}

QByteArray WendrelExchange::target() const {
    return WendrelAuth::target(current.url);
}
