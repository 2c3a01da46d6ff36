#pragma once

#include "WendrelAuth.h"
#include "WendrelRequest.h"

#include <QHash>
#include <QNetworkReply>
#include <QObject>
#include <QSslConfiguration>
#include <QString>
#include <QTimer>

#include <deque>
#include <map>
#include <optional>
#include <unordered_map>

class QNetworkAccessManager;
struct WendrelTlsSettings;

// Lives on Wendrel's worker thread and runs every request there, with one network access
// manager and one deadline timer for all of them. Every member function except the constructor
// runs on that thread; nothing here is locked.
//
// Qt keeps a reply for every request it is given, and a reply costs far more memory than the
// request itself; Qt only sends a few at a time to one server anyway. So at most
// activePerOrigin requests per scheme, host and port are handed to Qt, and the others wait
// here, in order, under the same deadlines.
class WendrelWorker : public QObject {
public:
    explicit WendrelWorker(const WendrelTlsSettings& tls);

    void start(WendrelRequest request);
    // Answers everything queued or in flight with OperationCanceledError and releases the
    // manager; requests that arrive later are answered the same way without being sent.
    void shutdown();

    static constexpr qint64 maxBodySize = 8 * 1024 * 1024;
    // Connections Qt opens to one server; before Qt 6.5 its fixed default.
#if QT_VERSION >= QT_VERSION_CHECK(6, 5, 0)
    static constexpr int connectionsPerOrigin = 16;
#else
    static constexpr int connectionsPerOrigin = 6;
#endif
    // Two per connection: Qt starts the next as soon as an answer ends, and no more wait inside
    // Qt, where a waiting request costs about twenty times what it costs here.
    static constexpr int activePerOrigin = 2 * connectionsPerOrigin;

private:
    using Clock = WendrelRequest::Clock;
    using Id = quint64;
    using Deadlines = std::multimap<Clock::time_point, Id>;

    struct Pending {
        WendrelRequest request; // kept for the answer to an authentication challenge
        QString origin;
        QNetworkReply* reply = nullptr; // none while waiting for its turn
        bool challengeAnswered = false;
        bool reachedServer = false;
        // Set when we abort the reply, to report why instead of Qt's OperationCanceledError.
        QNetworkReply::NetworkError abortedWith = QNetworkReply::NoError;
        Deadlines::iterator deadline;
    };

    struct Origin {
        int active = 0;
        std::deque<Id> waiting; // may hold ids already answered; they are skipped
    };

    QNetworkAccessManager* manager();
    const std::optional<QSslConfiguration>& tlsConfiguration();
    QNetworkRequest networkRequest(const WendrelRequest& request);
    void launch(Id id, const QByteArray& authorization);
    void launchWaiting(const QString& origin);
    void finish(QNetworkReply* reply);
    bool answerChallenge(Id id, QNetworkReply* reply);
    void abortRequest(Id id, QNetworkReply::NetworkError reason);
    void complete(Id id, QNetworkReply::NetworkError error, const QByteArray& headers,
                  const QByteArray& body);
    void checkBodySize(QNetworkReply* reply);
    void expireDeadlines();
    void armDeadlineTimer();
    static void answer(const HttpReplyCallback& callback, QNetworkReply::NetworkError error,
                       const QByteArray& headers, const QByteArray& body, bool reachedServer);

    bool closing = false;
    QNetworkAccessManager* network = nullptr;
    WendrelAuth authentication;
    QString caFile;
    bool insecure = false;
    bool tlsConfigured = false;
    std::optional<QSslConfiguration> sslConfiguration; // made on first use: loading roots is slow
    QTimer deadlineTimer;
    Deadlines deadlines;
    bool launching = false;
    Id nextId = 0;
    std::unordered_map<Id, Pending> pending;
    std::unordered_map<QNetworkReply*, Id> replies;
    QHash<QString, Origin> origins;
};
