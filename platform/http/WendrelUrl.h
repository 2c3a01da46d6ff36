#pragma once

#include <QByteArray>
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
    // Whether the scheme is http or https.
    static bool isHttp(const QUrl& url);
    static bool isHttps(const QUrl& url);
    // The port, the scheme's default when the URL names none.
    static quint16 port(const QUrl& url);
    // Scheme, host and port: what one set of connections and remembered challenges serve.
    static QString origin(const QUrl& url);
    // The Host header's value: the port only when it is not the scheme's default.
    static QByteArray hostHeader(const QUrl& url);
    // Scheme, host, port and path for a log line: not the query, which may carry what is not
    // for a log.
    static QByteArray forLog(const QUrl& url);
};
