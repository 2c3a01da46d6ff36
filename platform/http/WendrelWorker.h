#pragma once

#include "WendrelAuth.h"
#include "WendrelConnection.h"
#include "WendrelRequest.h"

#include <QNetworkReply>
#include <QObject>
#include <QSslConfiguration>
#include <QString>
#include <QTimer>

#include <deque>
#include <map>
#include <optional>
#include <unordered_map>
#include <vector>

struct WendrelTlsSettings;

// Lives on Wendrel's worker thread and runs every request there, over its own keep-alive
// connections (at most connectionsPerOrigin per scheme, host and port) and one deadline timer for
// all of them. Requests beyond the connections wait here, in order, under the same deadlines.
// Every member function except the constructor runs on that thread; nothing here is locked.
class WendrelWorker : public QObject {
public:
    explicit WendrelWorker(const WendrelTlsSettings& tls);

    void start(WendrelRequest request);
    // Answers everything queued or in flight with OperationCanceledError and closes every
    // connection; requests that arrive later are answered the same way without being sent.
    void shutdown();

    static constexpr qint64 maxBodySize = 8 * 1024 * 1024;
    // Enough to keep a camera busy under load, few enough for a small server.
    static constexpr int connectionsPerOrigin = 16;
    // Qt's limit.
    static constexpr int maxRedirects = 50;

private:
    using Clock = WendrelRequest::Clock;
    using Id = quint64;
    using Deadlines = std::multimap<Clock::time_point, Id>;

    struct Origin;
    struct Pending {
        WendrelRequest request; // kept for the answer to a challenge, a redirect or a resend
        QString origin;
        Origin* slot = nullptr;
        WendrelConnection* connection = nullptr; // none while waiting for its turn
        bool challengeAnswered = false;
        bool digestSent = false; // the last send carried a Digest answer
        bool resent = false;
        int redirects = 0;
        Deadlines::iterator deadline;
    };

    struct Origin {
        int open = 0; // connections, carrying an exchange or idle
        std::vector<WendrelConnection*> idle;
        std::deque<Id> waiting; // may hold ids already answered; they are skipped
    };

    const std::optional<QSslConfiguration>& tlsConfiguration();
    QByteArray message(Pending& entry, const QByteArray& authorization);
    static bool hasRoom(const Origin& origin);
    void launch(Id id, const QByteArray& authorization);
    void launchWaiting(Origin& origin);
    void exchangeEnded(Id id, WendrelConnection* connection, WendrelConnection::Answer answer);
    void release(Origin& origin, WendrelConnection* connection);
    void dropped(Origin& origin, WendrelConnection* connection);
    bool answerChallenge(Id id, const QByteArray& challenges);
    bool followRedirect(Id id, const WendrelConnection::Answer& answer);
    void abortRequest(Id id, QNetworkReply::NetworkError reason);
    void complete(Id id, QNetworkReply::NetworkError error, const QByteArray& headers,
                  const QByteArray& body, bool reachedServer);
    void expireDeadlines();
    void armDeadlineTimer();
    static void answer(const HttpReplyCallback& callback, QNetworkReply::NetworkError error,
                       const QByteArray& headers, const QByteArray& body, bool reachedServer);

    bool closing = false;
    WendrelAuth authentication;
    QString caFile;
    bool insecure = false;
    bool tlsConfigured = false;
    std::optional<QSslConfiguration> sslConfiguration; // made on first use: loading roots is slow
    QTimer deadlineTimer;
    Deadlines deadlines;
    Id nextId = 0;
    std::unordered_map<Id, Pending> pending;
    // Kept while the worker lives, so that requests and connections can point at theirs.
    std::unordered_map<QString, Origin> origins;
};
