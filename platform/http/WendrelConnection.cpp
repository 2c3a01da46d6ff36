#include "WendrelConnection.h"

#include "WendrelTls.h"

#include <QCryptographicHash>
#include <QNetworkProxy>
#include <QSslCertificate>
#include <QSslSocket>
#include <QTcpSocket>

#include <utility>

namespace {

// As Qt's HTTP connections map them.
QNetworkReply::NetworkError networkError(QAbstractSocket::SocketError error) {
    switch (error) {
    case QAbstractSocket::ConnectionRefusedError:
        return QNetworkReply::ConnectionRefusedError;
    case QAbstractSocket::RemoteHostClosedError:
        return QNetworkReply::RemoteHostClosedError;
    case QAbstractSocket::HostNotFoundError:
        return QNetworkReply::HostNotFoundError;
    case QAbstractSocket::SocketTimeoutError:
        return QNetworkReply::TimeoutError;
    case QAbstractSocket::SslHandshakeFailedError:
        return QNetworkReply::SslHandshakeFailedError;
    default:
        return QNetworkReply::UnknownNetworkError;
    }
}

bool legal(WendrelConnection::State from, WendrelConnection::State to) {
    using State = WendrelConnection::State;
    switch (from) {
    case State::Connecting:
        return to == State::Writing || to == State::Idle || to == State::Closed;
    case State::Idle:
        return to == State::Writing || to == State::Closed;
    case State::Writing:
        return to == State::Reading || to == State::Closed;
    case State::Reading:
        return to == State::Idle || to == State::Closed;
    case State::Closed:
        return false;
    }
    return false;
}

QByteArray describe(const QSslCertificate& certificate) {
    return "subject " + WendrelFailure::peerText(certificate.subjectDisplayName().toUtf8()) +
           ", issuer " + WendrelFailure::peerText(certificate.issuerDisplayName().toUtf8()) +
           ", SHA-256 " + certificate.digest(QCryptographicHash::Sha256).toHex(':');
}

} // namespace

WendrelConnection::WendrelConnection(const QString& host, quint16 port, WendrelTls* tls,
                                     qint64 maxBodySize, Dropped dropped, QObject* parent)
    : QObject(parent)
    , tls(tls)
    , dropped(std::move(dropped))
    , reader(WendrelResponseReader::defaultMaxHeaderSize, maxBodySize) {
    if (tls) {
        auto* ssl = new QSslSocket(this);
        if (const std::optional<QSslConfiguration>& configuration = tls->configuration())
            ssl->setSslConfiguration(*configuration);
        ssl->setReadBufferSize(readChunkSize);
        // Certificate errors fail the handshake with SslHandshakeFailedError, unless the server
        // presents a pinned certificate.
        connect(ssl, &QSslSocket::sslErrors, this, &WendrelConnection::tlsErrorsFound);
        connect(ssl, &QSslSocket::encrypted, this, &WendrelConnection::connected);
        socket = ssl;
    } else {
        socket = new QTcpSocket(this);
        connect(socket, &QTcpSocket::connected, this, &WendrelConnection::connected);
    }
    socket->setProxy(QNetworkProxy::NoProxy);
    connect(socket, &QIODevice::readyRead, this, &WendrelConnection::read);
    connect(socket, &QIODevice::bytesWritten, this, &WendrelConnection::written);
    // Qt may report a failure inside a call such as write(); it is handled from the event loop,
    // by which time the state says whose it is.
    connect(socket, &QAbstractSocket::errorOccurred, this, &WendrelConnection::failed,
            Qt::QueuedConnection);
    connect(socket, &QAbstractSocket::disconnected, this, &WendrelConnection::endOfInput,
            Qt::QueuedConnection);
    // From the event loop: a failure to connect is then never reported inside the caller.
    QMetaObject::invokeMethod(
        this,
        [this, host, port] {
            if (current == State::Closed)
                return;
            if (auto* ssl = qobject_cast<QSslSocket*>(socket))
                ssl->connectToHostEncrypted(host, port);
            else
                // Unbuffered: written at once, read straight from the socket.
                socket->connectToHost(host, port, QIODevice::ReadWrite | QIODevice::Unbuffered);
        },
        Qt::QueuedConnection);
}

