#include "WendrelUrl.h"

#include <algorithm>

namespace {

bool isHexDigit(QChar c) {
    return (c >= QLatin1Char('0') && c <= QLatin1Char('9')) ||
           (c >= QLatin1Char('a') && c <= QLatin1Char('f')) ||
           (c >= QLatin1Char('A') && c <= QLatin1Char('F'));
}

// QUrl takes a text with one stray "%" as wholly unencoded and encodes every "%" again; a "#"
// would start a fragment, which is never sent. Both are escaped here, valid escapes are kept.
bool isStray(const QString& text, qsizetype i) {
    const QChar c = text.at(i);
    return c == QLatin1Char('#') ||
           (c == QLatin1Char('%') &&
            !(i + 2 < text.size() && isHexDigit(text.at(i + 1)) && isHexDigit(text.at(i + 2))));
}

QString escapeStrays(const QString& pathWithQuery) {
    qsizetype first = 0;
    while (first < pathWithQuery.size() && !isStray(pathWithQuery, first))
        ++first;
    if (first == pathWithQuery.size())
        return pathWithQuery;
    QString result = pathWithQuery.left(first);
    result.reserve(pathWithQuery.size() + 8);
    for (qsizetype i = first; i < pathWithQuery.size(); ++i) {
        if (!isStray(pathWithQuery, i))
            result += pathWithQuery.at(i);
        else if (pathWithQuery.at(i) == QLatin1Char('#'))
            result += QLatin1String("%23");
        else
            result += QLatin1String("%25");
    }
    return result;
}

// A DNS name or an IPv4 address, which can stand in the URL's text as it is.
bool isPlainHost(const QString& host) {
    return !host.isEmpty() && std::all_of(host.begin(), host.end(), [](QChar c) {
        return (c.unicode() < 128 && c.isLetterOrNumber()) || c == QLatin1Char('.') ||
               c == QLatin1Char('-');
    });
}

} // namespace

QUrl WendrelUrl::fromParts(const QString& host, quint16 port, bool useSSL,
                           const QString& pathWithQuery) {
    const QString path = escapeStrays(pathWithQuery);
    QString text;
    text.reserve(host.size() + path.size() + 16);
    if (isPlainHost(host)) {
        text.append(useSSL ? QLatin1String("https://") : QLatin1String("http://")).append(host);
        if (port != 0)
            text.append(QLatin1Char(':')).append(QString::number(port));
    } else {
        QUrl origin;
        origin.setScheme(useSSL ? QStringLiteral("https") : QStringLiteral("http"));
        origin.setHost(host);
        if (port != 0)
            origin.setPort(port);
        text.append(origin.toString(QUrl::FullyEncoded));
    }
    if (!path.startsWith(QLatin1Char('/')))
        text.append(QLatin1Char('/'));
    // The setters for path and query would encode "%" a second time; parsing the whole URL
    // keeps valid escapes as they are.
    return QUrl(text.append(path), QUrl::TolerantMode);
}

QUrl WendrelUrl::fromText(const QString& url) {
    return QUrl(url, QUrl::TolerantMode);
}

bool WendrelUrl::isHttp(const QUrl& url) {
    const QString scheme = url.scheme();
    return scheme == QLatin1String("http") || scheme == QLatin1String("https");
}

bool WendrelUrl::isHttps(const QUrl& url) {
    return url.scheme() == QLatin1String("https");
}

quint16 WendrelUrl::port(const QUrl& url) {
    return quint16(url.port(isHttps(url) ? 443 : 80));
}

QString WendrelUrl::origin(const QUrl& url) {
    const QString scheme = url.scheme();
    const QString host = url.host();
    QString origin;
    origin.reserve(scheme.size() + host.size() + 8);
    return origin.append(scheme)
        .append(QLatin1Char(' '))
        .append(host)
        .append(QLatin1Char(' '))
        .append(QString::number(port(url)));
}

namespace {

QByteArray hostText(const QUrl& url) {
    const QByteArray host = url.host(QUrl::FullyEncoded).toLatin1();
    return host.contains(':') ? '[' + host + ']' : host;
}

} // namespace

QByteArray WendrelUrl::hostHeader(const QUrl& url) {
    QByteArray host = hostText(url);
    const quint16 portNumber = port(url);
    if (portNumber != (isHttps(url) ? 443 : 80))
        host += ':' + QByteArray::number(portNumber);
    return host;
}

QByteArray WendrelUrl::forLog(const QUrl& url) {
    return url.scheme().toLatin1() + "://" + hostText(url) + ':' + QByteArray::number(port(url)) +
           url.path(QUrl::FullyEncoded).toLatin1();
}
