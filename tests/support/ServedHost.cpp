#include "ServedHost.h"

#include "BuildPaths.h"
#include "EventLoopWait.h"

#include <QElapsedTimer>
#include <QJsonDocument>
#include <QRegularExpression>

#include <memory>
#include <vector>

namespace {

// Longer than any answer may take: the host's own wait is 30 s.
const int READ_TIMEOUT_MS = 40000;

// Whether data holds a whole reply with a Content-Length.
bool isWhole(const QByteArray& data) {
    const qsizetype end = data.indexOf("\r\n\r\n");
    const QRegularExpressionMatch length =
        QRegularExpression("\r\nContent-Length: (\\d+)\r\n",
                           QRegularExpression::CaseInsensitiveOption)
            .match(QString::fromLatin1(data.left(end + 2)));
    return end >= 0 && length.hasMatch() &&
           data.size() - end - 4 >= length.captured(1).toLongLong();
}

ServedHost::Reply parse(const QByteArray& data) {
    ServedHost::Reply reply;
    const qsizetype end = data.indexOf("\r\n\r\n");
    if (end >= 0) {
        reply.head = data.left(end + 2);
        reply.status = reply.head.split(' ').value(1).toInt();
        reply.body = data.mid(end + 4);
    }
    return reply;
}

} // namespace

QJsonObject ServedHost::Reply::json() const {
    return QJsonDocument::fromJson(body).object();
}

bool ServedHost::serve(const QStringList& arguments, const QByteArray& token,
                       QProcessEnvironment environment) {
    this->token = token;
    environment.remove(QStringLiteral("QUENVAR_HOST_TOKEN"));
    if (!token.isNull())
        environment.insert(QStringLiteral("QUENVAR_HOST_TOKEN"), QString::fromLatin1(token));
    return start(BuildPaths::bin("quenvar-host"),
                 QStringList{"serve", "--listen", "127.0.0.1:0"} + arguments, environment);
}

QByteArray ServedHost::message(const QByteArray& line, const QByteArrayList& fields,
                               const QByteArray& body) {
    QByteArray text = line + "\r\n" + fields.join("\r\n") + "\r\n";
    if (!body.isEmpty())
        text += "Content-Length: " + QByteArray::number(body.size()) + "\r\n";
    return text + "\r\n" + body;
}

QByteArray ServedHost::request(const QString& command, const QVariant& params) {
    return QJsonDocument(
               QJsonObject{{"command", command}, {"params", QJsonValue::fromVariant(params)}})
        .toJson(QJsonDocument::Compact);
}

QList<ServedHost::Reply> ServedHost::exchange(const QList<QByteArray>& messages) const {
    std::vector<std::unique_ptr<QTcpSocket>> sockets;
    QList<QByteArray> received(messages.size());
    QList<Reply> replies(messages.size());
    QElapsedTimer clock;
    clock.start();
    for (const QByteArray& message : messages) {
        sockets.push_back(std::make_unique<QTcpSocket>());
        sockets.back()->connectToHost(QHostAddress::LocalHost, port());
        sockets.back()->write(message);
    }
    // A camera played by this process answers in this event loop meanwhile.
    runEventLoopUntil(
        [&] {
            bool all = true;
            for (qsizetype i = 0; i < messages.size(); ++i) {
                QTcpSocket& socket = *sockets.at(static_cast<size_t>(i));
                if (replies.at(i).elapsedMs >= 0)
                    continue;
                received[i] += socket.readAll();
                if (!isWhole(received.at(i)) &&
                    socket.state() != QAbstractSocket::UnconnectedState) {
                    all = false;
                    continue;
                }
                replies[i] = parse(received.at(i));
                replies[i].elapsedMs = clock.elapsed();
            }
            return all;
        },
        READ_TIMEOUT_MS);
    return replies;
}

QList<ServedHost::Reply> ServedHost::post(const QList<QByteArray>& bodies) const {
    QList<QByteArray> messages;
    for (const QByteArray& body : bodies)
        messages << message("POST /api/request HTTP/1.1",
                            {hostField(), tokenField(), "Content-Type: application/json"}, body);
    return exchange(messages);
}

ServedHost::Reply ServedHost::get(const QByteArray& target, const QByteArray& withToken) const {
    return exchange({message("GET " + target + " HTTP/1.1",
                             {hostField(), "Authorization: Bearer " + withToken})})
        .first();
}

EventStream::EventStream(const ServedHost& host, const QByteArray& subscriber) {
    socket.connectToHost(QHostAddress::LocalHost, host.port());
    socket.write(ServedHost::message("GET /api/events?subscriber=" + subscriber + " HTTP/1.1",
                                     {host.hostField(), host.tokenField()}));
}

bool EventStream::waitFor(const char* wanted, int times, int timeoutMs) {
    return runEventLoopUntil([this, wanted, times] { return read().count(wanted) >= times; },
                             timeoutMs);
}
