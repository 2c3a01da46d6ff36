#pragma once

#include <QList>
#include <QSslCertificate>
#include <QSslConfiguration>
#include <QString>

#include <optional>

struct WendrelSettings;

// The TLS side of the settings: the configuration connections use, and the pinned camera
// certificates. A pinned certificate is trusted only as itself: a server that presents it as its
// own (leaf) certificate is accepted whatever name it was reached by, and it is never a
// certificate authority, so that a camera's key cannot vouch for another server. Used on the
// worker thread only.
class WendrelTls {
public:
    explicit WendrelTls(const WendrelSettings& settings);

    // Made on first use, as loading the system's roots is slow; nullopt for Qt's default.
    const std::optional<QSslConfiguration>& configuration();
    // Whether chain is a server's certificate chain that starts with a pinned certificate.
    bool pinned(const QList<QSslCertificate>& chain) const;

private:
    QString caFile;
    bool insecure = false;
    QList<QSslCertificate> pins;
    bool configured = false;
    std::optional<QSslConfiguration> made;
};
