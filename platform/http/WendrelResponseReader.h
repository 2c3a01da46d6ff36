#pragma once

#include <QByteArray>

#include <http_parser.h>

// Reads one HTTP/1.1 answer from bytes given in any split, with no socket: a status line and
// header lines, then a body framed by Content-Length, chunks or the end of the input. Interim
// (1xx) answers are skipped. Limits hold as the bytes arrive: the header lines (and the trailer
// lines, apart) within maxHeaderSize, the body within maxBodySize. Trailers of a chunked body are
// kept apart from the headers and never acted on.
class WendrelResponseReader {
public:
    enum class State { Reading, Complete, Failed };
    enum class Failure { None, HeadersTooLarge, BodyTooLarge, Malformed, EndedEarly };

    struct Answer {
        int status = 0; // 0 until a final status line was read
        QByteArray reason;
        QByteArray headers;    // "Name: value\r\n" for each header line
        QByteArray trailers;   // the same for the trailer lines of a chunked body
        QByteArray challenges; // the WWW-Authenticate values, joined by ", "
        QByteArray location;
        QByteArray body; // as much as arrived, also on failure; empty when over the cap
        bool keepAlive = false;
    };

    static constexpr qint64 defaultMaxHeaderSize = 80 * 1024;
    // A server that sends this many interim answers is not going to send a final one.
    static constexpr int maxInterimAnswers = 16;

    WendrelResponseReader(qint64 maxHeaderSize, qint64 maxBodySize);

    WendrelResponseReader(const WendrelResponseReader&) = delete;
    WendrelResponseReader& operator=(const WendrelResponseReader&) = delete;

    // Starts over for the next answer on the connection.
    void reset();
    // Reads from data until the answer is complete or has failed; returns how much was used.
    // Bytes beyond a complete answer are left: the caller must not reuse the connection then.
    qsizetype feed(const char* data, qsizetype size);
    // The input ended: ends a body that runs until the close, fails anything else unfinished.
    void endOfInput();

    State state() const { return current; }
    qint64 maxHeaderSize() const { return headerLimit; }
    qint64 maxBodySize() const { return bodyLimit; }
    Failure failure() const { return failedWith; }
    // http_parser's name for a malformed answer, such as "HPE_INVALID_CONSTANT".
    const char* parserError() const;
    // Whether any byte of an answer arrived.
    bool began() const { return received > 0; }
    const Answer& answer() const { return result; }
    Answer takeAnswer();

private:
    // Which part of a header or trailer line the parser hands over next.
    enum class LinePart { None, Field, Value };

    static int onMessageBegin(http_parser* parser);
    static int onStatus(http_parser* parser, const char* at, size_t length);
    static int onHeaderField(http_parser* parser, const char* at, size_t length);
    static int onHeaderValue(http_parser* parser, const char* at, size_t length);
    static int onHeadersComplete(http_parser* parser);
    static int onBody(http_parser* parser, const char* at, size_t length);
    static int onMessageComplete(http_parser* parser);
    static const http_parser_settings settings;

    QByteArray& lines();
    bool withinHeaderLimit(size_t length);
    void beginValue();
    void endLine();
    void fail(Failure failure);

    const qint64 headerLimit;
    const qint64 bodyLimit;
    http_parser parser;
    State current = State::Reading;
    Failure failedWith = Failure::None;
    Answer result;
    qint64 received = 0;
    qint64 lineBytes = 0; // of the header lines, then of the trailer lines
    int interimAnswers = 0;
    bool interim = false;
    bool inTrailers = false;
    LinePart part = LinePart::None;
    // Where the line being read stands in lines().
    qsizetype fieldStart = 0;
    qsizetype fieldEnd = 0;
    qsizetype valueStart = 0;
};
