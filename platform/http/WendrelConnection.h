#pragma once

#include "WendrelFailure.h"
#include "WendrelResponseReader.h"

#include <QByteArray>
#include <QList>
#include <QObject>
#include <QSslError>
#include <QString>

#include <functional>

class QTcpSocket;
class WendrelTls;

// One HTTP/1.1 connection to one server, kept open between exchanges when the server allows it,
// carrying one exchange at a time. Lives on Wendrel's worker thread and is used only there.
// TLS is Qt's.
//
// Reading is bounded whatever the peer's speed: bytes are taken from the socket in chunks of
// readChunkSize into one buffer of the thread and handed to the answer's reader at once, which
// stops at its header and body limits; a TLS socket buffers at most readChunkSize of them.
class WendrelConnection : public QObject {
public:
    // Connecting: until the socket is connected (and encrypted); a request may wait to go out.
    // Idle: kept alive between exchanges. Writing: a request is going out; an early answer is
    // read meanwhile. Reading: the request went out whole; its answer is awaited or read.
    // Closed: nothing more happens; the object goes once control returns to the event loop.
    enum class State { Connecting, Idle, Writing, Reading, Closed };

    struct Outcome {
        WendrelResponseReader::Answer answer; // status 0 when no final answer was read
        WendrelFailure failure;               // none when the answer is complete
        bool reachedServer = false;           // the request went out whole, or an answer came back
        bool answerBegan = false;             // some of an answer arrived
        bool connectionReused = false;        // an earlier exchange had ended on the connection
    };
    // The end of one exchange, reported once, from the event loop; never after close().
    using Finished = std::function<void(WendrelConnection* connection, Outcome outcome)>;
    // The server closed the connection, or it failed, while it was idle.
    using Dropped = std::function<void(WendrelConnection* connection)>;

    static constexpr qint64 readChunkSize = 64 * 1024;

    // tls is set for https, and outlives the connection.
    WendrelConnection(const QString& host, quint16 port, WendrelTls* tls, qint64 maxBodySize,
                      Dropped dropped, QObject* parent);

    // Sends message, a whole request, while Connecting (it goes out once connected) or Idle.
    void send(const QByteArray& message, Finished finished);
    // Reports nothing more and goes, with its socket, once control returns to the event loop.
    void close();
    State state() const { return current; }
    // During an exchange: whether its request went out whole, or an answer began.
    bool reachedServer() const;
    // During an exchange: what it was doing, for a time-out's reason.
    QByteArray activity() const;

private:
    void setState(State next);
    void write(const QByteArray& message);
    void connected();
    // Whether the exchange ended, the input did, or more is to come.
    enum class Pull { Done, Ended, Waiting };

    void read();
    Pull pull();
    void written();
    void failed();
    void endOfInput();
    void answerRead(qsizetype used, qsizetype size);
    void tlsErrorsFound(const QList<QSslError>& errors);
    WendrelFailure socketFailure() const;
    WendrelFailure readerFailure() const;
    void finish(WendrelFailure failure);

    QTcpSocket* socket = nullptr;
    const WendrelTls* tls;
    Dropped dropped;
    State current = State::Connecting;
    WendrelResponseReader reader;
    Finished finished;         // set while an exchange is on
    QByteArray pendingMessage; // written once connected
    bool surplus = false;      // bytes came after the answer, so the next would be out of step
    int exchanges = 0;
    QByteArray tlsErrors; // what the handshake found wrong, for the failure's reason
};