void WendrelConnection::send(const QByteArray& message, Finished done) {
    Q_ASSERT(current == State::Connecting || current == State::Idle);
    Q_ASSERT(!finished);
    finished = std::move(done);
    reader.reset();
    surplus = false;
    if (current == State::Idle)
        write(message);
    else
        pendingMessage = message;
}

void WendrelConnection::close() {
    if (current == State::Closed)
        return;
    current = State::Closed;
    finished = nullptr;
    dropped = nullptr;
    disconnect(socket, nullptr, this, nullptr);
    socket->abort();
    deleteLater();
}

bool WendrelConnection::reachedServer() const {
    return current == State::Reading || reader.began();
}

QByteArray WendrelConnection::activity() const {
    switch (current) {
    case State::Connecting:
        return qobject_cast<QSslSocket*>(socket) ? "connecting (TCP and TLS)" : "connecting";
    case State::Writing:
        return "sending the request";
    case State::Reading:
        return reader.began() ? "reading the answer" : "waiting for the answer";
    case State::Idle:
    case State::Closed:
        break;
    }
    return "between requests";
}

void WendrelConnection::setState(State next) {
    Q_ASSERT(legal(current, next));
    current = next;
}

void WendrelConnection::write(const QByteArray& message) {
    setState(State::Writing);
    // Written at once rather than on the next turn of the event loop.
    if (socket->write(message) != message.size()) {
        // A socket that Qt already found closed reports nothing more: say so from the loop.
        QMetaObject::invokeMethod(
            this,
            [this, exchange = exchanges] {
                if (current == State::Writing && exchanges == exchange)
                    finish({QNetworkReply::RemoteHostClosedError,
                            "connection closed before the request went out"});
            },
            Qt::QueuedConnection);
        return;
    }
    socket->flush();
    written();
}

void WendrelConnection::connected() {
    socket->setSocketOption(QAbstractSocket::LowDelayOption, 1);
    if (current != State::Connecting)
        return;
    if (pendingMessage.isEmpty())
        setState(State::Idle);
    else
        write(std::exchange(pendingMessage, QByteArray()));
}

void WendrelConnection::read() {
    if (current == State::Idle) {
        // Nothing may arrive between exchanges, and the end of the input drops it too.
        char probe;
        if (socket->read(&probe, 1) != 0 && dropped)
            dropped(this);
        return;
    }
    if ((current == State::Writing || current == State::Reading) && pull() == Pull::Ended)
        endOfInput();
}

WendrelConnection::Pull WendrelConnection::pull() {
    // One buffer per thread: connections hold no read buffer of their own.
    static thread_local char buffer[readChunkSize];
    while (current == State::Writing || current == State::Reading) {
        const qint64 size = socket->read(buffer, readChunkSize);
        if (size == 0)
            return Pull::Waiting;
        // An unbuffered socket that reads the end of its input says so only this way.
        if (size < 0)
            return Pull::Ended;
        const qsizetype used = reader.feed(buffer, qsizetype(size));
        if (reader.state() != WendrelResponseReader::State::Reading) {
            answerRead(used, qsizetype(size));
            break;
        }
    }
    return Pull::Done;
}

void WendrelConnection::written() {
    if (current == State::Writing && socket->bytesToWrite() == 0)
        setState(State::Reading);
}

void WendrelConnection::failed() {
    const QAbstractSocket::SocketError error = socket->error();
    if (error == QAbstractSocket::RemoteHostClosedError) {
        endOfInput();
    } else if (current == State::Connecting && !finished) {
        if (dropped)
            dropped(this);
    } else if (current == State::Idle) {
        if (dropped)
            dropped(this);
    } else if (current != State::Closed) {
        finish(socketFailure());
    }
}

