#pragma once

#include <QByteArray>
#include <QString>

// The bearer token of quenvar-host serve: made for one run, or given through the environment.
class AccessToken {
public:
    // Shorter tokens are refused: the front is reachable by every local program.
    static const int MIN_LENGTH = 16;

    // 256 random bits, URL-safe base64 without padding (43 characters).
    static QByteArray generate();
    // Whether token can be sent as a bearer token and is long enough; false with a message.
    static bool acceptable(const QByteArray& token, QString* error);
    // Writes token and a line break to path, readable and writable by the owner only. The file is
    // written beside path and renamed over it, so that no one can read it half written or
    // through a looser mode an older file had.
    static bool writeFile(const QString& path, const QByteArray& token, QString* error);
};
