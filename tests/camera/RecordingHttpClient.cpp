#include "RecordingHttpClient.h"

#include <gtest/gtest.h>

#include <utility>

RecordingHttpClient::~RecordingHttpClient() {
    answerAll(QNetworkReply::OperationCanceledError);
}

void RecordingHttpClient::answer(std::size_t index, QNetworkReply::NetworkError outcome,
                                 const QByteArray& body) {
    if (index >= requests.size() || requests[index].answered) {
        ADD_FAILURE() << "no pending request " << index;
        return;
    }
    // The callback may add requests, so nothing refers into the vector while it runs.
    HttpReplyCallback reply = std::move(requests[index].reply);
    requests[index].answered = true;
    reply(outcome, QByteArray(), body, outcome == QNetworkReply::NoError);
}

void RecordingHttpClient::answerAll(QNetworkReply::NetworkError outcome, const QByteArray& body) {
    for (std::size_t index = 0; index < requests.size(); ++index) {
        if (!requests[index].answered)
            answer(index, outcome, body);
    }
}

std::size_t RecordingHttpClient::pendingCount() const {
    std::size_t pending = 0;
    for (const Request& request : requests)
        pending += request.answered ? 0 : 1;
    return pending;
}

bool RecordingHttpClient::Get(const QString& host, const QString& path, quint16 port, bool useSSL,
                              const QString& user, const QString& password,
                              HttpReplyCallback callback, uint timeout,
                              const QStringList& headers) {
    requests.push_back(Request{QStringLiteral("GET"), host, path, port, useSSL, user, password,
                               QByteArray(), QString(), timeout, headers, std::move(callback)});
    return true;
}

bool RecordingHttpClient::Post(const QString& host, const QByteArray& body, const QString& path,
                               quint16 port, bool useSSL, const QString& user,
                               const QString& password, const QString& contentType,
                               HttpReplyCallback callback, uint timeout) {
    requests.push_back(Request{QStringLiteral("POST"), host, path, port, useSSL, user, password,
                               body, contentType, timeout, QStringList(), std::move(callback)});
    return true;
}

bool RecordingHttpClient::Get(const QString&, const QString&, const QString&, HttpReplyCallback,
                              uint) {
    ADD_FAILURE() << "Get by URL is not expected";
    return false;
}

bool RecordingHttpClient::Post(const QString&, const QByteArray&, const QString&, const QString&,
                               const QString&, HttpReplyCallback, uint, const QStringList&) {
    ADD_FAILURE() << "Post by URL is not expected";
    return false;
}

bool RecordingHttpClient::PostWithOAuth(const QString&, const QByteArray&, const QString&, quint16,
                                        bool, const QString&, const QString&, const QString&,
                                        HttpReplyCallback, uint) {
    ADD_FAILURE() << "PostWithOAuth is not expected";
    return false;
}

bool RecordingHttpClient::Delete(const QString&, const QByteArray&, const QString&, quint16, bool,
                                 const QString&, const QString&, const QString&, HttpReplyCallback,
                                 uint) {
    ADD_FAILURE() << "Delete is not expected";
    return false;
}

bool RecordingHttpClient::Put(const QString&, const QByteArray&, const QString&, quint16, bool,
                              const QString&, const QString&, const QString&, HttpReplyCallback,
                              uint) {
    ADD_FAILURE() << "Put is not expected";
    return false;
}
