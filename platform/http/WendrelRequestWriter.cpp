#include "WendrelRequestWriter.h"

#include "WendrelUrl.h"

namespace {

bool framingHeader(const QByteArray& name) {
    for (const char* framing : {"Host", "Content-Length", "Transfer-Encoding", "Connection"}) {
        if (name.compare(framing, Qt::CaseInsensitive) == 0)
            return true;
    }
    return false;
}

} // namespace

QByteArray WendrelRequestWriter::write(const WendrelRequest& request, const QByteArray& target,
                                       const QByteArray& authorization) {
    QByteArray result;
    result.reserve(256 + request.body.size());
    result.append(request.method).append(' ').append(target).append(" HTTP/1.1\r\nHost: ");
    result.append(WendrelUrl::hostHeader(request.url)).append("\r\n");
    for (const QString& header : request.headers) {
        const qsizetype colon = header.indexOf(QLatin1Char(':'));
        const QByteArray name = header.left(colon).trimmed().toLatin1();
        if (colon > 0 && !framingHeader(name))
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
