#pragma once

#include "PluginFramework.h"

#include <QString>

#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

namespace httplib {
class Server;
struct Request;
struct Response;
} // namespace httplib

class PluginHost;

// quenvar-host serve: client requests, event streams and the plugin list over HTTP. Handlers
// run on the HTTP library's worker threads; each event stream keeps one busy while it is open.
class HttpFront {
public:
    static constexpr std::chrono::milliseconds ANSWER_TIMEOUT{30000};
    // How often an idle event stream is written to, which is how a closed one is noticed.
    static constexpr std::chrono::milliseconds HEARTBEAT{500};

    HttpFront(PluginHost& host, IPluginObjectBase& plugin);
    ~HttpFront();
    HttpFront(const HttpFront&) = delete;
    HttpFront& operator=(const HttpFront&) = delete;

    // Binds the listening socket; port 0 picks a free port.
    bool listen(const QString& address, quint16 port, QString* error);
    quint16 port() const;
    // Serves on a thread of its own until stop().
    void start();
    // Ends the event streams and the waits for answers, then the server.
    void stop();

private:
    void handleRequest(const httplib::Request& request, httplib::Response& response);
    void handleEvents(const httplib::Request& request, httplib::Response& response);
    void handlePlugins(const httplib::Request& request, httplib::Response& response);

    PluginHost& host;
    IPluginObjectBase& plugin;
    std::unique_ptr<httplib::Server> server;
    std::thread serverThread;
    std::atomic<bool> stopping{false};
    std::atomic<bool> serverDone{false};
    quint16 boundPort = 0;
};
