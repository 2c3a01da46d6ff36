// How Wendrel's connections deal with what servers send, against a server that sends exactly what
// a case scripts: kept-alive connections, a server that closes one, bodies in every framing,
// interim answers, malformed answers and redirects; and what goes on the wire.
#include "EventLoopWait.h"
#include "ReplyRecorder.h"
#include "Wendrel.h"

#include <QHostAddress>
#include <QRegularExpression>
#include <QTcpServer>
#include <QTcpSocket>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

namespace {

struct Reply {
    Reply(const QByteArray& bytes, bool close = false)
        : bytes(bytes)
        , close(close) {}

    QByteArray bytes; // written as they stand; may be empty
    bool close;       // then the connection is closed
};

// The length of the first whole request in buffer, or 0 while it is incomplete.
qsizetype requestLength(const QByteArray& buffer) {
    static const QRegularExpression length(QStringLiteral("\r\ncontent-length: *(\\d+)"),
                                           QRegularExpression::CaseInsensitiveOption);
    const qsizetype head = buffer.indexOf("\r\n\r\n") + 4;
    const qsizetype total =
        head + length.match(QString::fromLatin1(buffer.left(head))).captured(1).toLongLong();
    return head >= 4 && buffer.size() >= total ? total : 0;
}

// Answers the n-th whole request it reads with the n-th reply, for what a well-behaved server
// would not do. Serves while the test's thread waits for the client in its event loop.
class ScriptedServer : public QTcpServer {
public:
    explicit ScriptedServer(std::vector<Reply> script)
        : replies(std::move(script)) {
        listen(QHostAddress::LocalHost, 0);
        connect(this, &QTcpServer::newConnection, this, [this] {
            while (QTcpSocket* socket = nextPendingConnection()) {
                const int connection = ++connections;
                ++open;
                connect(socket, &QTcpSocket::readyRead, socket,
                        [this, socket, connection] { answer(socket, connection); });
                // Not while the server goes: its sockets close as it deletes them.
                connect(socket, &QTcpSocket::disconnected, this, [this, socket] {
                    --open;
                    socket->deleteLater();
                });
            }
        });
    }

    int connections = 0;
    int open = 0; // connections the client has not closed
    // The number of its connection (from 1), method and target of each request, joined by "; ".
    std::string received;
    std::vector<std::string> requests; // whole

private:
    void answer(QTcpSocket* socket, int connection) {
        while (const qsizetype length = requestLength(socket->peek(socket->bytesAvailable()))) {
            const QByteArray request = socket->read(length);
            const Reply reply =
                requests.size() < replies.size() ? replies[requests.size()] : Reply("", true);
            requests.push_back(request.toStdString());
            received += (received.empty() ? "" : "; ") + std::to_string(connection) + ' ' +
                        request.left(request.indexOf(" HTTP/")).toStdString();
            socket->write(reply.bytes);
            if (reply.close) {
                socket->disconnectFromHost();
                return;
            }
        }
    }

