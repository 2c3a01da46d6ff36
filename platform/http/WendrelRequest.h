// One request as it travels from the calling thread to the worker.
#pragma once

#include "ISimpleHTTPClient.h"

#include <QByteArray>
#include <QString>
#include <QStringList>
#include <QUrl>

#include <chrono>
#include <optional>

struct WendrelRequest {
    using Clock = std::chrono::steady_clock;

    QByteArray method;
    QUrl url;
    QByteArray body;
    QString contentType;
    QStringList headers; // "Name: value"
    QString user;
    QString password;
    bool bearer = false;         // the password goes out as a bearer token, user is unused
    Clock::time_point submitted; // when the caller made the request
    std::optional<Clock::time_point> deadline;
    HttpReplyCallback callback;
};
