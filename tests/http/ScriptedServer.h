#pragma once

#include <QByteArray>
#include <QObject>
#include <QThread>

#include <memory>
#include <mutex>
#include <string>
#include <vector>

class QTcpServer;

// An HTTP server on loopback, on a thread of its own, that answers the n-th request it receives
// with the n-th scripted reply, written as it stands: for what a well-behaved server would not
// do. Requests are read whole (head and Content-Length body) before their reply goes out.
class ScriptedServer {
public:
    struct Reply {
        QByteArray bytes;   // written as they stand; may be empty
        bool close = false; // then the connection is closed
    };

    explicit ScriptedServer(std::vector<Reply> replies);
    ~ScriptedServer();

    quint16 port() const;
    int connections() const;
    // The request lines received, in order, each with the number of its connection (from 1).
    std::vector<std::string> requests() const;

    // Shared with the handlers on the server's thread.
    struct State {
        std::mutex mutex;
        std::vector<Reply> replies;
        std::vector<std::string> requests;
        int connections = 0;
        quint16 port = 0;
    };

private:
    void accept();

    std::shared_ptr<State> state = std::make_shared<State>();
    QThread thread;
    QObject context; // lives on thread, as do the server and its sockets
    QTcpServer* server = nullptr;
};
