#include "CameraSimulator.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QString>

#include <httplib.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <thread>

namespace {

const int THREADS = 64;
const size_t KEEP_ALIVE_REQUESTS = 1000;
const size_t OVERSIZE_CHUNK = 64 * 1024;

struct Preset {
    const char* name;
    bool hasRule;
};

const Preset PRESETS[] = {{"Entrance", true}, {"Lobby", false}, {"Parking Lot", true}};

std::string formatNumber(double value) {
    char text[32];
    std::snprintf(text, sizeof text, "%g", value);
    return text;
}

std::string param(const httplib::Request& req, const char* name) {
    return req.get_param_value(name);
}

QString text(const std::string& value) {
    return QString::fromStdString(value);
}

} // namespace

CameraSimulator::CameraSimulator(const CamsimOptions& options)
    : options(options)
    , auth(options.auth, options.user, options.password)
    , fault(options.fault) {
    if (options.tlsCert.empty())
        server = std::make_unique<httplib::Server>();
    else
        server =
            std::make_unique<httplib::SSLServer>(options.tlsCert.c_str(), options.tlsKey.c_str());
    // A keep-alive connection holds a pool thread: allow many parallel clients.
    server->new_task_queue = [] { return new httplib::ThreadPool(THREADS); };
    server->set_keep_alive_max_count(KEEP_ALIVE_REQUESTS);
    // Headers and body go out in separate writes: without this, Nagle holds the body back.
    server->set_tcp_nodelay(true);
    addRoutes();
}

CameraSimulator::~CameraSimulator() = default;

bool CameraSimulator::bind(std::string* error) {
    if (!server->is_valid()) {
        *error = "cannot load the TLS certificate " + options.tlsCert + " or key " + options.tlsKey;
        return false;
    }
    if (!options.logFile.empty() && !log.open(options.logFile)) {
        *error = "cannot open the log file " + options.logFile;
        return false;
    }
    bool bound = false;
    if (options.port == 0) {
        port = server->bind_to_any_port(options.host);
        bound = port > 0;
    } else {
        port = options.port;
        bound = server->bind_to_port(options.host, port);
    }
    if (!bound)
        *error = "cannot listen on " + options.host + ':' + std::to_string(options.port);
    return bound;
}

void CameraSimulator::run() {
    server->listen_after_bind();
}

std::string CameraSimulator::url() const {
    const bool ipv6 = options.host.find(':') != std::string::npos;
    return (options.tlsCert.empty() ? "http://" : "https://") +
           (ipv6 ? '[' + options.host + ']' : options.host) + ':' + std::to_string(port);
}

void CameraSimulator::addRoutes() {
    const auto camera = [this](Endpoint endpoint) {
        return [this, endpoint](const httplib::Request& req, httplib::Response& res) {
            serve(req, res, endpoint);
        };
    };
    server->Get("/cgi-bin/admin/getparam.cgi", camera(&CameraSimulator::getParam));
    server->Get("/cgi-bin/admin/setparam.cgi", camera(&CameraSimulator::setParam));
    server->Post("/cgi-bin/admin/setparam.cgi", camera(&CameraSimulator::setParam));
    server->Get("/cgi-bin/camctrl/camctrl.cgi", camera(&CameraSimulator::cameraControl));
    server->Post("/cgi-bin/camctrl/camctrl.cgi", camera(&CameraSimulator::cameraControl));
    server->Get("/VCA/PTZAdv/PresetWithRule", camera(&CameraSimulator::presetsWithRule));

    server->Get("/_sim/state", [this](const httplib::Request& req, httplib::Response& res) {
        simState(req, res);
    });
    server->Post("/_sim/fault", [this](const httplib::Request& req, httplib::Response& res) {
        simFault(req, res);
    });

    // Anything else is a camera request too: authenticated, logged, then 404.
    server->Get(".*", camera(&CameraSimulator::notFound));
    server->Post(".*", camera(&CameraSimulator::notFound));
    server->Put(".*", camera(&CameraSimulator::notFound));
    server->Delete(".*", camera(&CameraSimulator::notFound));
}

