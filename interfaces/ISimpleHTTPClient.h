// The HTTP client interface that camera code talks through.
#pragma once

#include <QByteArray>
#include <QNetworkReply>
#include <QString>
#include <QStringList>

#include <functional>

// (outcome, raw response headers, body, whether the request reached the server)
using HttpReplyCallback =
    std::function<void(QNetworkReply::NetworkError, const QByteArray&, const QByteArray&, bool)>;

class ISimpleHTTPClient {
public:
    // Addressed by host: the URL is scheme (https when useSSL), host, port (0: the scheme's
    // default) and path-with-query as given, already percent-encoded. timeout is in milliseconds.
    virtual bool Get(const QString& host, const QString& path, quint16 port, bool useSSL,
                     const QString& user, const QString& password, HttpReplyCallback callback,
                     uint timeout, const QStringList& headers) = 0;
    // Addressed by a full URL.
    virtual bool Get(const QString& url, const QString& user, const QString& password,
                     HttpReplyCallback callback, uint timeout) = 0;
    virtual bool Post(const QString& host, const QByteArray& body, const QString& path,
                      quint16 port, bool useSSL, const QString& user, const QString& password,
                      const QString& contentType, HttpReplyCallback callback, uint timeout) = 0;
    virtual bool Post(const QString& url, const QByteArray& body, const QString& user,
                      const QString& password, const QString& contentType,
                      HttpReplyCallback callback, uint timeout, const QStringList& headers) = 0;
    // password is sent as a bearer token; user is not used.
    virtual bool PostWithOAuth(const QString& host, const QByteArray& body, const QString& path,
                               quint16 port, bool useSSL, const QString& user,
                               const QString& password, const QString& contentType,
                               HttpReplyCallback callback, uint timeout) = 0;
    virtual bool Delete(const QString& host, const QByteArray& body, const QString& path,
                        quint16 port, bool useSSL, const QString& user, const QString& password,
                        const QString& contentType, HttpReplyCallback callback, uint timeout) = 0;
    virtual bool Put(const QString& host, const QByteArray& body, const QString& path, quint16 port,
                     bool useSSL, const QString& user, const QString& password,
                     const QString& contentType, HttpReplyCallback callback, uint timeout) = 0;
    virtual ~ISimpleHTTPClient() = default;
};