void WendrelConnection::endOfInput() {
    if (current == State::Closed)
        return;
    if (!finished) {
        if (dropped)
            dropped(this);
        return;
    }
    if (current == State::Connecting) {
        finish({QNetworkReply::RemoteHostClosedError,
                qobject_cast<QSslSocket*>(socket)
                    ? "connection closed by the server during the TLS handshake"
                    : "connection closed by the server while connecting"});
        return;
    }
    // What a buffered (TLS) socket still holds belongs to the answer.
    if (pull() == Pull::Done)
        return;
    reader.endOfInput();
    answerRead(0, 0);
}

void WendrelConnection::answerRead(qsizetype used, qsizetype size) {
    if (reader.state() == WendrelResponseReader::State::Complete) {
        surplus = used < size;
        finish({});
    } else {
        finish(readerFailure());
    }
}

void WendrelConnection::tlsErrorsFound(const QList<QSslError>& errors) {
    auto* ssl = static_cast<QSslSocket*>(socket);
    if (tls->pinned(ssl->peerCertificateChain())) {
        ssl->ignoreSslErrors();
        return;
    }
    tlsErrors.clear();
    for (const QSslError& error : errors) {
        if (!tlsErrors.isEmpty())
            tlsErrors.append("; ");
        tlsErrors.append(WendrelFailure::peerText(error.errorString().toUtf8()));
    }
    const QSslCertificate peer = ssl->peerCertificate();
    if (!peer.isNull())
        tlsErrors.append(" (peer certificate: " + describe(peer) + ')');
}

WendrelFailure WendrelConnection::socketFailure() const {
    const QAbstractSocket::SocketError error = socket->error();
    const QNetworkReply::NetworkError mapped = networkError(error);
    switch (error) {
    case QAbstractSocket::ConnectionRefusedError:
        return {mapped, "connection refused"};
    case QAbstractSocket::HostNotFoundError:
        return {mapped, "host not found"};
    case QAbstractSocket::SslHandshakeFailedError:
        return {mapped,
                "TLS handshake failed: " +
                    (tlsErrors.isEmpty() ? WendrelFailure::peerText(socket->errorString().toUtf8())
                                         : tlsErrors)};
    default:
        return {mapped,
                "network error: " + WendrelFailure::peerText(socket->errorString().toUtf8())};
    }
}

WendrelFailure WendrelConnection::readerFailure() const {
    using Failure = WendrelResponseReader::Failure;
    switch (reader.failure()) {
    case Failure::HeadersTooLarge:
        return {QNetworkReply::UnknownContentError, "answer over the cap: header lines over " +
                                                        QByteArray::number(reader.maxHeaderSize()) +
                                                        " bytes"};
    case Failure::BodyTooLarge:
        return {QNetworkReply::UnknownContentError, "answer over the cap: body over " +
                                                        QByteArray::number(reader.maxBodySize()) +
                                                        " bytes"};
    case Failure::Malformed:
        return {QNetworkReply::ProtocolFailure,
                QByteArray("malformed answer (") + reader.parserError() + ')'};
    case Failure::EndedEarly:
    case Failure::None:
        break;
    }
    return {QNetworkReply::RemoteHostClosedError,
            reader.began() ? "connection closed by the server in the middle of the answer"
                           : "connection closed by the server before any answer"};
}

void WendrelConnection::finish(WendrelFailure failure) {
    if (!finished)
        return;
    Outcome outcome;
    outcome.answerBegan = reader.began();
    outcome.reachedServer = reachedServer();
    outcome.connectionReused = exchanges > 0;
    const bool reusable = !failure.failed() && current == State::Reading && !surplus &&
                          reader.answer().keepAlive && socket->bytesAvailable() == 0 &&
                          socket->state() == QAbstractSocket::ConnectedState;
    outcome.answer = reader.takeAnswer();
    outcome.failure = std::move(failure);
    ++exchanges;
    const Finished done = std::move(finished);
    finished = nullptr;
    if (reusable)
        setState(State::Idle);
    else
        close();
    // The callback may send on this connection again.
    done(this, std::move(outcome));
}
