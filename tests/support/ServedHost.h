#pragma once

#include "ListeningProcess.h"

#include <QJsonObject>
#include <QTcpSocket>

// quenvar-host serve with the build's plugins on a free loopback port, and raw HTTP/1.1 to it.
// Its exit code from stop() is not 0 after a crash or, under ASan, a leak.
class ServedHost : public ListeningProcess {
public:
    static constexpr char TOKEN[] = "served-host-test-token";

    struct Reply {
        int status = 0;  // 0: no reply
        QByteArray head; // the status line and header lines, each ending in CR LF
        QByteArray body;
        qint64 elapsedMs = -1; // from the sending of the requests

        QJsonObject json() const;
    };

    // The token goes to QUENVAR_HOST_TOKEN; a null one leaves the host to make its own.
    bool serve(const QStringList& arguments = {}, const QByteArray& token = TOKEN,
               QProcessEnvironment environment = QProcessEnvironment::systemEnvironment());

    QByteArray hostField() const { return "Host: 127.0.0.1:" + QByteArray::number(port()); }
    QByteArray tokenField() const { return "Authorization: Bearer " + token; }
    // A request's text; a Content-Length goes with a body.
    static QByteArray message(const QByteArray& line, const QByteArrayList& fields,
                              const QByteArray& body = {});
    // A body for POST /api/request.
    static QByteArray request(const QString& command, const QVariant& params);

    // Sends every message at once, each on a connection of its own, and returns the replies in
    // the same order.
    QList<Reply> exchange(const QList<QByteArray>& messages) const;
    // Posts every body to /api/request at once, with the token.
    QList<Reply> post(const QList<QByteArray>& bodies) const;
    // GET of target with the token, or with the given one.
    Reply get(const QByteArray& target) const { return get(target, token); }
    Reply get(const QByteArray& target, const QByteArray& withToken) const;

private:
    QByteArray token;
};

// One subscriber's event stream, read raw as the event loop runs.
class EventStream {
public:
    EventStream(const ServedHost& host, const QByteArray& subscriber);

    // Everything received so far, head included.
    const QByteArray& read() { return text += socket.readAll(); }
    // Whether text came at least times times within the time-out.
    bool waitFor(const char* text, int times = 1, int timeoutMs = 20000);
    bool isOpen() const { return socket.state() == QAbstractSocket::ConnectedState; }
    void close() { socket.abort(); }

private:
    QTcpSocket socket;
    QByteArray text;
};
