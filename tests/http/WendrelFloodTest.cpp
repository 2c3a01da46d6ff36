// A server that never stops sending, at loopback speed: the request ends with the failure result
// and the client holds no more of the peer's bytes than its limits allow, whatever the speed.
#include "ReplyRecorder.h"
#include "Wendrel.h"
#include "WendrelWorker.h"

#include <QFile>

#include <gtest/gtest.h>

#include <arpa/inet.h>
#include <atomic>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>

namespace {

// Accepts connections on loopback on a thread of its own and answers each request with head,
// then with unit again and again until the client goes away or the server is destroyed.
class FloodServer {
public:
    FloodServer(QByteArray head, QByteArray unit)
        : head(std::move(head))
        , unit(std::move(unit)) {
        listener = ::socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        if (::bind(listener, reinterpret_cast<sockaddr*>(&address), length) == 0 &&
            ::listen(listener, 4) == 0 &&
            ::getsockname(listener, reinterpret_cast<sockaddr*>(&address), &length) == 0)
            boundPort = ntohs(address.sin_port);
        thread = std::thread([this] { serve(); });
    }

    ~FloodServer() {
        stopping = true;
        thread.join();
        ::close(listener);
    }

    quint16 port() const { return boundPort; }

private:
    bool ready(int socket) const {
        pollfd entry{socket, POLLIN, 0};
        return ::poll(&entry, 1, 50) > 0;
    }

    void serve() {
        while (!stopping) {
            if (!ready(listener))
                continue;
            const int client = ::accept(listener, nullptr, nullptr);
            if (client < 0)
                continue;
            QByteArray request;
            char buffer[4096];
            while (!stopping && !request.contains("\r\n\r\n")) {
                if (!ready(client))
                    continue;
                const ssize_t size = ::recv(client, buffer, sizeof buffer, 0);
                if (size <= 0)
                    break;
                request.append(buffer, size);
            }
            bool open = ::send(client, head.constData(), size_t(head.size()), MSG_NOSIGNAL) > 0;
            while (open && !stopping && !unit.isEmpty())
                open = ::send(client, unit.constData(), size_t(unit.size()), MSG_NOSIGNAL) > 0;
            ::close(client);
        }
    }

    const QByteArray head;
    const QByteArray unit;
    int listener = -1;
    quint16 boundPort = 0;
    std::atomic<bool> stopping{false};
    std::thread thread;
};

qint64 statusKiB(const char* field) {
    QFile status(QStringLiteral("/proc/self/status"));
    if (!status.open(QIODevice::ReadOnly))
        return -1;
    for (const QByteArray& line : status.readAll().split('\n')) {
        if (line.startsWith(field))
            return line.mid(qstrlen(field)).trimmed().split(' ').first().toLongLong();
    }
    return -1;
}

// The kernel keeps the process's peak resident size; writing 5 here sets it to the current one.
bool resetPeak() {
    QFile clear(QStringLiteral("/proc/self/clear_refs"));
    return clear.open(QIODevice::WriteOnly) && clear.write("5") == 1;
}

std::string fetch(Wendrel& client, quint16 port) {
    ReplyRecorder recorder;
    client.Get(QStringLiteral("127.0.0.1"), QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"),
               port, false, {}, {}, recorder.callback(), 20000, {});
    return recorder.waitFor(1, 30000) ? recorder.said(false).front() : "no answer";
}

const QByteArray FILLER(64 * 1024, 'x');

TEST(WendrelFloodTest, EndlessHeadersOrBodyEndWithinTheLimits) {
#if defined(__SANITIZE_ADDRESS__)
    GTEST_SKIP() << "AddressSanitizer keeps freed memory aside, so the peak says nothing here";
#endif
    const QByteArray line = "X-Flood: " + QByteArray(54, 'f') + "\r\n";
    struct {
        const char* name;
        QByteArray head;
        QByteArray unit; // sent in 64 KiB writes until the client goes
    } floods[] = {{"endless header lines", "HTTP/1.1 200 OK\r\n", line.repeated(1024)},
                  {"endless body", "HTTP/1.1 200 OK\r\n\r\n", FILLER}};

    Wendrel client;
    FloodServer plain("HTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nok", {});
    ASSERT_EQ(fetch(client, plain.port()), "NoError");
    const qint64 capKiB = WendrelWorker::maxBodySize / 1024;
    for (const auto& flood : floods) {
        FloodServer server(flood.head, flood.unit);
        ASSERT_TRUE(resetPeak());
        const qint64 before = statusKiB("VmRSS:");
        EXPECT_EQ(fetch(client, server.port()), "UnknownContentError") << flood.name;
        const qint64 peak = statusKiB("VmHWM:");
        EXPECT_LE(peak - before, capKiB + 4 * 1024)
            << flood.name << ": the peak grew by " << peak - before << " KiB";
    }
}

} // namespace
