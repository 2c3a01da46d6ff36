// The answer reader on its own: every framing, fed whole, byte by byte and in two pieces at every
// split, must give the same answer; limits hold as the bytes arrive.
#include "WendrelResponseReader.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using Reader = WendrelResponseReader;

const qint64 MAX_HEADER = 1024;
const qint64 MAX_BODY = 64;
const char* const FAILURES[] = {"none", "headers too large", "body too large", "malformed",
                                "ended early"};

// The answer in one line: what the client acts on and hands to the caller. How much of a
// malformed or oversized header the reader took before it stopped depends on the split, and is
// left out, as are bytes left after a failure.
std::string described(Reader& reader, qsizetype used, qsizetype size) {
    const Reader::Answer& answer = reader.answer();
    const bool complete = reader.state() == Reader::State::Complete;
    std::string text = complete ? "complete"
                       : reader.state() == Reader::State::Failed
                           ? "failed: " + std::string(FAILURES[int(reader.failure())])
                           : "reading";
    if (answer.status != 0)
        text += " | " + std::to_string(answer.status) + ' ' + answer.reason.toStdString();
    if (reader.failure() == Reader::Failure::Malformed ||
        reader.failure() == Reader::Failure::HeadersTooLarge)
        return text;
    text += " | " + QByteArray(answer.headers).replace("\r\n", ";").toStdString();
    if (!answer.trailers.isEmpty())
        text += " | trailers " + QByteArray(answer.trailers).replace("\r\n", ";").toStdString();
    if (!answer.challenges.isEmpty())
        text += " | challenges " + answer.challenges.toStdString();
    if (!answer.location.isEmpty())
        text += " | location " + answer.location.toStdString();
    text += " | body " + answer.body.toStdString();
    text += answer.keepAlive ? " | keep-alive" : " | close";
    if (complete && used < size)
        text += " | " + std::to_string(size - used) + " bytes left";
    return text;
}

// Feeds the pieces in turn as a connection would, then the end of the input when asked.
std::string read(const QByteArray& input, const std::vector<qsizetype>& cuts, bool endsInput) {
    Reader reader(MAX_HEADER, MAX_BODY);
    qsizetype used = 0;
    qsizetype start = 0;
    std::vector<qsizetype> ends = cuts;
    ends.push_back(input.size());
    for (const qsizetype end : ends) {
        if (reader.state() != Reader::State::Reading)
            break;
        used += reader.feed(input.constData() + start, end - start);
        start = end;
    }
    if (endsInput)
        reader.endOfInput();
    return described(reader, used, input.size());
}

struct Case {
    const char* name;
    QByteArray input;
    bool endsInput; // the server closes after sending input
    std::string answer;
};

class WendrelResponseReaderTest : public ::testing::TestWithParam<Case> {};

TEST_P(WendrelResponseReaderTest, GivesTheSameAnswerHoweverTheBytesAreSplit) {
    const Case& row = GetParam();
    EXPECT_EQ(read(row.input, {}, row.endsInput), row.answer);
    std::vector<qsizetype> everyByte;
    for (qsizetype cut = 1; cut < row.input.size(); ++cut)
        everyByte.push_back(cut);
    EXPECT_EQ(read(row.input, everyByte, row.endsInput), row.answer) << "byte by byte";
    for (qsizetype cut = 1; cut < row.input.size(); ++cut)
        ASSERT_EQ(read(row.input, {cut}, row.endsInput), row.answer) << "split at " << cut;
}

const QByteArray LONG_LINE = "X-Filler: " + QByteArray(MAX_HEADER, 'f') + "\r\n";

