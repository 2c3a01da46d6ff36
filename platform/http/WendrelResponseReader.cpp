#include "WendrelResponseReader.h"

#include <climits>
#include <utility>

namespace {

WendrelResponseReader* ownerOf(http_parser* parser) {
    return static_cast<WendrelResponseReader*>(parser->data);
}

// ": " and CR LF, which each stored line adds to what the server sent.
const qint64 LINE_OVERHEAD = 4;
// A body of unknown length grows by doubling up to this; beyond, room for the whole cap is
// reserved at once. Reserved room that is not written to takes no memory, and growing by copy
// past this size would hold the old copy and the new at once.
const qint64 DOUBLING_LIMIT = 1024 * 1024;

} // namespace

const http_parser_settings WendrelResponseReader::settings = [] {
    http_parser_settings result;
    http_parser_settings_init(&result);
    result.on_message_begin = &WendrelResponseReader::onMessageBegin;
    result.on_status = &WendrelResponseReader::onStatus;
    result.on_header_field = &WendrelResponseReader::onHeaderField;
    result.on_header_value = &WendrelResponseReader::onHeaderValue;
    result.on_headers_complete = &WendrelResponseReader::onHeadersComplete;
    result.on_body = &WendrelResponseReader::onBody;
    result.on_message_complete = &WendrelResponseReader::onMessageComplete;
    return result;
}();

WendrelResponseReader::WendrelResponseReader(qint64 maxHeaderSize, qint64 maxBodySize)
    : headerLimit(maxHeaderSize)
    , bodyLimit(maxBodySize) {
    reset();
}

void WendrelResponseReader::reset() {
    http_parser_init(&parser, HTTP_RESPONSE);
    parser.data = this;
    current = State::Reading;
    failedWith = Failure::None;
    result = Answer();
    received = 0;
    lineBytes = 0;
    interimAnswers = 0;
    interim = inTrailers = false;
    part = LinePart::None;
}

qsizetype WendrelResponseReader::feed(const char* data, qsizetype size) {
    if (current != State::Reading || size <= 0)
        return 0;
    received += size;
    const size_t parsed = http_parser_execute(&parser, &settings, data, size_t(size));
    if (current == State::Reading && HTTP_PARSER_ERRNO(&parser) != HPE_OK)
        fail(HTTP_PARSER_ERRNO(&parser) == HPE_HEADER_OVERFLOW ? Failure::HeadersTooLarge
                                                               : Failure::Malformed);
    return qsizetype(parsed);
}

void WendrelResponseReader::endOfInput() {
    if (current != State::Reading)
        return;
    // No bytes: the parser ends a body that runs until the close, or reports what is missing.
    http_parser_execute(&parser, &settings, nullptr, 0);
    if (current == State::Reading)
        fail(Failure::EndedEarly);
    result.keepAlive = false;
}

const char* WendrelResponseReader::parserError() const {
    return http_errno_name(HTTP_PARSER_ERRNO(&parser));
}

WendrelResponseReader::Answer WendrelResponseReader::takeAnswer() {
    return std::exchange(result, Answer());
}

QByteArray& WendrelResponseReader::lines() {
    return inTrailers ? result.trailers : result.headers;
}

bool WendrelResponseReader::withinHeaderLimit(size_t length) {
    lineBytes += qint64(length);
    if (lineBytes <= headerLimit)
        return true;
    fail(Failure::HeadersTooLarge);
    return false;
}

void WendrelResponseReader::beginValue() {
    fieldEnd = lines().size();
    lines().append(": ");
    valueStart = lines().size();
}

// Lines go straight into the answer's text; only the two header values used are copied.
void WendrelResponseReader::endLine() {
    if (part == LinePart::None)
        return;
    if (part == LinePart::Field)
        beginValue();
    QByteArray& text = lines();
    if (!inTrailers) {
        const QByteArrayView field(text.constData() + fieldStart, fieldEnd - fieldStart);
        const QByteArrayView value(text.constData() + valueStart, text.size() - valueStart);
        const auto named = [&field](QByteArrayView name) {
            return field.size() == name.size() &&
                   qstrnicmp(field.data(), name.data(), size_t(name.size())) == 0;
        };
        if (named("WWW-Authenticate")) {
            if (!result.challenges.isEmpty())
                result.challenges.append(", ");
            result.challenges.append(value);
        } else if (named("Location")) {
            result.location = value.toByteArray();
        }
    }
    text.append("\r\n");
    part = LinePart::None;
}

