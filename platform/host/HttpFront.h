#pragma once

#include "FrontGate.h"
#include "ParkingLot.h"
#include "PluginFramework.h"
#include "RequestClock.h"

#include <QString>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <thread>

struct MHD_Daemon;
class PluginHost;

// quenvar-host serve: client requests, event streams and the plugin list over HTTP, served by
// libmicrohttpd on one thread of its own. A request waiting for its answer and an event stream
// waiting for an event park their connections (suspended in the library) instead of holding a
// thread each, so that a full set of streams leaves requests answered at once. Every request
// passes the gate first; sizes, counts and times are bounded as declared below.
class HttpFront {
public:
    static constexpr std::chrono::milliseconds ANSWER_TIMEOUT{30000};
    // The front's clock: how often an idle event stream is written to, which is how a closed one
    // is noticed, and how often deadlines are looked at.
    static constexpr std::chrono::milliseconds HEARTBEAT{500};
    // How long a connection has to send its request whole, and to stay idle between requests.
    static constexpr std::chrono::milliseconds REQUEST_TIME{10000};
    static const int MAX_EVENT_STREAMS = 256;
    // The streams and 64 connections more, so that requests are served beside a full set of
    // streams; the rest of the process's 1024 descriptors stay for camera connections.
    static const unsigned MAX_CONNECTIONS = MAX_EVENT_STREAMS + 64;
    static const qsizetype MAX_BODY = 64 * 1024;
    static const int MAX_HEADERS = 64;
    // A connection's request line, headers and buffers; larger headers are refused with 431.
    static const size_t CONNECTION_MEMORY = 32 * 1024;

    HttpFront(PluginHost& host, IPluginObjectBase& plugin);
    ~HttpFront();
    HttpFront(const HttpFront&) = delete;
    HttpFront& operator=(const HttpFront&) = delete;

    // Binds the listening socket; port 0 picks a free port.
    bool listen(const QString& address, quint16 port, QString* error);
    quint16 port() const;
    // Serves what gate admits, on the server's thread, until stop().
    bool start(const FrontGate& gate, QString* error);
    // Ends the event streams and the waits for answers, then the server.
    void stop();

private:
    struct Callbacks;
    friend struct Callbacks;
    struct Exchange;

    bool handle(MHD_Connection* connection, const char* url, const char* method, const char* upload,
                size_t* uploadSize, void** slot);
    bool begin(MHD_Connection* connection, Exchange& exchange, const char* url, const char* method);
    bool sendRequest(MHD_Connection* connection, Exchange& exchange);
    bool awaitAnswer(MHD_Connection* connection, Exchange& exchange);
    bool openStream(MHD_Connection* connection, Exchange& exchange);
    bool answer(MHD_Connection* connection, Exchange& exchange, unsigned status,
                const QByteArray& body, const char* header = nullptr,
                const char* headerValue = nullptr);
    bool refuse(MHD_Connection* connection, Exchange& exchange, unsigned status,
                const QByteArray& reason, const char* header = nullptr,
                const char* headerValue = nullptr);
    void finish(MHD_Connection* connection, Exchange* exchange);
    void releaseStream();
    void runClock();

    PluginHost& host;
    IPluginObjectBase& plugin;
    FrontGate gate;
    int listenFd = -1;
    quint16 boundPort = 0;
    MHD_Daemon* daemon = nullptr;
    ParkingLot parking;
    RequestClock requestClock{REQUEST_TIME};
    std::mutex streamMutex;
    int openStreams = 0;
    std::thread clockThread;
    std::mutex clockMutex;
    std::condition_variable clockStop;
    bool clockStopping = false;
    std::atomic<bool> stopped{false};
};
