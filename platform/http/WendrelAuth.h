#pragma once

#include <QByteArray>
#include <QHash>
#include <QMap>
#include <QString>
#include <QUrl>

// Answers servers' Basic and Digest challenges, one request at a time. Qt's own answering
// reuses credentials for later requests to the same server, through its credential cache and
// per connection, whatever credentials those requests carry. Here an answer goes out with its
// own request only; what a server asked of one set of credentials is remembered, under a hash
// of server and credentials, so that later requests with the same credentials answer at once
// instead of being challenged again. Used on one thread.
class WendrelAuth {
public:
    struct Challenge {
        QByteArray scheme;                   // lower case
        QMap<QByteArray, QByteArray> params; // names in lower case
    };

    // The Authorization value for a request to origin, from an earlier challenge of the same
    // credentials there; empty when there was none.
    QByteArray before(const QString& origin, const QByteArray& method, const QByteArray& target,
                      const QString& user, const QString& password);
    // The Authorization value answering the WWW-Authenticate text, remembered for before();
    // empty when no challenge can be answered.
    QByteArray answer(const QString& origin, const QByteArray& challenges, const QByteArray& method,
                      const QByteArray& target, const QString& user, const QString& password);
    // The credentials were rejected at origin: stop answering in advance with them.
    void forget(const QString& origin, const QString& user, const QString& password);

    // The challenge to answer among the WWW-Authenticate text (challenges of several header
    // lines joined by commas): Digest (MD5 or MD5-sess, qop auth or none) before Basic.
    // Its scheme is empty when none can be answered.
    static Challenge choose(const QByteArray& challenges);
    static QByteArray respond(const Challenge& challenge, const QByteArray& method,
                              const QByteArray& target, const QString& user,
                              const QString& password, const QByteArray& clientNonce,
                              quint32 count);
    // The request target as Qt sends it for url, which Digest covers.
    static QByteArray target(const QUrl& url);

private:
    struct Known {
        Challenge challenge;
        quint32 count = 0; // Digest nonce count used last
    };

    static QByteArray keyOf(const QString& origin, const QString& user, const QString& password);

    QHash<QByteArray, Known> known;
};