void WendrelResponseReader::fail(Failure failure) {
    current = State::Failed;
    failedWith = failure;
    result.keepAlive = false;
    if (failure == Failure::BodyTooLarge)
        result.body.clear();
}

int WendrelResponseReader::onMessageBegin(http_parser* parser) {
    // The final answer after an interim one starts afresh.
    WendrelResponseReader* self = ownerOf(parser);
    self->result = Answer();
    self->lineBytes = 0;
    self->inTrailers = false;
    self->part = LinePart::None;
    return 0;
}

int WendrelResponseReader::onStatus(http_parser* parser, const char* at, size_t length) {
    WendrelResponseReader* self = ownerOf(parser);
    if (!self->withinHeaderLimit(length))
        return -1;
    self->result.reason.append(at, qsizetype(length));
    return 0;
}

int WendrelResponseReader::onHeaderField(http_parser* parser, const char* at, size_t length) {
    WendrelResponseReader* self = ownerOf(parser);
    if (self->part == LinePart::Value)
        self->endLine();
    if (!self->withinHeaderLimit(length + (self->part == LinePart::None ? LINE_OVERHEAD : 0)))
        return -1;
    if (self->part == LinePart::None) {
        self->part = LinePart::Field;
        self->fieldStart = self->lines().size();
    }
    self->lines().append(at, qsizetype(length));
    return 0;
}

int WendrelResponseReader::onHeaderValue(http_parser* parser, const char* at, size_t length) {
    WendrelResponseReader* self = ownerOf(parser);
    if (!self->withinHeaderLimit(length))
        return -1;
    if (self->part != LinePart::Value) {
        self->part = LinePart::Value;
        self->beginValue();
    }
    self->lines().append(at, qsizetype(length));
    return 0;
}

int WendrelResponseReader::onHeadersComplete(http_parser* parser) {
    WendrelResponseReader* self = ownerOf(parser);
    self->endLine();
    // Nothing here asks to switch protocols.
    if (parser->upgrade) {
        self->fail(Failure::Malformed);
        return -1;
    }
    self->interim = parser->status_code >= 100 && parser->status_code < 200;
    if (self->interim) {
        if (++self->interimAnswers > maxInterimAnswers) {
            self->fail(Failure::Malformed);
            return -1;
        }
        return 0;
    }
    self->result.status = int(parser->status_code);
    // A declared length over the cap ends the answer before the body comes.
    if (parser->content_length != ULLONG_MAX && parser->content_length > quint64(self->bodyLimit)) {
        self->fail(Failure::BodyTooLarge);
        return -1;
    }
    if (parser->content_length != ULLONG_MAX)
        self->result.body.reserve(qsizetype(parser->content_length));
    self->lineBytes = 0;
    self->inTrailers = true;
    return 0;
}

int WendrelResponseReader::onBody(http_parser* parser, const char* at, size_t length) {
    WendrelResponseReader* self = ownerOf(parser);
    QByteArray& body = self->result.body;
    const qint64 needed = body.size() + qint64(length);
    if (needed > self->bodyLimit) {
        self->fail(Failure::BodyTooLarge);
        return -1;
    }
    if (needed > body.capacity())
        body.reserve(qsizetype(needed <= DOUBLING_LIMIT
                                   ? qMin(DOUBLING_LIMIT, qMax(needed, 2 * body.capacity()))
                                   : self->bodyLimit));
    body.append(at, qsizetype(length));
    return 0;
}

int WendrelResponseReader::onMessageComplete(http_parser* parser) {
    WendrelResponseReader* self = ownerOf(parser);
    if (self->interim)
        return 0;
    self->endLine();
    if (self->result.body.capacity() > DOUBLING_LIMIT)
        self->result.body.squeeze();
    self->current = State::Complete;
    self->result.keepAlive = http_should_keep_alive(parser) != 0;
    // Stops here: whatever follows belongs to no answer asked for.
    http_parser_pause(parser, 1);
    return 0;
}
