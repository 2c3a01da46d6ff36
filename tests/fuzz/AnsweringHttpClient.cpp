#include "AnsweringHttpClient.h"

AnsweringHttpClient::AnsweringHttpClient(Responder responder)
    : responder(std::move(responder)) {}

bool AnsweringHttpClient::answer(const QString& path, const HttpReplyCallback& callback) const {
    const Answer given = responder(path);
    callback(given.outcome, QByteArray(), given.body, true);
    return true;
}

bool AnsweringHttpClient::Get(const QString&, const QString& path, quint16, bool, const QString&,
                              const QString&, HttpReplyCallback callback, uint,
                              const QStringList&) {
    return answer(path, callback);
}

bool AnsweringHttpClient::Get(const QString& url, const QString&, const QString&,
                              HttpReplyCallback callback, uint) {
    return answer(url, callback);
}

bool AnsweringHttpClient::Post(const QString&, const QByteArray&, const QString& path, quint16,
                               bool, const QString&, const QString&, const QString&,
                               HttpReplyCallback callback, uint) {
    return answer(path, callback);
}

bool AnsweringHttpClient::Post(const QString& url, const QByteArray&, const QString&,
                               const QString&, const QString&, HttpReplyCallback callback, uint,
                               const QStringList&) {
    return answer(url, callback);
}

bool AnsweringHttpClient::PostWithOAuth(const QString&, const QByteArray&, const QString& path,
                                        quint16, bool, const QString&, const QString&,
                                        const QString&, HttpReplyCallback callback, uint) {
    return answer(path, callback);
}

bool AnsweringHttpClient::Delete(const QString&, const QByteArray&, const QString& path, quint16,
                                 bool, const QString&, const QString&, const QString&,
                                 HttpReplyCallback callback, uint) {
    return answer(path, callback);
}

bool AnsweringHttpClient::Put(const QString&, const QByteArray&, const QString& path, quint16, bool,
                              const QString&, const QString&, const QString&,
                              HttpReplyCallback callback, uint) {
    return answer(path, callback);
}
