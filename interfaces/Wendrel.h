// Wendrel: the ISimpleHTTPClient on Qt Network.
//
// Requests run on a worker thread that Wendrel owns, with its own event loop; the process needs
// a QCoreApplication. Get/Post/... may be called from any thread. Reply callbacks are called on
// the worker thread, exactly once for every request that was accepted (the call returned true).
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

struct WENDREL_EXPORT WendrelTlsSettings {
    QString caFile;        // extra PEM certificates to trust
    bool insecure = false; // skip certificate verification altogether

    // WENDREL_CA_FILE and WENDREL_TLS_INSECURE=1.
    static WendrelTlsSettings fromEnvironment();
};

class WENDREL_EXPORT Wendrel : public ISimpleHTTPClient {
public:
    Wendrel();
    explicit Wendrel(const WendrelTlsSettings& tls);
    // Aborts what is in flight, answering each with OperationCanceledError, and stops the worker.
    ~Wendrel() override;

    Wendrel(const Wendrel&) = delete;
    Wendrel& operator=(const Wendrel&) = delete;

    bool Get(const QString& host, const QString& path, quint16 port, bool useSSL,
             const QString& user, const QString& password, HttpReplyCallback callback,
             uint timeout, const QStringList& headers) override;
    bool Get(const QString& url, const QString& user, const QString& password,
             HttpReplyCallback callback, uint timeout) override;
    bool Post(const QString& host, const QByteArray& body, const QString& path, quint16 port,
              bool useSSL, const QString& user, const QString& password,
              const QString& contentType, HttpReplyCallback callback, uint timeout) override;
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
             bool useSSL, const QString& user, const QString& password,
             const QString& contentType, HttpReplyCallback callback, uint timeout) override;

private:
    class WendrelPrivate;
    std::unique_ptr<WendrelPrivate> d;
};
