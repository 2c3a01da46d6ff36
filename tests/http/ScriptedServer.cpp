#include "ScriptedServer.h"

#include <QRegularExpression>
#include <QTcpSocket>

namespace {

// The length of the first whole request in buffer, or 0 while it is incomplete.
qsizetype requestLength(const QByteArray& buffer) {
    static const QRegularExpression length(QStringLiteral("\r\ncontent-length: *(\\d+)"),
                                           QRegularExpression::CaseInsensitiveOption);
    const qsizetype head = buffer.indexOf("\r\n\r\n") + 4;
    const qsizetype total =
        head + length.match(QString::fromLatin1(buffer.left(head))).captured(1).toLongLong();
    return head >= 4 && buffer.size() >= total ? total : 0;
}

} // namespace

ScriptedServer::Reply ScriptedServer::ok(const QByteArray& body) {
    return {"HTTP/1.1 200 OK\r\nContent-Length: " + QByteArray::number(body.size()) + "\r\n\r\n" +
            body};
}

ScriptedServer::ScriptedServer(std::vector<Reply> script, Reply last, const QHostAddress& address)
    : script(std::move(script)) {
    this->script.push_back(std::move(last));
    listen(address, 0);
    connect(this, &QTcpServer::newConnection, this, [this] {
        while (QTcpSocket* socket = nextPendingConnection()) {
            const int connection = ++connections;
            ++open;
            connect(socket, &QTcpSocket::readyRead, socket,
                    [this, socket, connection] { answer(socket, connection); });
            // Not while the server goes: its sockets close as it deletes them.
            connect(socket, &QTcpSocket::disconnected, this, [this, socket] {
                --open;
                socket->deleteLater();
            });
        }
    });
}

void ScriptedServer::answer(QTcpSocket* socket, int connection) {
    while (const qsizetype length = requestLength(socket->peek(socket->bytesAvailable()))) {
        const QByteArray request = socket->read(length);
        const Reply& reply = script[std::min(requests.size(), script.size() - 1)];
        requests.push_back(request.toStdString());
        received += (received.empty() ? "" : "; ") + std::to_string(connection) + ' ' +
                    request.left(request.indexOf(" HTTP/")).toStdString();
        socket->write(reply.bytes);
        if (!reply.flood.isEmpty()) {
            // One write at a time, so that the server holds no more than that.
            connect(socket, &QTcpSocket::bytesWritten, socket, [socket, flood = reply.flood] {
                if (socket->bytesToWrite() == 0)
                    socket->write(flood);
            });
            return;
        }
        if (reply.close) {
            socket->disconnectFromHost();
            return;
        }
    }
}
