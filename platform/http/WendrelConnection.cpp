#include "WendrelConnection.h"

#include <QNetworkProxy>
#include <QSslSocket>
#include <QTcpSocket>

#include <climits>
#include <utility>

namespace {

WendrelConnection* ownerOf(http_parser* parser) {
    return static_cast<WendrelConnection*>(parser->data);
}

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

} // namespace

const http_parser_settings WendrelConnection::settings = [] {
    http_parser_settings result;
    http_parser_settings_init(&result);
    result.on_message_begin = &WendrelConnection::onMessageBegin;
    result.on_header_field = &WendrelConnection::onHeaderField;
    result.on_header_value = &WendrelConnection::onHeaderValue;
    result.on_headers_complete = &WendrelConnection::onHeadersComplete;
    result.on_body = &WendrelConnection::onBody;
    result.on_message_complete = &WendrelConnection::onMessageComplete;
    return result;
}();

WendrelConnection::WendrelConnection(const QString& host, quint16 port, bool https,
                                     const std::optional<QSslConfiguration>& tls,
                                     qint64 maxBodySize, Dropped dropped, QObject* parent)
    : QObject(parent)
    , maxBodySize(maxBodySize)
    , dropped(std::move(dropped)) {
    if (https) {
        auto* ssl = new QSslSocket(this);
        if (tls)
            ssl->setSslConfiguration(*tls);
        // Certificate errors are not ignored: the handshake fails with SslHandshakeFailedError.
        connect(ssl, &QSslSocket::encrypted, this, &WendrelConnection::connected);
        socket = ssl;
    } else {
        socket = new QTcpSocket(this);
        connect(socket, &QTcpSocket::connected, this, &WendrelConnection::connected);
    }
    socket->setProxy(QNetworkProxy::NoProxy);
    connect(socket, &QIODevice::readyRead, this, &WendrelConnection::read);
    connect(socket, &QIODevice::bytesWritten, this, &WendrelConnection::written);
    connect(socket, &QAbstractSocket::errorOccurred, this, &WendrelConnection::failed);
    connect(socket, &QAbstractSocket::disconnected, this, &WendrelConnection::endOfInput);
    // From the event loop: a failure to connect is then never reported inside the caller.
    QMetaObject::invokeMethod(
        this,
        [this, host, port] {
            if (closed)
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
    finished = std::move(done);
    answer = Answer();
    answer.connectionReused = exchanges > 0;
    answer.headers.reserve(256);
    readingField = readingValue = interim = complete = tooLarge = keepAlive = failedWhileWriting =
        false;
    http_parser_init(&parser, HTTP_RESPONSE);
    parser.data = this;
    unwritten = message.size();
    if (isConnected)
        write(message);
    else
        pendingMessage = message;
}

void WendrelConnection::close() {
    closed = true;
    finished = nullptr;
    dropped = nullptr;
    disconnect(socket, nullptr, this, nullptr);
    socket->abort();
    deleteLater();
}

void WendrelConnection::write(const QByteArray& message) {
    // Written at once rather than on the next turn of the event loop. A failure is then reported
    // by Qt inside this call; it is answered from the event loop instead, never inside send().
    writing = true;
    const bool queued = socket->write(message) == message.size();
    socket->flush();
    writing = false;
    if (queued && socket->bytesToWrite() == 0)
        answer.reachedServer = true;
    if (!queued || failedWhileWriting)
        QMetaObject::invokeMethod(
            this,
            [this, exchange = exchanges,
             error = failedWhileWriting ? failedWith : QNetworkReply::RemoteHostClosedError] {
                if (finished && exchanges == exchange)
                    finish(error);
            },
            Qt::QueuedConnection);
}

void WendrelConnection::connected() {
    isConnected = true;
    socket->setSocketOption(QAbstractSocket::LowDelayOption, 1);
    if (!pendingMessage.isEmpty())
        write(std::exchange(pendingMessage, QByteArray()));
}

void WendrelConnection::read() {
    const QByteArray data = socket->readAll();
    // An unbuffered socket that reads the end of its input says so only through its state.
    const bool ended = socket->state() == QAbstractSocket::UnconnectedState;
    if (!finished) {
        // Nothing may arrive between exchanges.
        if ((!data.isEmpty() || ended) && dropped)
            dropped(this);
        return;
    }
    feed(data.constData(), data.size());
    if (ended && finished)
        endOfInput();
}

void WendrelConnection::written(qint64 bytes) {
    if (!finished || unwritten <= 0)
        return;
    unwritten -= bytes;
    if (unwritten <= 0)
        answer.reachedServer = true;
}

void WendrelConnection::failed() {
    const QAbstractSocket::SocketError error = socket->error();
    if (error == QAbstractSocket::RemoteHostClosedError)
        endOfInput();
    else if (!handledElsewhere(networkError(error)))
        finish(networkError(error));
}

// A failure inside write() is answered by write(); one between exchanges drops the connection.
bool WendrelConnection::handledElsewhere(QNetworkReply::NetworkError error) {
    if (writing) {
        failedWhileWriting = true;
        failedWith = error;
        return true;
    }
    if (!finished) {
        if (dropped)
            dropped(this);
        return true;
    }
    return false;
}

void WendrelConnection::endOfInput() {
    if (handledElsewhere(QNetworkReply::RemoteHostClosedError))
        return;
    const QByteArray rest = socket->readAll();
    if (!rest.isEmpty()) {
        feed(rest.constData(), rest.size());
        if (!finished)
            return;
    }
    // The end of the input ends an answer that runs until the connection closes.
    http_parser_execute(&parser, &settings, nullptr, 0);
    keepAlive = false;
    finish(complete ? QNetworkReply::NoError : QNetworkReply::RemoteHostClosedError);
}

void WendrelConnection::feed(const char* data, qsizetype size) {
    if (size == 0)
        return;
    answer.answerBegan = true;
    answer.reachedServer = true;
    const size_t parsed = http_parser_execute(&parser, &settings, data, size_t(size));
    if (tooLarge) {
        answer.body.clear();
        keepAlive = false;
        finish(QNetworkReply::UnknownContentError);
    } else if (complete) {
        // Bytes beyond the answer would put every later exchange out of step.
        if (parsed < size_t(size))
            keepAlive = false;
        finish(QNetworkReply::NoError);
    } else if (HTTP_PARSER_ERRNO(&parser) != HPE_OK) {
        keepAlive = false;
        finish(QNetworkReply::ProtocolFailure);
    }
}

void WendrelConnection::finish(QNetworkReply::NetworkError error) {
    if (error != QNetworkReply::NoError || socket->state() != QAbstractSocket::ConnectedState)
        keepAlive = false;
    answer.error = error;
    ++exchanges;
    const Finished done = std::move(finished);
    finished = nullptr;
    // The callback may send on this connection again, or close it.
    done(this, std::move(answer));
}

void WendrelConnection::beginValue() {
    fieldEnd = answer.headers.size();
    answer.headers.append(": ");
    valueStart = answer.headers.size();
}

// Header lines go straight into the answer's text; only the two values used are copied.
void WendrelConnection::endHeaderLine() {
    if (!readingField && !readingValue)
        return;
    if (!readingValue)
        beginValue();
    QByteArray& text = answer.headers;
    const QByteArrayView field(text.constData() + fieldStart, fieldEnd - fieldStart);
    const QByteArrayView value(text.constData() + valueStart, text.size() - valueStart);
    const auto named = [&field](QByteArrayView name) {
        return field.size() == name.size() &&
               qstrnicmp(field.data(), name.data(), size_t(name.size())) == 0;
    };
    if (named("WWW-Authenticate")) {
        if (!answer.challenges.isEmpty())
            answer.challenges.append(", ");
        answer.challenges.append(value);
    } else if (named("Location")) {
        answer.location = value.toByteArray();
    }
    text.append("\r\n");
    readingField = readingValue = false;
}

int WendrelConnection::onMessageBegin(http_parser* parser) {
    // The final answer after an interim one starts afresh.
    WendrelConnection* self = ownerOf(parser);
    self->answer.headers.clear();
    self->answer.challenges.clear();
    self->answer.location.clear();
    self->answer.body.clear();
    return 0;
}

int WendrelConnection::onHeaderField(http_parser* parser, const char* at, size_t length) {
    WendrelConnection* self = ownerOf(parser);
    if (self->readingValue)
        self->endHeaderLine();
    if (!self->readingField) {
        self->readingField = true;
        self->fieldStart = self->answer.headers.size();
    }
    self->answer.headers.append(at, qsizetype(length));
    return 0;
}

int WendrelConnection::onHeaderValue(http_parser* parser, const char* at, size_t length) {
    WendrelConnection* self = ownerOf(parser);
    if (!self->readingValue) {
        self->readingValue = true;
        self->beginValue();
    }
    self->answer.headers.append(at, qsizetype(length));
    return 0;
}

int WendrelConnection::onHeadersComplete(http_parser* parser) {
    WendrelConnection* self = ownerOf(parser);
    self->endHeaderLine();
    self->answer.status = int(parser->status_code);
    self->interim = parser->status_code >= 100 && parser->status_code < 200;
    // A declared length over the cap ends the exchange before the body comes.
    if (!self->interim && parser->content_length != ULLONG_MAX &&
        parser->content_length > quint64(self->maxBodySize)) {
        self->tooLarge = true;
        return -1;
    }
    return 0;
}

int WendrelConnection::onBody(http_parser* parser, const char* at, size_t length) {
    WendrelConnection* self = ownerOf(parser);
    if (self->answer.body.size() + qint64(length) > self->maxBodySize) {
        self->tooLarge = true;
        return -1;
    }
    self->answer.body.append(at, qsizetype(length));
    return 0;
}

int WendrelConnection::onMessageComplete(http_parser* parser) {
    WendrelConnection* self = ownerOf(parser);
    if (self->interim)
        return 0;
    self->complete = true;
    self->keepAlive = http_should_keep_alive(parser) != 0;
    http_parser_pause(parser, 1);
    return 0;
}
