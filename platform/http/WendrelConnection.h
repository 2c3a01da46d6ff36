#pragma once

#include <QByteArray>
#include <QNetworkReply>
#include <QObject>
#include <QSslConfiguration>
#include <QString>

#include <functional>
#include <http_parser.h>
#include <optional>

class QTcpSocket;

// One HTTP/1.1 connection to one server, kept open between exchanges when the server allows it,
// carrying one exchange at a time. Lives on Wendrel's worker thread and is used only there.
// Answers are read with http_parser; TLS is Qt's.
class WendrelConnection : public QObject {
public:
    struct Answer {
        // A transport failure; an HTTP status of any value is not one.
        QNetworkReply::NetworkError error = QNetworkReply::NoError;
        int status = 0;        // 0 when no answer began
        QByteArray headers;    // "Name: value\r\n" for each header line
        QByteArray challenges; // the WWW-Authenticate values, joined by commas
        QByteArray location;
        QByteArray body;               // as much as arrived, also on failure
        bool reachedServer = false;    // the request went out whole, or an answer came back
        bool answerBegan = false;      // some of an answer arrived
        bool connectionReused = false; // an earlier exchange had ended on the connection
    };
    // The end of one exchange, reported once; never after close().
    using Finished = std::function<void(WendrelConnection* connection, Answer answer)>;
    // The server closed the connection, or it failed, while it carried no exchange.
    using Dropped = std::function<void(WendrelConnection* connection)>;

    // tls is set for https: the configuration to use, or nullopt for Qt's default.
    WendrelConnection(const QString& host, quint16 port, bool https,
                      const std::optional<QSslConfiguration>& tls, qint64 maxBodySize,
                      Dropped dropped, QObject* parent);

    // Sends message, a whole request; connects first when not yet connected.
    void send(const QByteArray& message, Finished finished);
    // Reports nothing more and goes, with its socket, once control returns to the event loop.
    void close();
    // After an exchange: whether the connection may carry another.
    bool reusable() const { return keepAlive; }
    // During an exchange: whether its request went out whole, or an answer began.
    bool reachedServer() const { return answer.reachedServer; }

private:
    static int onMessageBegin(http_parser* parser);
    static int onHeaderField(http_parser* parser, const char* at, size_t length);
    static int onHeaderValue(http_parser* parser, const char* at, size_t length);
    static int onHeadersComplete(http_parser* parser);
    static int onBody(http_parser* parser, const char* at, size_t length);
    static int onMessageComplete(http_parser* parser);
    static const http_parser_settings settings;

    void write(const QByteArray& message);
    void connected();
    void read();
    void written(qint64 bytes);
    void failed();
    bool handledElsewhere(QNetworkReply::NetworkError error);
    void endOfInput();
    void feed(const char* data, qsizetype size);
    void beginValue();
    void endHeaderLine();
    void finish(QNetworkReply::NetworkError error);

    QTcpSocket* socket = nullptr;
    qint64 maxBodySize = 0;
    Dropped dropped;

    http_parser parser;
    Finished finished; // set while an exchange is on
    Answer answer;
    QByteArray pendingMessage; // written once connected
    qint64 unwritten = 0;
    // Where the header line being read stands in answer.headers.
    qsizetype fieldStart = 0;
    qsizetype fieldEnd = 0;
    qsizetype valueStart = 0;
    bool readingField = false;
    bool readingValue = false;
    bool interim = false; // a 1xx answer, which the final one follows
    bool complete = false;
    bool tooLarge = false;
    bool keepAlive = false;
    bool isConnected = false;
    bool closed = false;
    bool writing = false;
    bool failedWhileWriting = false;
    QNetworkReply::NetworkError failedWith = QNetworkReply::NoError;
    int exchanges = 0;
};
