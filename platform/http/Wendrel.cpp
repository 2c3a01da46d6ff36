#include "Wendrel.h"

#include "WendrelRequest.h"
#include "WendrelUrl.h"
#include "WendrelWorker.h"

#include <QCoreApplication>
#include <QThread>

#include <memory>
#include <mutex>
#include <openssl/crypto.h>
#include <vector>

namespace {

WendrelRequest makeRequest(const QByteArray& method, const QUrl& url, const QByteArray& body,
                           const QString& contentType, const QString& user, const QString& password,
                           HttpReplyCallback callback, uint timeout) {
    WendrelRequest request;
    request.method = method;
    request.url = url;
    request.body = body;
    request.contentType = contentType;
    request.user = user;
    request.password = password;
    request.callback = std::move(callback);
    request.submitted = WendrelRequest::Clock::now();
    if (timeout != 0)
        request.deadline = request.submitted + std::chrono::milliseconds(timeout);
    return request;
}

// Credentials written into a URL are taken out of it, and used when none were given.
WendrelRequest fromUrlText(const QByteArray& method, const QString& text, const QByteArray& body,
                           const QString& contentType, const QString& user, const QString& password,
                           HttpReplyCallback callback, uint timeout) {
    QUrl url = WendrelUrl::fromText(text);
    const bool given = !user.isEmpty() || !password.isEmpty();
    const QString urlUser = url.userName(QUrl::FullyDecoded);
    const QString urlPassword = url.password(QUrl::FullyDecoded);
    url.setUserInfo(QString());
    return makeRequest(method, url, body, contentType, given ? user : urlUser,
                       given ? password : urlPassword, std::move(callback), timeout);
}

} // namespace

WendrelSettings WendrelSettings::fromEnvironment() {
    WendrelSettings settings;
    settings.caFile = qEnvironmentVariable("WENDREL_CA_FILE");
    settings.pinnedCertificatesFile = qEnvironmentVariable("WENDREL_PINNED_CERTS");
    settings.insecure = qEnvironmentVariable("WENDREL_TLS_INSECURE") == QLatin1String("1");
    return settings;
}

class Wendrel::WendrelPrivate {
public:
    explicit WendrelPrivate(const WendrelSettings& settings)
        : thread(new QThread)
        , worker(new WendrelWorker(settings)) {
        thread->setObjectName(QStringLiteral("Wendrel"));
        worker->moveToThread(thread);
        // Deferred deletes run as the thread finishes, so the worker dies on its own thread.
        QObject::connect(thread, &QThread::finished, worker, &QObject::deleteLater);
        thread->start();
    }

    ~WendrelPrivate() {
        {
            std::lock_guard<std::mutex> lock(incoming->mutex);
            incoming->accepting = false;
        }
        if (QThread::currentThread() == thread) {
            // Destroyed from a reply callback: the thread cannot wait for itself, so the
            // event loop of the thread that created it reaps it.
            worker->shutdown();
            QObject::connect(thread, &QThread::finished, thread, &QObject::deleteLater);
            thread->quit();
            return;
        }
        // Queued behind every request accepted so far.
        QMetaObject::invokeMethod(
            worker, [worker = worker] { worker->shutdown(); }, Qt::BlockingQueuedConnection);
        thread->quit();
        thread->wait();
        delete thread;
    }

    WendrelPrivate(const WendrelPrivate&) = delete;
    WendrelPrivate& operator=(const WendrelPrivate&) = delete;

    // Requests gather here and go to the worker in batches, one wake-up of its thread per batch:
    // under load, most requests start from reply callbacks, many of them per turn of its loop.
    bool submit(WendrelRequest request) {
        std::lock_guard<std::mutex> lock(incoming->mutex);
        if (!incoming->accepting)
            return false;
        const bool first = incoming->requests.empty();
        incoming->requests.push_back(std::move(request));
        if (first)
            QMetaObject::invokeMethod(
                worker,
                [worker = worker, incoming = incoming] {
                    std::vector<WendrelRequest> batch;
                    {
                        std::lock_guard<std::mutex> lock(incoming->mutex);
                        batch.swap(incoming->requests);
                    }
                    for (WendrelRequest& request : batch)
                        worker->start(std::move(request));
                },
                Qt::QueuedConnection);
        return true;
    }

private:
    struct Incoming {
        std::mutex mutex;
        bool accepting = true; // so that nothing is queued behind the shutdown
        std::vector<WendrelRequest> requests;
    };

    const std::shared_ptr<Incoming> incoming = std::make_shared<Incoming>();
    QThread* thread;
    WendrelWorker* worker;
};

Wendrel::Wendrel()
    : Wendrel(WendrelSettings::fromEnvironment()) {}

Wendrel::Wendrel(const WendrelSettings& settings)
    : d(std::make_unique<WendrelPrivate>(settings)) {}

Wendrel::~Wendrel() = default;

bool Wendrel::Get(const QString& host, const QString& path, quint16 port, bool useSSL,
                  const QString& user, const QString& password, HttpReplyCallback callback,
                  uint timeout, const QStringList& headers) {
    WendrelRequest request = makeRequest("GET", WendrelUrl::fromParts(host, port, useSSL, path), {},
                                         {}, user, password, std::move(callback), timeout);
    request.headers = headers;
    return d->submit(std::move(request));
}

bool Wendrel::Get(const QString& url, const QString& user, const QString& password,
                  HttpReplyCallback callback, uint timeout) {
    return d->submit(fromUrlText("GET", url, {}, {}, user, password, std::move(callback), timeout));
}

bool Wendrel::Post(const QString& host, const QByteArray& body, const QString& path, quint16 port,
                   bool useSSL, const QString& user, const QString& password,
                   const QString& contentType, HttpReplyCallback callback, uint timeout) {
    return d->submit(makeRequest("POST", WendrelUrl::fromParts(host, port, useSSL, path), body,
                                 contentType, user, password, std::move(callback), timeout));
}

bool Wendrel::Post(const QString& url, const QByteArray& body, const QString& user,
                   const QString& password, const QString& contentType, HttpReplyCallback callback,
                   uint timeout, const QStringList& headers) {
    WendrelRequest request =
        fromUrlText("POST", url, body, contentType, user, password, std::move(callback), timeout);
    request.headers = headers;
    return d->submit(std::move(request));
}

bool Wendrel::PostWithOAuth(const QString& host, const QByteArray& body, const QString& path,
                            quint16 port, bool useSSL, const QString&, const QString& password,
                            const QString& contentType, HttpReplyCallback callback, uint timeout) {
    WendrelRequest request =
        makeRequest("POST", WendrelUrl::fromParts(host, port, useSSL, path), body, contentType, {},
                    password, std::move(callback), timeout);
    request.bearer = true;
    return d->submit(std::move(request));
}

bool Wendrel::Delete(const QString& host, const QByteArray& body, const QString& path, quint16 port,
                     bool useSSL, const QString& user, const QString& password,
                     const QString& contentType, HttpReplyCallback callback, uint timeout) {
    return d->submit(makeRequest("DELETE", WendrelUrl::fromParts(host, port, useSSL, path), body,
                                 contentType, user, password, std::move(callback), timeout));
}

bool Wendrel::Put(const QString& host, const QByteArray& body, const QString& path, quint16 port,
                  bool useSSL, const QString& user, const QString& password,
                  const QString& contentType, HttpReplyCallback callback, uint timeout) {
    return d->submit(makeRequest("PUT", WendrelUrl::fromParts(host, port, useSSL, path), body,
                                 contentType, user, password, std::move(callback), timeout));
}
