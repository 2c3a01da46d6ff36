// Wendrel: the ISimpleHTTPClient on Qt Network.
//
// Requests run on a worker thread that Wendrel owns, with its own event loop; the process needs a
// QCoreApplication. Get/Post/... may be called from any thread; they return true once the request
// is queued, and false only while the client is being destroyed.
//
// The reply callback runs on the worker thread, exactly once for every accepted request, with:
// - the outcome: Qt's mapping of transport failures and HTTP error statuses; TimeoutError when the
//   deadline passed, UnknownContentError when the body exceeded 8 MiB (the body is then empty),
//   AuthenticationRequiredError when the credentials were missing or rejected, and
//   OperationCanceledError when the client was destroyed first;
// - the response headers as "Name: value" lines, each ended by CR LF;
// - the body, also for an error status;
// - whether the request reached the server: it was sent, or an answer came back.
// Each failure is also logged once, at the logging library's default level, with its reason.
// A callback may make further requests, and may even destroy its Wendrel: what is still pending
// is then answered before the destructor returns, and the worker thread is reaped later by the
// event loop of the thread that created the client.
//
// The timeout is a total deadline in milliseconds from the call; 0 means none. Paths and URLs are
// taken as already percent-encoded. User name and password answer the server's Digest (MD5,
// SHA-256, SHA-512-256, with or without -sess; preferred) or Basic challenge, once per request
// (twice when the server only renewed its nonce), and serve no other request; they never go into
// the URL or the log. Once Digest has worked with a server and credentials, Basic is refused for
// them over plain http, with AuthenticationRequiredError.
// Headers are "Name: value" strings. A request whose user name or password holds a control
// character, whose header name is not an HTTP token, or whose header value, content type or
// bearer token holds CR, LF or NUL is refused without being sent, with
// ProtocolInvalidOperationError. Only http and https are served; redirects are followed
// within the same scheme, host and port only, and no cookies are kept. Requests go over kept-alive
// HTTP/1.1 connections, at most 16 to one scheme, host and port and WendrelSettings'
// maxConnections in all; the others wait their turn, in order, under their deadlines. A request
// is sent a second time only when it is a GET whose kept-alive connection turned out closed
// before any byte of an answer.
#pragma once

#include "ISimpleHTTPClient.h"

#include <memory>

#if defined(_WIN32)
#if defined(WENDREL_BUILD)
#define WENDREL_EXPORT __declspec(dllexport)
#else
#define WENDREL_EXPORT __declspec(dllimport)
#endif
#else
#define WENDREL_EXPORT __attribute__((visibility("default")))
#endif

// Certificates are verified against the system's trusted roots by default.
struct WENDREL_EXPORT WendrelSettings {
    // Further PEM certificates of certificate authorities to trust, such as a site's own CA that
    // issues the cameras' certificates. A certificate here vouches for any host.
    QString caFile;
    // PEM leaf certificates of cameras, each trusted as the identity of the server that presents
    // it, whatever name it was reached by; it vouches for no other certificate.
    QString pinnedCertificatesFile;
    bool insecure = false; // skip certificate verification altogether (logs one warning)
    // A kept-alive connection left idle this long is closed.
    int idleTimeoutMs = 30000;
    // Open connections across all servers: at most this, and at most half the process's soft
    // limit of open files where it has one. Idle ones are closed first to make room.
    int maxConnections = 1024;

    // WENDREL_CA_FILE, WENDREL_PINNED_CERTS and WENDREL_TLS_INSECURE=1.
    static WendrelSettings fromEnvironment();
};

class WENDREL_EXPORT Wendrel : public ISimpleHTTPClient {
public:
    // Reads its settings from the environment, once.
    Wendrel();
    explicit Wendrel(const WendrelSettings& settings);
    // Aborts what is in flight, answering each with OperationCanceledError, and stops the worker.
    ~Wendrel() override;

    Wendrel(const Wendrel&) = delete;
    Wendrel& operator=(const Wendrel&) = delete;

    bool Get(const QString& host, const QString& path, quint16 port, bool useSSL,
             const QString& user, const QString& password, HttpReplyCallback callback, uint timeout,
             const QStringList& headers) override;
    bool Get(const QString& url, const QString& user, const QString& password,
             HttpReplyCallback callback, uint timeout) override;
    bool Post(const QString& host, const QByteArray& body, const QString& path, quint16 port,
              bool useSSL, const QString& user, const QString& password, const QString& contentType,
              HttpReplyCallback callback, uint timeout) override;
    bool Post(const QString& url, const QByteArray& body, const QString& user,
              const QString& password, const QString& contentType, HttpReplyCallback callback,
              uint timeout, const QStringList& headers) override;
    bool PostWithOAuth(const QString& host, const QByteArray& body, const QString& path,
                       quint16 port, bool useSSL, const QString& user, const QString& password,
                       const QString& contentType, HttpReplyCallback callback,
                       uint timeout) override;
    bool Delete(const QString& host, const QByteArray& body, const QString& path, quint16 port,
                bool useSSL, const QString& user, const QString& password,
                const QString& contentType, HttpReplyCallback callback, uint timeout) override;
    bool Put(const QString& host, const QByteArray& body, const QString& path, quint16 port,
             bool useSSL, const QString& user, const QString& password, const QString& contentType,
             HttpReplyCallback callback, uint timeout) override;

private:
    class WendrelPrivate;
    std::unique_ptr<WendrelPrivate> d;
};
