#pragma once

#include "ISimpleHTTPClient.h"

#include <vector>

// Records every request the camera code makes and holds its reply callback until the test answers
// it. Only the host-addressed Get and Post are expected; any other call fails the test.
class RecordingHttpClient : public ISimpleHTTPClient {
public:
    struct Request {
        QString method;
        QString host;
        QString path;
        quint16 port = 0;
        bool useSSL = false;
        QString user;
        QString password;
        QByteArray body;
        QString contentType;
        uint timeout = 0;
        QStringList headers;
        HttpReplyCallback reply;
        bool answered = false;
    };

    // Answers what is still pending with OperationCanceledError, as a real client does.
    ~RecordingHttpClient() override;

    // Calls the reply callback of requests[index], which may start further requests.
    void answer(std::size_t index, QNetworkReply::NetworkError outcome,
                const QByteArray& body = QByteArray());
    // Answers every pending request, including those started by the answers, in order.
    void answerAll(QNetworkReply::NetworkError outcome, const QByteArray& body = QByteArray());
    std::size_t pendingCount() const;

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

    std::vector<Request> requests;
};
