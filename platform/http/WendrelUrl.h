#pragma once

#include <QString>
#include <QUrl>

// Request URLs. Paths and queries are taken as already percent-encoded: an escape such as %26
// stays as it is, and only characters that may not appear in a URL at all are encoded.
class WendrelUrl {
public:
    // Scheme https when useSSL, else http; port 0 leaves the scheme's default.
    static QUrl fromParts(const QString& host, quint16 port, bool useSSL,
                          const QString& pathWithQuery);
    static QUrl fromText(const QString& url);
    static bool isHttp(const QUrl& url);
};