    std::vector<Reply> replies;
};

template <typename... Replies>
std::vector<Reply> script(const Replies&... replies) {
    return {Reply(replies)...};
}

Reply ok(const QByteArray& body) {
    return {"HTTP/1.1 200 OK\r\nContent-Length: " + QByteArray::number(body.size()) + "\r\n\r\n" +
            body};
}

Reply redirect(const QByteArray& status, const QByteArray& location) {
    return {"HTTP/1.1 " + status + "\r\nLocation: " + location +
            "\r\nContent-Length: 5\r\n\r\nmoved"};
}

Reply status(const QByteArray& status) {
    return {"HTTP/1.1 " + status + "\r\nContent-Length: 4\r\n\r\nbusy"};
}

const QString HOST = QStringLiteral("127.0.0.1");
const QString FORM = QStringLiteral("application/x-www-form-urlencoded");
const qsizetype MAX_BODY = 8 << 20;

struct Case {
    const char* name;
    std::vector<Reply> replies;
    const char* methods; // one request each, to /0, /1, ...
    const char* said;    // per request, joined by "; "
    int connections;
    const char* received; // connection number, method and target of each, joined by "; "
};

class WendrelConnectionTest : public ::testing::TestWithParam<Case> {};

TEST_P(WendrelConnectionTest, AnswersAsTheServerSaid) {
    const Case& row = GetParam();
    ScriptedServer server(row.replies);
    ReplyRecorder recorder;
    {
        Wendrel client;
        const QStringList methods = QString::fromLatin1(row.methods).split(' ');
        // One at a time, so that each may reuse the connection of the one before.
        for (int id = 0; id < methods.size(); ++id) {
            const QString path = QStringLiteral("/%1").arg(id);
            if (methods[id] == "GET")
                client.Get(HOST, path, server.serverPort(), false, {}, {}, recorder.callback(id),
                           5000, {});
            else
                client.Post(HOST, "a=1", path, server.serverPort(), false, {}, {}, FORM,
                            recorder.callback(id), 5000);
            ASSERT_TRUE(recorder.waitFor(id + 1));
        }
    }
    std::string said;
    for (const std::string& text : recorder.said())
        said += (said.empty() ? "" : "; ") + text;
    EXPECT_EQ(said, row.said);
    EXPECT_EQ(server.connections, row.connections);
    EXPECT_EQ(server.received, row.received);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, WendrelConnectionTest,
    ::testing::Values(
        Case{"KeptAlive", script(ok("a"), ok("b"), ok("c")), "GET POST GET",
             "NoError reached: a; NoError reached: b; NoError reached: c", 1,
             "1 GET /0; 1 POST /1; 1 GET /2"},
        // A server may close a kept-alive connection just as the next request goes out: a GET
        // goes again on a new connection, once; a POST may have been acted on, and fails.
        Case{"ClosedBeforeAnswering", script(ok("a"), Reply("", true), ok("b")), "GET GET",
             "NoError reached: a; NoError reached: b", 2, "1 GET /0; 1 GET /1; 2 GET /1"},
        Case{"ClosedBeforeAnsweringAPost", script(ok("a"), Reply("", true), ok("b")),
             "GET POST GET",
             "NoError reached: a; RemoteHostClosedError reached; NoError reached: b", 2,
             "1 GET /0; 1 POST /1; 2 GET /2"},
        Case{"ClosedTwiceBeforeAnswering", script(ok("a"), Reply("", true), Reply("", true)),
             "GET GET", "NoError reached: a; RemoteHostClosedError reached", 2,
             "1 GET /0; 1 GET /1; 2 GET /1"},
        // Closed by the server, or to be closed by it: never used again.
        Case{"NotReusedOnceClosed",
             script(Reply(ok("a").bytes, true),
                    "HTTP/1.1 200 OK\r\nConnection: close\r\nContent-Length: 1\r\n\r\nb", ok("c")),
             "GET GET GET", "NoError reached: a; NoError reached: b; NoError reached: c", 3,
             "1 GET /0; 2 GET /1; 3 GET /2"},
        Case{"Framings",
             script("HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n2\r\nde\r\n"
                    "0\r\n\r\n",
                    ok("f"), Reply("HTTP/1.1 200 OK\r\n\r\nall of it", true)),
             "GET GET GET",
             "NoError reached: abcde; NoError reached: f; NoError reached: all of it", 1,
             "1 GET /0; 1 GET /1; 1 GET /2"},
        // The limit holds for a declared length and for a body that runs until the close.
        Case{"BodyUpToTheLimit",
             script(ok(QByteArray(MAX_BODY, 'x')),
                    Reply("HTTP/1.1 200 OK\r\n\r\n" + QByteArray(MAX_BODY + 1, 'x'), true)),
             "GET GET", "NoError reached: 8388608 bytes; UnknownContentError reached", 1,
             "1 GET /0; 1 GET /1"},
        // An interim answer before the final one; a status line that is none.
        Case{"StatusLines",
             script("HTTP/1.1 100 Continue\r\n\r\nHTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\nz",
                    Reply("HTTP/9 banana\r\n\r\n", true)),
             "POST GET", "NoError reached: z; ProtocolFailure reached", 1, "1 POST /0; 1 GET /1"},
        Case{"ErrorStatus",
             script(status("404 Not Found"), status("500 Oops"), status("503 Busy"), ok("b")),
             "GET GET GET GET",
             "ContentNotFoundError reached: busy; InternalServerError reached: busy; "
             "ServiceUnavailableError reached: busy; NoError reached: b",
             1, "1 GET /0; 1 GET /1; 1 GET /2; 1 GET /3"},
        // Followed within the origin only, where the credentials were meant to go.
        Case{"Redirects",
             script(redirect("302 Found", "/next?x=1"), ok("there"),
                    redirect("303 See Other", "/done"), ok("done"),
                    redirect("307 Temporary Redirect", "http://localhost:1/x")),
             "GET POST GET",
             "NoError reached: there; NoError reached: done; InsecureRedirectError reached: moved",
             1, "1 GET /0; 1 GET /next?x=1; 1 POST /1; 1 GET /done; 1 GET /2"}),
    [](const ::testing::TestParamInfo<Case>& info) { return std::string(info.param.name); });

// The headers asked for go out, and no credentials until a server challenges them.
TEST(WendrelRequestTest, SendsTheHeadersAskedForAndNoCredentialsUnasked) {
    using namespace ::testing;
    ScriptedServer server(script(ok("a"), ok("b")));
    ReplyRecorder recorder;
    Wendrel client;
    client.Get(HOST, "/a.cgi?b=%26", server.serverPort(), false, "operator", "s3cret",
               recorder.callback(0), 5000, {"X-Probe: one"});
    client.PostWithOAuth(HOST, "a=1", "/token", server.serverPort(), false, "operator", "t0ken",
                         FORM, recorder.callback(1), 5000);
    ASSERT_TRUE(recorder.waitFor(2));

    EXPECT_THAT(
        server.requests,
        UnorderedElementsAre(
            AllOf(StartsWith("GET /a.cgi?b=%26 HTTP/1.1\r\n"), HasSubstr("\r\nX-Probe: one\r\n")),
            AllOf(StartsWith("POST /token HTTP/1.1\r\n"),
                  HasSubstr("\r\nAuthorization: Bearer t0ken\r\n"),
                  HasSubstr("\r\nContent-Type: " + FORM.toStdString() + "\r\n"),
                  EndsWith("\r\n\r\na=1"))));
    for (const char* credentials : {"operator", "s3cret", "Basic", "Digest"})
        EXPECT_THAT(server.requests, Each(Not(HasSubstr(credentials))));
}

// What a caller gives that would reach the wire as more than its own field: refused before any
// connection, answered once.
struct UnsafeCase {
    const char* name;
    std::function<void(Wendrel&, quint16, const HttpReplyCallback&)> send;
};

class WendrelUnsafeFieldTest : public ::testing::TestWithParam<UnsafeCase> {};

TEST_P(WendrelUnsafeFieldTest, IsRefusedWithoutSendingAnything) {
    ScriptedServer server(script(ok("a")));
    ReplyRecorder recorder;
    {
        Wendrel client;
        GetParam().send(client, server.serverPort(), recorder.callback());
        ASSERT_TRUE(recorder.waitFor(1));
    }
    EXPECT_EQ(recorder.said(), std::vector<std::string>{"ProtocolInvalidOperationError unreached"});
    EXPECT_EQ(server.connections, 0);
}

const QString SMUGGLED =
    QStringLiteral("\r\n\r\nGET /cgi-bin/admin/setparam.cgi?system_password=pwned "
                   "HTTP/1.1\r\nHost: cam\r\nContent-Length: 60\r\nX-Smuggled: ");

std::function<void(Wendrel&, quint16, const HttpReplyCallback&)>
getAs(const QString& user, const QString& password, const QStringList& headers = {}) {
    return [=](Wendrel& client, quint16 port, const HttpReplyCallback& callback) {
        client.Get(HOST, "/x", port, false, user, password, callback, 5000, headers);
    };
}

std::function<void(Wendrel&, quint16, const HttpReplyCallback&)>
postAs(const QString& contentType) {
    return [=](Wendrel& client, quint16 port, const HttpReplyCallback& callback) {
        client.Post(HOST, "a=1", "/x", port, false, "admin", "pw", contentType, callback, 5000);
    };
}

INSTANTIATE_TEST_SUITE_P(
    Fields, WendrelUnsafeFieldTest,
    ::testing::Values(
        UnsafeCase{"UserNameWithLineBreaks", getAs("admin\"" + SMUGGLED, "pw")},
        UnsafeCase{"UserNameWithNul", getAs(QString::fromLatin1("adm\0in", 6), "pw")},
        UnsafeCase{"UserNameWithOtherControl", getAs("adm\x1bin", "pw")},
        UnsafeCase{"PasswordWithLineFeed", getAs("admin", "pw\nX-Smuggled: 1")},
        UnsafeCase{"PasswordWithDelete", getAs("admin", "pw\x7f")},
        UnsafeCase{"HeaderNameNotAToken", getAs("", "", {"X Probe: 1"})},
        UnsafeCase{"HeaderNameWithLineBreak", getAs("", "", {"X-A\r\nX-B: 1"})},
        UnsafeCase{"HeaderWithoutName", getAs("", "", {": 1"})},
        UnsafeCase{"HeaderWithoutColon", getAs("", "", {"X-Probe"})},
        UnsafeCase{"HeaderValueWithLineBreak", getAs("", "", {"X-Probe: 1" + SMUGGLED})},
        UnsafeCase{"HeaderValueWithNul", getAs("", "", {QString::fromLatin1("X-Probe: 1\0", 12)})},
        UnsafeCase{"ContentTypeWithLineBreak", postAs("text/plain\r\nX-Smuggled: 1")},
        UnsafeCase{"BearerTokenWithLineBreak",
                   [](Wendrel& client, quint16 port, const HttpReplyCallback& callback) {
                       client.PostWithOAuth(HOST, "a=1", "/x", port, false, {}, "t0ken" + SMUGGLED,
                                            FORM, callback, 5000);
                   }},
        UnsafeCase{"UrlCredentialsWithLineBreak",
                   [](Wendrel& client, quint16 port, const HttpReplyCallback& callback) {
                       client.Get("http://admin%0D%0AX-Smuggled:%201:pw@127.0.0.1:" +
                                      QString::number(port) + "/x",
                                  {}, {}, callback, 5000);
                   }}),
    [](const ::testing::TestParamInfo<UnsafeCase>& info) { return std::string(info.param.name); });

// Callers share the connections to a camera: one caller's hostile request cannot put anything in
// front of another's, nor take its answer.
TEST(WendrelSharedPoolTest, AHostileCallerCannotReachAnotherCallersRequest) {
    ScriptedServer server(script(ok("first"), ok("second")));
    ReplyRecorder recorder;
    {
        Wendrel client;
        client.Get(HOST, "/0", server.serverPort(), false, "viewer", "pw", recorder.callback(0),
                   5000, {});
        ASSERT_TRUE(recorder.waitFor(1));
        client.Get(HOST, "/1", server.serverPort(), false, "admin\"" + SMUGGLED, "pw",
                   recorder.callback(1), 5000, {});
        client.Post(HOST, "a=1", "/2", server.serverPort(), false, "viewer", "pw",
                    "text/plain\r\nContent-Length: 0\r\n\r\nGET /smuggled HTTP/1.1",
                    recorder.callback(2), 5000);
        client.Get(HOST, "/3", server.serverPort(), false, "viewer", "pw", recorder.callback(3),
                   5000, {});
        ASSERT_TRUE(recorder.waitFor(4));
    }
    EXPECT_EQ(recorder.said(), (std::vector<std::string>{"NoError reached: first",
                                                         "ProtocolInvalidOperationError unreached",
                                                         "ProtocolInvalidOperationError unreached",
                                                         "NoError reached: second"}));
    EXPECT_EQ(server.received, "1 GET /0; 1 GET /3");
}

// Kept-alive connections do not outlive the idle time-out, whether a server closes them or not.
TEST(WendrelIdleTest, IdleConnectionsAreClosedAfterTheIdleTimeOut) {
    ScriptedServer server(script(ok("a"), ok("b"), ok("c")));
    ReplyRecorder recorder;
    WendrelSettings settings;
    settings.idleTimeoutMs = 200;
    Wendrel client(settings);
    for (int id = 0; id < 3; ++id)
        client.Get(HOST, "/" + QString::number(id), server.serverPort(), false, {}, {},
                   recorder.callback(id), 5000, {});
    ASSERT_TRUE(recorder.waitFor(3));
    ASSERT_GE(server.open, 1);
    EXPECT_TRUE(runEventLoopUntil([&server] { return server.open == 0; }, 5000))
        << server.open << " still open";
}

} // namespace