void CameraSimulator::serve(const httplib::Request& req, httplib::Response& res,
                            Endpoint endpoint) {
    if (!auth.admit(req, res))
        return;
    log.write(req.method, req.target, req.body);
    CamsimFault current;
    {
        std::lock_guard<std::mutex> lock(mutex);
        current = fault;
    }
    if (!applyFault(current, res))
        (this->*endpoint)(req, res);
}

// True when the fault replaces the camera's answer.
bool CameraSimulator::applyFault(const CamsimFault& current, httplib::Response& res) {
    switch (current.mode) {
    case CamsimFault::Mode::None:
        return false;
    case CamsimFault::Mode::Status:
        res.status = current.status;
        res.set_content("simulated status " + std::to_string(current.status) + '\n', "text/plain");
        return true;
    case CamsimFault::Mode::Delay:
        std::this_thread::sleep_for(std::chrono::milliseconds(current.delayMs));
        return false;
    case CamsimFault::Mode::Close:
        // Promises more than it sends; a provider that fails makes the server drop the line.
        res.set_content_provider(1024, "text/plain", [](size_t, size_t, httplib::DataSink& sink) {
            sink.write("partial", 7);
            return false;
        });
        return true;
    case CamsimFault::Mode::Oversize: {
        const size_t total = static_cast<size_t>(std::max(0LL, current.bytes));
        res.set_content_provider(total, "application/octet-stream",
                                 [](size_t, size_t length, httplib::DataSink& sink) {
                                     static const std::string chunk(OVERSIZE_CHUNK, 'x');
                                     sink.write(chunk.data(), std::min(length, chunk.size()));
                                     return true;
                                 });
        return true;
    }
    }
    return false;
}

void CameraSimulator::getParam(const httplib::Request& req, httplib::Response& res) {
    std::lock_guard<std::mutex> lock(mutex);
    const std::pair<const char*, const std::string*> parameters[] = {
        {"camctrl_c0_idleaction_enable", &state.idleEnable},
        {"camctrl_c0_idleaction_type", &state.idleType},
        {"camctrl_c0_idleaction_interval", &state.idleInterval},
    };
    // Each query name selects the parameters it prefixes; no name selects all.
    std::string body;
    for (const auto& [name, value] : parameters) {
        const bool wanted =
            req.params.empty() ||
            std::any_of(req.params.begin(), req.params.end(), [name = name](const auto& entry) {
                return std::string(name).rfind(entry.first, 0) == 0;
            });
        if (wanted)
            body += std::string(name) + "='" + *value + "'\r\n";
    }
    res.set_content(body, "text/plain");
}

void CameraSimulator::setParam(const httplib::Request& req, httplib::Response& res) {
    std::lock_guard<std::mutex> lock(mutex);
    const std::pair<const char*, std::string*> parameters[] = {
        {"camctrl_c0_idleaction_enable", &state.idleEnable},
        {"camctrl_c0_idleaction_type", &state.idleType},
        {"camctrl_c0_idleaction_interval", &state.idleInterval},
    };
    std::string body;
    for (const auto& [name, value] : parameters) {
        if (req.has_param(name)) {
            *value = req.get_param_value(name);
            body += std::string(name) + "='" + *value + "'\r\n";
        }
    }
    res.set_content(body, "text/plain");
}

