#pragma once

#include "WendrelConnection.h"
#include "WendrelFailure.h"
#include "WendrelRequest.h"

#include <QByteArray>
#include <QString>

class WendrelAuth;

// One request's course over its attempts, and the whole policy of it: what each attempt sends,
// and what an answer leads to: an answer to the server's challenge (once), a redirect within the
// origin, one more attempt on a new connection when a kept-alive one turned out closed, or the
// end, with the outcome mapped as Qt maps it. Used on the worker thread only.
class WendrelExchange {
public:
    enum class Action { Send, SendOnNewConnection, Complete };
    struct Next {
        Action action = Action::Complete;
        WendrelFailure failure; // for Complete: none on success
    };

    // Qt's limit.
    static constexpr int maxRedirects = 50;

    WendrelExchange(WendrelRequest request, QString origin);

    const WendrelRequest& request() const { return current; }
    const QString& origin() const { return originKey; }
    // The bytes of the next attempt.
    QByteArray message(WendrelAuth& auth);
    // What the attempt's outcome leads to.
    Next next(const WendrelConnection::Outcome& outcome, WendrelAuth& auth);

    // As Qt maps HTTP statuses of 400 and above.
    static QNetworkReply::NetworkError statusError(int status);

private:
    bool hasCredentials() const;
    Next challenged(const WendrelConnection::Outcome& outcome, WendrelAuth& auth);
    Next redirected(const WendrelConnection::Outcome& outcome);
    QByteArray target() const;

    WendrelRequest current;
    QString originKey;
    QByteArray authorization; // answering a challenge, for the next attempt
    QByteArray sentScheme;    // the scheme of the credentials the last attempt carried
    bool challengeAnswered = false;
    bool staleAnswered = false; // a second answer, to a challenge that only renewed the nonce
    bool resent = false;
    int redirects = 0;
};