INSTANTIATE_TEST_SUITE_P(
    Framings, WendrelResponseReaderTest,
    ::testing::Values(
        Case{"ContentLength", "HTTP/1.1 200 OK\r\nContent-Length: 5\r\nX-A: 1\r\n\r\nhello", false,
             "complete | 200 OK | Content-Length: 5;X-A: 1; | body hello | keep-alive"},
        Case{"ChunkedWithExtensionsAndTrailers",
             "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3;ext=1\r\nabc\r\n"
             "2\r\nde\r\n0\r\nWWW-Authenticate: Basic realm=\"t\"\r\nLocation: /x\r\n\r\n",
             false,
             "complete | 200 OK | Transfer-Encoding: chunked; | trailers WWW-Authenticate: "
             "Basic realm=\"t\";Location: /x; | body abcde | keep-alive"},
        Case{"Http10UntilClose", "HTTP/1.0 200 OK\r\nServer: old\r\n\r\nall of it", true,
             "complete | 200 OK | Server: old; | body all of it | close"},
        // With the interim answers skipped; HTTP/1.0 kept alive, with bare line feeds.
        Case{"InterimThenFinal",
             "HTTP/1.1 100 Continue\r\nX-Interim: 1\r\n\r\nHTTP/1.1 102 Processing\r\n\r\n"
             "HTTP/1.1 204 No Content\r\n\r\n",
             false, "complete | 204 No Content |  | body  | keep-alive"},
        Case{
            "BareLineFeeds", "HTTP/1.0 200 OK\nConnection: keep-alive\nContent-Length: 2\n\nok",
            false,
            "complete | 200 OK | Connection: keep-alive;Content-Length: 2; | body ok | keep-alive"},
        Case{"ChallengesAndLocation",
             "HTTP/1.1 401 Unauthorized\r\nWWW-Authenticate: Digest realm=\"r\", nonce=\"n\"\r\n"
             "www-authenticate: Basic realm=\"r\"\r\nLocation: /there\r\nContent-Length: 0\r\n\r\n",
             false,
             "complete | 401 Unauthorized | WWW-Authenticate: Digest realm=\"r\", nonce=\"n\";"
             "www-authenticate: Basic realm=\"r\";Location: /there;Content-Length: 0; | "
             "challenges Digest realm=\"r\", nonce=\"n\", Basic realm=\"r\" | location /there | "
             "body  | keep-alive"},
        Case{"BytesBeyondTheAnswerAreLeft",
             "HTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\naHTTP/1.1 200 OK\r\n\r\n", false,
             "complete | 200 OK | Content-Length: 1; | body a | keep-alive | 19 bytes left"},
        Case{"OversizedHeader", "HTTP/1.1 200 OK\r\n" + LONG_LINE + "\r\n", false,
             "failed: headers too large"},
        Case{"OversizedTrailer",
             "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n1\r\na\r\n0\r\n" + LONG_LINE +
                 "\r\n",
             false, "failed: headers too large | 200 OK"},
        Case{"OversizedDeclaredBody", "HTTP/1.1 200 OK\r\nContent-Length: 65\r\n\r\n", false,
             "failed: body too large | 200 OK | Content-Length: 65; | body  | close"},
        Case{"OversizedChunkedBody",
             "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n40\r\n" + QByteArray(64, 'x') +
                 "\r\n1\r\ny\r\n0\r\n\r\n",
             false,
             "failed: body too large | 200 OK | Transfer-Encoding: chunked; | body  | close"},
        Case{"OversizedBodyUntilClose", "HTTP/1.1 200 OK\r\n\r\n" + QByteArray(65, 'x'), true,
             "failed: body too large | 200 OK |  | body  | close"},
        Case{"BodyUpToTheCap",
             "HTTP/1.1 200 OK\r\nContent-Length: 64\r\n\r\n" + QByteArray(64, 'x'), false,
             "complete | 200 OK | Content-Length: 64; | body " + std::string(64, 'x') +
                 " | keep-alive"},
        Case{"NotAStatusLine", "HTTP/9 banana\r\n\r\n", true, "failed: malformed"},
        Case{"NoSwitchingProtocols",
             "HTTP/1.1 101 Switching Protocols\r\nUpgrade: x\r\nConnection: upgrade\r\n\r\n", false,
             "failed: malformed"},
        Case{"EndlessInterimAnswers",
             QByteArray("HTTP/1.1 100 Continue\r\n\r\n").repeated(Reader::maxInterimAnswers + 1),
             false, "failed: malformed"},
        Case{"EndsBeforeTheBody", "HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nabc", true,
             "failed: ended early | 200 OK | Content-Length: 9; | body abc | close"},
        Case{"EndsInTheHeaders", "HTTP/1.1 200 OK\r\nContent-Len", true,
             "failed: ended early | Content-Len | body  | close"}),
    [](const ::testing::TestParamInfo<Case>& info) { return std::string(info.param.name); });

TEST(WendrelResponseReaderResetTest, ReadsTheNextAnswerAfresh) {
    Reader reader(MAX_HEADER, MAX_BODY);
    const QByteArray first =
        "HTTP/1.1 401 No\r\nWWW-Authenticate: Basic\r\nContent-Length: 1\r\n\r\n1";
    const QByteArray second = "HTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\n2";
    ASSERT_EQ(reader.feed(first.constData(), first.size()), first.size());
    reader.reset();
    EXPECT_FALSE(reader.began());
    ASSERT_EQ(reader.feed(second.constData(), second.size()), second.size());
    EXPECT_EQ(described(reader, 0, 0),
              "complete | 200 OK | Content-Length: 1; | body 2 | keep-alive");
}

} // namespace