void CameraSimulator::cameraControl(const httplib::Request& req, httplib::Response& res) {
    std::lock_guard<std::mutex> lock(mutex);
    std::string body;
    if (req.has_param("getratio"))
        body += "zoom=" + formatNumber(state.zoom) + "\r\n";
    if (req.has_param("getmaxratio"))
        body += "maxratio=" + formatNumber(state.maxRatio) + "\r\n";
    if (req.has_param("x") && req.has_param("y")) {
        state.centerX = text(param(req, "x")).toInt();
        state.centerY = text(param(req, "y")).toInt();
        state.videosize = param(req, "videosize");
        state.resolution = param(req, "resolution");
    }
    if (req.has_param("setratio"))
        state.zoom = std::clamp(text(param(req, "setratio")).toDouble(), 1.0, state.maxRatio);
    if (param(req, "zoom") == "stop" || param(req, "auto") == "stop")
        ++state.stopCount;

    const std::string track = param(req, "ptztrack");
    if (track == "setSmartTracking")
        state.trackingType = "smarttracking";
    else if (track == "setAutoTracking")
        state.trackingType = "autotracking";
    if (track == "getCurrentType" || track == "setSmartTracking" || track == "setAutoTracking")
        body += "ptztrack_type=" + state.trackingType + "\r\n";
    if (track == "track") {
        state.lastPreset = param(req, "name");
        body += "ptztrack_track='" + state.lastPreset + "'\r\n";
    }
    res.set_content(body.empty() ? std::string("OK\r\n") : body, "text/plain");
}

void CameraSimulator::presetsWithRule(const httplib::Request&, httplib::Response& res) {
    QJsonArray presets;
    for (const Preset& preset : PRESETS)
        presets.append(QJsonObject{{QStringLiteral("Name"), QString::fromUtf8(preset.name)},
                                   {QStringLiteral("HasRule"), preset.hasRule}});
    const QJsonObject root{{QStringLiteral("PresetInfo"), presets}};
    res.set_content(QJsonDocument(root).toJson(QJsonDocument::Compact).toStdString(),
                    "application/json");
}

void CameraSimulator::notFound(const httplib::Request& req, httplib::Response& res) {
    res.status = 404;
    res.set_content("no such endpoint: " + req.path + '\n', "text/plain");
}

void CameraSimulator::simState(const httplib::Request&, httplib::Response& res) {
    QJsonObject root;
    {
        std::lock_guard<std::mutex> lock(mutex);
        root = QJsonObject{
            {QStringLiteral("zoom"), state.zoom},
            {QStringLiteral("maxratio"), state.maxRatio},
            {QStringLiteral("idleEnable"), text(state.idleEnable)},
            {QStringLiteral("idleType"), text(state.idleType)},
            {QStringLiteral("idleInterval"), text(state.idleInterval)},
            {QStringLiteral("trackingType"), text(state.trackingType)},
            {QStringLiteral("lastPreset"), text(state.lastPreset)},
            {QStringLiteral("stopCount"), state.stopCount},
            {QStringLiteral("center"),
             QJsonObject{{QStringLiteral("x"), state.centerX},
                         {QStringLiteral("y"), state.centerY},
                         {QStringLiteral("videosize"), text(state.videosize)},
                         {QStringLiteral("resolution"), text(state.resolution)}}},
        };
    }
    res.set_content(QJsonDocument(root).toJson(QJsonDocument::Compact).toStdString(),
                    "application/json");
}

void CameraSimulator::simFault(const httplib::Request& req, httplib::Response& res) {
    CamsimFault requested;
    if (!CamsimFault::parseMode(param(req, "mode"), &requested.mode)) {
        res.status = 400;
        res.set_content("mode must be none, status, delay, close or oversize\n", "text/plain");
        return;
    }
    if (req.has_param("status"))
        requested.status = text(param(req, "status")).toInt();
    if (requested.status < 200 || requested.status > 599) {
        res.status = 400;
        res.set_content("status must be from 200 to 599\n", "text/plain");
        return;
    }
    if (req.has_param("delayMs"))
        requested.delayMs = text(param(req, "delayMs")).toInt();
    if (req.has_param("bytes"))
        requested.bytes = text(param(req, "bytes")).toLongLong();
    {
        std::lock_guard<std::mutex> lock(mutex);
        fault = requested;
    }
    res.set_content(std::string("fault ") + CamsimFault::modeName(requested.mode) + '\n',
                    "text/plain");
}
