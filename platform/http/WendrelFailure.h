#pragma once

#include <QByteArray>
#include <QByteArrayView>
#include <QNetworkReply>

// Why a request failed: the outcome its callback gets, and the reason in words for the log.
struct WendrelFailure {
    QNetworkReply::NetworkError error = QNetworkReply::NoError;
    QByteArray reason;

    bool failed() const { return error != QNetworkReply::NoError; }

    // Text that came from a peer, fit for a log line: control characters, bytes beyond ASCII
    // and backslashes escaped, so that it cannot end the line or forge another, and cut to
    // maxPeerText bytes.
    static QByteArray peerText(QByteArrayView text);
    static constexpr qsizetype maxPeerText = 256;
};
