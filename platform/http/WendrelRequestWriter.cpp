#include "WendrelRequestWriter.h"

#include "WendrelUrl.h"

#include <algorithm>

namespace {

bool framingHeader(const QByteArray& name) {
    for (const char* framing : {"Host", "Content-Length", "Transfer-Encoding", "Connection"}) {
        if (name.compare(framing, Qt::CaseInsensitive) == 0)
            return true;
    }
    return false;
}

bool hasControl(const QString& text) {
    return std::any_of(text.begin(), text.end(),
                       [](QChar c) { return c.unicode() < 0x20 || c.unicode() == 0x7f; });
}

bool breaksLine(const QString& text) {
    return std::any_of(text.begin(), text.end(), [](QChar c) {
        return c == QLatin1Char('\r') || c == QLatin1Char('\n') || c == QLatin1Char('\0');
    });
}

// RFC 9110's token: the characters a header name may hold.
bool isToken(const QString& text) {
    static const QByteArray SPECIALS = "!#$%&'*+-.^_`|~";
    return !text.isEmpty() && std::all_of(text.begin(), text.end(), [](QChar c) {
        const char16_t u = c.unicode();
        return (u >= 'a' && u <= 'z') || (u >= 'A' && u <= 'Z') || (u >= '0' && u <= '9') ||
               (u < 128 && SPECIALS.contains(char(u)));
    });
}

} // namespace

const char* WendrelRequestWriter::unsafeField(const WendrelRequest& request) {
    if (request.bearer) {
        if (breaksLine(request.password))
            return "the bearer token holds CR, LF or NUL";
    } else if (hasControl(request.user)) {
        return "the user name holds a control character";
    } else if (hasControl(request.password)) {
        return "the password holds a control character";
    }
    for (const QString& header : request.headers) {
        const qsizetype colon = header.indexOf(QLatin1Char(':'));
        if (colon < 0 || !isToken(header.left(colon).trimmed()))
            return "a header name is not an HTTP token";
        if (breaksLine(header.mid(colon + 1)))
            return "a header value holds CR, LF or NUL";
    }
    if (breaksLine(request.contentType))
        return "the content type holds CR, LF or NUL";
    return nullptr;
}

QByteArray WendrelRequestWriter::write(const WendrelRequest& request, const QByteArray& target,
                                       const QByteArray& authorization) {
    QByteArray result;
    result.reserve(256 + request.body.size());
    result.append(request.method).append(' ').append(target).append(" HTTP/1.1\r\nHost: ");
    result.append(WendrelUrl::hostHeader(request.url)).append("\r\n");
    for (const QString& header : request.headers) {
        const qsizetype colon = header.indexOf(QLatin1Char(':'));
        const QByteArray name = header.left(colon).trimmed().toLatin1();
        if (!framingHeader(name))
            result.append(name)
                .append(": ")
                .append(header.mid(colon + 1).trimmed().toLatin1())
                .append("\r\n");
    }
    if (!request.contentType.isEmpty())
        result.append("Content-Type: ").append(request.contentType.toLatin1()).append("\r\n");
    if (!authorization.isEmpty())
        result.append("Authorization: ").append(authorization).append("\r\n");
    if (!request.body.isEmpty() || (request.method != "GET" && request.method != "HEAD"))
        result.append("Content-Length: ")
            .append(QByteArray::number(request.body.size()))
            .append("\r\n");
    result.append("\r\n").append(request.body);
    return result;
}
