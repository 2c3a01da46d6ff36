#include "ScriptedServer.h"

#include <QHostAddress>
#include <QTcpServer>
#include <QTcpSocket>

namespace {

// The length of the first whole request in buffer, or 0 while it is incomplete.
qsizetype requestLength(const QByteArray& buffer) {
    const qsizetype headEnd = buffer.indexOf("\r\n\r\n");
    if (headEnd < 0)
        return 0;
    qsizetype bodyLength = 0;
    for (const QByteArray& line : buffer.left(headEnd).split('\n')) {
        if (line.toLower().startsWith("content-length:"))
            bodyLength = line.mid(15).trimmed().toLongLong();
    }
    const qsizetype total = headEnd + 4 + bodyLength;
    return buffer.size() >= total ? total : 0;
}

// Answers each whole request in buffer with the next scripted reply.
void answerRequests(QTcpSocket* socket, QByteArray& buffer, int connection,
                    const std::shared_ptr<ScriptedServer::State>& state) {
    while (const qsizetype length = requestLength(buffer)) {
        const QByteArray request = buffer.left(length);
        buffer.remove(0, length);
        ScriptedServer::Reply reply{"", true};
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            const size_t index = state->requests.size();
            if (index < state->replies.size())
                reply = state->replies[index];
            state->requests.push_back(std::to_string(connection) + ' ' +
                                      request.left(request.indexOf("\r\n")).toStdString());
        }
        socket->write(reply.bytes);
        if (reply.close) {
            socket->disconnectFromHost();
            return;
        }
    }
}

} // namespace

ScriptedServer::ScriptedServer(std::vector<Reply> replies) {
    state->replies = std::move(replies);
    context.moveToThread(&thread);
    thread.start();
    QMetaObject::invokeMethod(
        &context,
        [this] {
            server = new QTcpServer;
            server->listen(QHostAddress::LocalHost, 0);
            std::lock_guard<std::mutex> lock(state->mutex);
            state->port = server->serverPort();
            QObject::connect(server, &QTcpServer::newConnection, server, [this] { accept(); });
        },
        Qt::BlockingQueuedConnection);
}

ScriptedServer::~ScriptedServer() {
    QMetaObject::invokeMethod(
        &context, [this] { delete server; }, Qt::BlockingQueuedConnection);
    thread.quit();
    thread.wait();
}

void ScriptedServer::accept() {
    while (QTcpSocket* socket = server->nextPendingConnection()) {
        int connection = 0;
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            connection = ++state->connections;
        }
        auto buffer = std::make_shared<QByteArray>();
        QObject::connect(socket, &QTcpSocket::readyRead, socket,
                         [socket, buffer, connection, state = state] {
                             *buffer += socket->readAll();
                             answerRequests(socket, *buffer, connection, state);
                         });
        QObject::connect(socket, &QTcpSocket::disconnected, socket, &QObject::deleteLater);
    }
}

quint16 ScriptedServer::port() const {
    std::lock_guard<std::mutex> lock(state->mutex);
    return state->port;
}

int ScriptedServer::connections() const {
    std::lock_guard<std::mutex> lock(state->mutex);
    return state->connections;
}

std::vector<std::string> ScriptedServer::requests() const {
    std::lock_guard<std::mutex> lock(state->mutex);
    return state->requests;
}
