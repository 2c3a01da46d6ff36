#pragma once

#include "ISimpleHTTPClient.h"

#include <functional>

// Answers every request at once, on the calling thread, with what the responder gives for the
// request's path with query (the URL for the forms addressed by URL). Thread-safe as far as the
// responder is.
class AnsweringHttpClient : public ISimpleHTTPClient {
public:
    struct Answer {
        QNetworkReply::NetworkError outcome = QNetworkReply::NoError;
        QByteArray body;
    };
    using Responder = std::function<Answer(const QString& path)>;

    explicit AnsweringHttpClient(Responder responder);

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
    bool answer(const QString& path, const HttpReplyCallback& callback) const;

    Responder responder;
};
