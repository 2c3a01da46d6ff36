#pragma once

#include "WendrelAuth.h"
#include "WendrelConnection.h"
#include "WendrelExchange.h"
#include "WendrelFailure.h"
#include "WendrelRequest.h"

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

// Lives on Wendrel's worker thread and runs every request there: it keeps the connections (at
// most connectionsPerOrigin per scheme, host and port, kept alive between requests), the
// requests waiting for one, in order, and one deadline timer for all of them; WendrelExchange
// decides what each answer leads to. Every failure is logged once, with its reason.
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

private:
    using Clock = WendrelRequest::Clock;
    using Id = quint64;
    using Deadlines = std::multimap<Clock::time_point, Id>;

    struct Origin {
        int open = 0; // connections, carrying an exchange or idle
        std::vector<WendrelConnection*> idle;
        std::deque<Id> waiting; // may hold ids already answered; they are skipped
    };

    struct Pending {
        WendrelExchange exchange;
        Origin* slot = nullptr;
        WendrelConnection* connection = nullptr;          // none while waiting for its turn
        std::optional<Clock::time_point> firstConnection; // when it first got one
        Deadlines::iterator deadline;
    };

    const std::optional<QSslConfiguration>& tlsConfiguration();
    static bool hasRoom(const Origin& origin);
    void launch(Id id, bool newConnection);
    void launchWaiting(Origin& origin);
    void exchangeEnded(Id id, WendrelConnection* connection, WendrelConnection::Outcome outcome);
    void dropped(Origin& origin, WendrelConnection* connection);
    void abortRequest(Id id, QNetworkReply::NetworkError reason);
    WendrelFailure abortFailure(const Pending& entry, QNetworkReply::NetworkError reason) const;
    void complete(Id id, const WendrelFailure& failure, const QByteArray& headers,
                  const QByteArray& body, bool reachedServer);
    void expireDeadlines();
    void armDeadlineTimer();
    // Logs a failure and calls back; nothing the callback throws gets out.
    static void answer(const WendrelRequest& request, const WendrelFailure& failure,
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
