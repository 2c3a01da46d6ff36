#pragma once

#include "CamsimAuth.h"
#include "CamsimFault.h"
#include "CamsimOptions.h"
#include "RequestLog.h"

#include <memory>
#include <mutex>
#include <string>

namespace httplib {
class Server;
struct Request;
struct Response;
} // namespace httplib

// A PTZ camera's CGI interface over HTTP(S), with its state in memory, plus /_sim/state and
// /_sim/fault for tests. Handlers run on the server's thread pool; the state is locked.
class CameraSimulator {
public:
    explicit CameraSimulator(const CamsimOptions& options);
    ~CameraSimulator();
    CameraSimulator(const CameraSimulator&) = delete;
    CameraSimulator& operator=(const CameraSimulator&) = delete;

    // Binds the listening socket; false with a message in error.
    bool bind(std::string* error);
    // Serves until the process ends.
    void run();
    std::string url() const;

private:
    using Endpoint = void (CameraSimulator::*)(const httplib::Request&, httplib::Response&);

    struct State {
        double zoom = 1;
        double maxRatio = 20;
        std::string idleEnable = "0";
        std::string idleType = "objtrack";
        std::string idleInterval = "30";
        std::string trackingType = "autotracking";
        std::string lastPreset;
        int stopCount = 0;
        int centerX = 0;
        int centerY = 0;
        std::string videosize;
        std::string resolution;
    };

    void addRoutes();
    void serve(const httplib::Request& req, httplib::Response& res, Endpoint endpoint);
    bool applyFault(const CamsimFault& fault, httplib::Response& res);

    void getParam(const httplib::Request& req, httplib::Response& res);
    void setParam(const httplib::Request& req, httplib::Response& res);
    void cameraControl(const httplib::Request& req, httplib::Response& res);
    void presetsWithRule(const httplib::Request& req, httplib::Response& res);
    void notFound(const httplib::Request& req, httplib::Response& res);
    void simState(const httplib::Request& req, httplib::Response& res);
    void simFault(const httplib::Request& req, httplib::Response& res);

    const CamsimOptions options;
    std::unique_ptr<httplib::Server> server;
    int port = 0;
    CamsimAuth auth;
    RequestLog log;
    std::mutex mutex;
    State state;       // guarded by mutex
    CamsimFault fault; // guarded by mutex
};
