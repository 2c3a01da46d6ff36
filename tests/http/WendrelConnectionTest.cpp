// How Wendrel's connections deal with what servers send, against a server that sends exactly what
// a case scripts: kept-alive connections, a server that closes one, bodies in every framing,
// interim answers, malformed answers and redirects.
#include "ReplyRecorder.h"
#include "ScriptedServer.h"
#include "Wendrel.h"

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

namespace {

using Reply = ScriptedServer::Reply;

Reply ok(const QByteArray& body) {
    return {"HTTP/1.1 200 OK\r\nContent-Length: " + QByteArray::number(body.size()) + "\r\n\r\n" +
            body};
}

Reply redirect(const QByteArray& status, const QByteArray& location) {
    return {"HTTP/1.1 " + status + "\r\nLocation: " + location +
            "\r\nContent-Length: 5\r\n\r\nmoved"};
}

struct Case {
    const char* name;
    std::vector<Reply> replies;
    std::vector<QByteArray> methods; // one request each, to /0, /1, ...
    std::map<int, std::string> said;
    int connections;
    std::vector<std::string> received; // connection number and request line
};

class WendrelConnectionTest : public ::testing::TestWithParam<Case> {};

TEST_P(WendrelConnectionTest, AnswersAsTheServerSaid) {
    const Case& row = GetParam();
    ScriptedServer server(row.replies);
    ReplyRecorder recorder;
    {
        Wendrel client;
        // One at a time, so that each may reuse the connection of the one before.
        for (int id = 0; id < static_cast<int>(row.methods.size()); ++id) {
            const QString path = QStringLiteral("/%1").arg(id);
            if (row.methods[id] == "GET")
                client.Get(QStringLiteral("127.0.0.1"), path, server.port(), false, {}, {},
                           recorder.callback(id), 5000, {});
            else
                client.Post(QStringLiteral("127.0.0.1"), "a=1", path, server.port(), false, {}, {},
                            QStringLiteral("application/x-www-form-urlencoded"),
                            recorder.callback(id), 5000);
            ASSERT_TRUE(recorder.waitFor(id + 1));
        }
    }
    EXPECT_EQ(recorder.said(), row.said);
    EXPECT_EQ(server.connections(), row.connections);
    EXPECT_EQ(server.requests(), row.received);
}

const QByteArray GET = "GET";

INSTANTIATE_TEST_SUITE_P(
    Cases, WendrelConnectionTest,
    ::testing::Values(
        Case{"KeptAlive",
             {ok("a"), ok("b"), ok("c")},
             {GET, "POST", GET},
             {{0, "NoError reached: a"}, {1, "NoError reached: b"}, {2, "NoError reached: c"}},
             1,
             {"1 GET /0 HTTP/1.1", "1 POST /1 HTTP/1.1", "1 GET /2 HTTP/1.1"}},
        // A server may close a kept-alive connection just as the next request goes out: that
        // request goes again on a new connection, once.
        Case{"ClosedBeforeAnswering",
             {ok("a"), {"", true}, ok("b")},
             {GET, GET},
             {{0, "NoError reached: a"}, {1, "NoError reached: b"}},
             2,
             {"1 GET /0 HTTP/1.1", "1 GET /1 HTTP/1.1", "2 GET /1 HTTP/1.1"}},
        Case{"ClosedAfterAnswering",
             {{ok("a").bytes, true}, ok("b")},
             {GET, GET},
             {{0, "NoError reached: a"}, {1, "NoError reached: b"}},
             2,
             {"1 GET /0 HTTP/1.1", "2 GET /1 HTTP/1.1"}},
        Case{"ClosedMidAnswer",
             {ok("a"), {"HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\npart", true}},
             {GET, GET},
             {{0, "NoError reached: a"}, {1, "RemoteHostClosedError reached: part"}},
             1,
             {"1 GET /0 HTTP/1.1", "1 GET /1 HTTP/1.1"}},
        Case{
            "ConnectionClose",
            {{"HTTP/1.1 200 OK\r\nConnection: close\r\nContent-Length: 1\r\n\r\na", true}, ok("b")},
            {GET, GET},
            {{0, "NoError reached: a"}, {1, "NoError reached: b"}},
            2,
            {"1 GET /0 HTTP/1.1", "2 GET /1 HTTP/1.1"}},
        Case{"BodyUntilClose",
             {{"HTTP/1.1 200 OK\r\n\r\nall of it", true}},
             {GET},
             {{0, "NoError reached: all of it"}},
             1,
             {"1 GET /0 HTTP/1.1"}},
        Case{"Chunked",
             {{"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n2\r\nde\r\n"
               "0\r\n\r\n"},
              ok("f")},
             {GET, GET},
             {{0, "NoError reached: abcde"}, {1, "NoError reached: f"}},
             1,
             {"1 GET /0 HTTP/1.1", "1 GET /1 HTTP/1.1"}},
        Case{"Interim",
             {{"HTTP/1.1 100 Continue\r\n\r\nHTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\nz"}},
             {"POST"},
             {{0, "NoError reached: z"}},
             1,
             {"1 POST /0 HTTP/1.1"}},
        Case{"Malformed",
             {{"HTTP/9 banana\r\n\r\n", true}},
             {GET},
             {{0, "ProtocolFailure reached"}},
             1,
             {"1 GET /0 HTTP/1.1"}},
        Case{"ErrorStatus",
             {{"HTTP/1.1 503 Busy\r\nContent-Length: 4\r\n\r\nbusy"}, ok("b")},
             {GET, GET},
             {{0, "ServiceUnavailableError reached: busy"}, {1, "NoError reached: b"}},
             1,
             {"1 GET /0 HTTP/1.1", "1 GET /1 HTTP/1.1"}},
        Case{"RedirectSameOrigin",
             {redirect("302 Found", "/next?x=1"), ok("there")},
             {GET},
             {{0, "NoError reached: there"}},
             1,
             {"1 GET /0 HTTP/1.1", "1 GET /next?x=1 HTTP/1.1"}},
        Case{"RedirectAfterPost",
             {redirect("303 See Other", "/done"), ok("done")},
             {"POST"},
             {{0, "NoError reached: done"}},
             1,
             {"1 POST /0 HTTP/1.1", "1 GET /done HTTP/1.1"}},
        // Credentials go to the server they were meant for only.
        Case{"RedirectElsewhere",
             {redirect("307 Temporary Redirect", "http://localhost:1/x")},
             {GET},
             {{0, "InsecureRedirectError reached: moved"}},
             1,
             {"1 GET /0 HTTP/1.1"}}),
    [](const ::testing::TestParamInfo<Case>& info) { return std::string(info.param.name); });

} // namespace
