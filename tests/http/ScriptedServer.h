#pragma once

#include <QHostAddress>
#include <QTcpServer>

#include <string>
#include <vector>

// A loopback server, for what a well-behaved one would not do: it answers the n-th whole request
// it reads with the n-th reply of its script, and every later one with the last reply given.
// Serves while the test's thread runs its event loop.
class ScriptedServer : public QTcpServer {
public:
    struct Reply {
        Reply(const QByteArray& bytes, bool close = false, const QByteArray& flood = {})
            : bytes(bytes)
            , close(close)
            , flood(flood) {}

        QByteArray bytes; // written as they stand; may be empty
        bool close;       // then the connection is closed
        QByteArray flood; // then written again and again until the client goes
    };

    static Reply ok(const QByteArray& body);

    explicit ScriptedServer(std::vector<Reply> script, Reply last = {"", true},
                            const QHostAddress& address = QHostAddress::LocalHost);

    int connections = 0;
    int open = 0; // connections the client has not closed
    // The number of its connection (from 1), method and target of each request, joined by "; ".
    std::string received;
    std::vector<std::string> requests; // whole

private:
    void answer(QTcpSocket* socket, int connection);

    std::vector<Reply> script;
};
