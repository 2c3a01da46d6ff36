#pragma once

#include "WendrelChallenge.h"
#include "WendrelLru.h"

#include <QByteArray>
#include <QString>
#include <QUrl>

// Answers servers' Basic and Digest (RFC 7616) challenges, one request at a time. Qt's own
// answering reuses credentials for later requests to the same server, through its credential
// cache and per connection, whatever credentials those requests carry. Here an answer goes out
// with its own request only; what a server asked of one set of credentials is remembered, under a
// hash of origin and credentials, so that later requests with the same credentials answer at once
// instead of being challenged again. Once Digest has worked for an origin and credentials, Basic
// is refused for them over plain HTTP. No header value made here holds a control character,
// whatever the server or the caller gave. Used on one thread.
class WendrelAuth {
public:
    struct Answer {
        enum class Refusal {
            None,
            Unanswerable, // no challenge the client supports, or a malformed field
            Downgrade,    // Basic over plain HTTP where Digest had worked
        };
        QByteArray authorization; // empty when refused
        Refusal refusal = Refusal::None;
        QByteArray scheme; // "Basic" or "Digest": answered or refused; empty when unanswerable
    };

    // The remembered challenges: about 2,000 of a camera's usual size, 500 of the largest that
    // WendrelChallenge keeps.
    static constexpr qsizetype maxCacheBytes = 1024 * 1024;
    // Origins and credentials with which Digest worked: about 10,000.
    static constexpr qsizetype maxDigestWorkedBytes = 2 * 1024 * 1024;

    // The Authorization value for a request to origin, from an earlier challenge of the same
    // credentials there; empty when there was none.
    QByteArray before(const QString& origin, const QByteArray& method, const QByteArray& target,
                      const QString& user, const QString& password);
    // The answer to the WWW-Authenticate text, remembered for before().
    Answer answer(const QString& origin, const QByteArray& challenges, const QByteArray& method,
                  const QByteArray& target, const QString& user, const QString& password,
                  bool https);
    // A request that carried a Digest answer with these credentials got an answer other than 401.
    void accepted(const QString& origin, const QString& user, const QString& password);
    // The credentials were rejected at origin: stop answering in advance with them. What
    // accepted() learnt stays.
    void forget(const QString& origin, const QString& user, const QString& password);

    // The Authorization value answering challenge; empty when no safe one can be made.
    static QByteArray respond(const WendrelChallenge& challenge, const QByteArray& method,
                              const QByteArray& target, const QString& user,
                              const QString& password, const QByteArray& clientNonce,
                              quint32 count);
    // The request target as Qt sends it for url, which Digest covers.
    static QByteArray target(const QUrl& url);

    // What the remembered challenges are accounted to hold, within maxCacheBytes.
    qsizetype cacheBytes() const { return known.bytes(); }

private:
    struct Known {
        WendrelChallenge challenge;
        quint32 count = 0; // Digest nonce count used last
    };
    struct Worked {};

    static QByteArray keyOf(const QString& origin, const QString& user, const QString& password);

    WendrelLru<Known> known{maxCacheBytes};
    WendrelLru<Worked> digestWorked{maxDigestWorkedBytes};
};
