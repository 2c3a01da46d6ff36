#pragma once

#include "WendrelAuth.h"
#include "WendrelConnection.h"
#include "WendrelExchange.h"
#include "WendrelFailure.h"
#include "WendrelRequest.h"
#include "WendrelTls.h"

#include <QObject>
#include <QString>
#include <QTimer>

#include <deque>
#include <list>
#include <map>
#include <optional>
#include <unordered_map>
#include <vector>

struct WendrelSettings;

// Lives on Wendrel's worker thread and runs every request there. It keeps the connections, the
// requests waiting for one and the deadlines; WendrelExchange decides what each answer leads to.
// - Connections: at most connectionsPerOrigin per scheme, host and port, and maxConnections in
//   all; kept alive between requests, and closed once idle for the idle time-out or to make room
//   for another server's request, the longest idle first.
// - Requests beyond that wait, in order per server, under their deadlines.
// - A server's entry goes once it has no connection and no request.
// Every failure is logged once, with its reason. Every member function except the constructor
// runs on that thread; nothing here is locked.
class WendrelWorker : public QObject {
public:
    explicit WendrelWorker(const WendrelSettings& settings);
    // On the worker thread, as it finishes.
    ~WendrelWorker() override;

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

    struct Origin;
    struct Idle {
        WendrelConnection* connection;
        Origin* origin;
        Clock::time_point since;
    };
    using IdleList = std::list<Idle>;

    struct Origin {
        QString key;
        int open = 0;     // connections, carrying an exchange or idle
        int requests = 0; // not yet answered
        std::vector<IdleList::iterator> idle;
        std::deque<Id> waiting; // may hold ids already answered; they are skipped
    };

    struct Pending {
        WendrelExchange exchange;
        Origin* origin = nullptr;
        WendrelConnection* connection = nullptr;          // none while waiting for its turn
        std::optional<Clock::time_point> firstConnection; // when it first got one
        Deadlines::iterator deadline;
    };

    bool hasRoom(Origin& origin);
    void launch(Id id, bool newConnection);
    void launchWaiting(Origin& origin);
    void launchBlocked();
    void exchangeEnded(Id id, WendrelConnection* connection, WendrelConnection::Outcome outcome);
    void release(Origin& origin, WendrelConnection* connection);
    void dropped(Origin& origin, WendrelConnection* connection);
    void closed(Origin& origin);
    void closeIdle(IdleList::iterator idle);
    void closeIdleConnections();
    void forgetIfUnused(Origin& origin);
    void abortRequest(Id id, QNetworkReply::NetworkError reason);
    WendrelFailure abortFailure(const Pending& entry, QNetworkReply::NetworkError reason) const;
    void complete(Id id, const WendrelFailure& failure, const QByteArray& headers,
                  const QByteArray& body, bool reachedServer);
    void expireDeadlines();
    void armDeadlineTimer();
    void armIdleTimer();
    // Logs a failure and calls back; nothing the callback throws gets out.
    static void answer(const WendrelRequest& request, const WendrelFailure& failure,
                       const QByteArray& headers, const QByteArray& body, bool reachedServer);

    bool closing = false;
    WendrelAuth authentication;
    WendrelTls tls;
    const std::chrono::milliseconds idleTimeout;
    const int maxConnections;
    int openConnections = 0;
    QTimer deadlineTimer;
    QTimer idleTimer;
    Deadlines deadlines;
    Id nextId = 0;
    std::unordered_map<Id, Pending> pending;
    std::unordered_map<QString, Origin> origins;
    IdleList idleConnections; // the longest idle first
    // Servers with requests waiting for room under maxConnections, in the order they ran out.
    std::deque<QString> blocked;
};
