#include "PluginQuenvar.h"

#include "ClientResponse.h"
#include "DeliveryGate.h"
#include "LogText.h"
#include "OpenRequests.h"
#include "PluginQuenvarDefs.h"
#include "QUILImplementation/VcaRuleRetriever.h"
#include "QuenvarLog.h"
#include "ScopedTrace.h"
#include "SubscriberList.h"
#include "camera/CameraProxy.h"

#include <QTimer>

#include <algorithm>
#include <exception>
#include <iterator>
#include <optional>

namespace {

const char SOURCE_FILE[] = "src/PluginQuenvar";
const int VCA_CHANGE_DELAY_MS = 2000;

// A started request, as its operation answers it; copies answer the same request, once.
struct Ticket {
    std::shared_ptr<OpenRequests> requests;
    OpenRequests::Id id;
    QString command;

    void answer(bool ok, const QVariant& payload) const {
        requests->answer(id, true, ClientResponse::code(ok), QString(), payload);
    }

    // The camera operations complete on the HTTP client's threads, where nothing may escape:
    // an exception before the answer fails the request instead.
    template <typename Answer>
    void guarded(Answer&& answer) const {
        try {
            answer();
        } catch (const std::exception& error) {
            logFailure(error.what());
            requests->fail(id);
        } catch (...) {
            logFailure(nullptr);
            requests->fail(id);
        }
    }

    void logFailure(const char* error) const {
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, %s failed, %s",
                         "PluginQuenvar::answer", LogText::of(command).constData(),
                         LogText::ofError(error).constData());
    }
};

std::function<void(bool, const QVariantMap&)> mapResultAdapter(const Ticket& ticket) {
    return [ticket](bool ok, const QVariantMap& result) {
        ticket.guarded([&] { ticket.answer(ok, QVariant(result)); });
    };
}

std::function<void(bool)> noResultAdapter(const Ticket& ticket) {
    return [ticket](bool ok) { ticket.guarded([&] { ticket.answer(ok, QVariant()); }); };
}

// The preset adapters keep the camera's host for their failure message.
std::function<void(bool, const QVariant&)> presetAdapter(const Ticket& ticket,
                                                         const QVariantMap& params) {
    return [ticket, host = params.value(KEY_HOST).toString()](bool ok, const QVariant& result) {
        ticket.guarded([&] {
            if (!ok)
                quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__,
                                 "Go to SmartTrackingAdv preset failed,  ip: %s, response: %s",
                                 LogText::of(host).constData(),
                                 LogText::of(result.toString()).constData());
            ticket.answer(ok, result);
        });
    };
}

std::function<void(bool, QList<QString>)> presetListAdapter(const Ticket& ticket,
                                                            const QVariantMap& params) {
    return [ticket, host = params.value(KEY_HOST).toString()](bool ok, QList<QString> presets) {
        ticket.guarded([&] {
            if (!ok)
                quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__,
                                 "get SmartTrackingAdv preset list failed, ip: %s, response: %s",
                                 LogText::of(host).constData(),
                                 LogText::of(presets.join(QLatin1Char(','))).constData());
            ticket.answer(ok, QVariant(QStringList(presets)));
        });
    };
}

// The retriever answers with the host's flag and its own code; the request is answered once and
// only while the plugin lives.
ResponseCallback ruleAdapter(const Ticket& ticket) {
    return [ticket](bool handled, const QString& code, const QString& message,
                    const QVariant& payload) {
        ticket.requests->answer(ticket.id, handled, code, message, payload);
    };
}

using RuleOperation = void (*)(VcaRuleRetriever&, const QVariant&, const Ticket&);
using CameraOperation = void (*)(ICameraProxy&, const QVariantMap&, const Ticket&);

struct RuleCommand {
    const QString& name;
    RuleOperation start;
};

struct CameraCommand {
    const QString& name;
    CameraOperation start;
};

// The dispatcher tests the rule commands first, then the camera commands, each in this order;
// an unknown command is dropped without an answer.
const RuleCommand RULE_COMMANDS[] = {
    {CMD_RETRIEVE_VCA_RAW_RULE_INFO,
     [](VcaRuleRetriever& retriever, const QVariant& params, const Ticket& ticket) {
         retriever.getLiveVcaRule(params.toString(), ruleAdapter(ticket));
     }},
    {CMD_GET_RECORDING_VCA_RULE,
     [](VcaRuleRetriever& retriever, const QVariant& params, const Ticket& ticket) {
         const QVariantMap map = params.toMap();
         // A 32-bit time, sign-extended as the operation's unsigned 64-bit argument.
         const auto timestamp =
             static_cast<quint64>(static_cast<qint64>(map.value(KEY_TIMESTAMP).toInt()));
         retriever.getRecordingVcaRule(map.value(KEY_LOCATION_IDS).toStringList(), timestamp,
                                       ruleAdapter(ticket));
     }},
};

const CameraCommand CAMERA_COMMANDS[] = {
    {CMD_RETRIEVE_PTZ_IDLE_ACTION,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.getPTZIdleAction(params, mapResultAdapter(ticket));
     }},
    {CMD_SET_PTZ_IDLE_ACTION,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.setPTZIdleAction(params, noResultAdapter(ticket));
     }},
    {CMD_RETRIEVE_PTZ_TRACKING_TYPE,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.getPTZTrackingType(params, mapResultAdapter(ticket));
     }},
    {CMD_SET_PTZ_TRACKING_TYPE,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.setPTZTrackingType(params, noResultAdapter(ticket));
     }},
    {CMD_STOP_PTZ_MOVEMENT,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.stopPTZMovement(params, noResultAdapter(ticket));
     }},
    {CMD_AREA_ZOOM, [](ICameraProxy& proxy, const QVariantMap& params,
                       const Ticket& ticket) { proxy.areaZoom(params, noResultAdapter(ticket)); }},
    {CMD_GOTO_SMART_TRACKING_ADV_PRESET,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.gotoSmartTrackingAdvPreset(params, presetAdapter(ticket, params));
     }},
    {CMD_GET_SMART_TRACKING_ADV_PRESET_LIST,
     [](ICameraProxy& proxy, const QVariantMap& params, const Ticket& ticket) {
         proxy.getSmartTrackingAdvPresetList(params, presetListAdapter(ticket, params));
     }},
};

// After an exception in Request: the request fails, unless its operation answered before it threw.
void failRequest(const QString& command, const std::optional<Ticket>& ticket,
                 const ResponseCallback& callback, const char* error) {
    quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, %s failed, %s",
                     "PluginQuenvar::Request", LogText::of(command).constData(),
                     LogText::ofError(error).constData());
    if (ticket) {
        ticket->requests->fail(ticket->id);
        return;
    }
    // It could not even be opened.
    try {
        ClientResponse::send(callback, true, false, QVariant());
    } catch (...) {
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, answer to %s failed",
                         "PluginQuenvar::Request", LogText::of(command).constData());
    }
}

template <typename Command, std::size_t size>
const Command* find(const Command (&commands)[size], const QString& name) {
    const auto found =
        std::find_if(std::begin(commands), std::end(commands),
                     [&name](const Command& command) { return command.name == name; });
    return found == std::end(commands) ? nullptr : found;
}

} // namespace

PluginQuenvar::PluginQuenvar()
    : subscribers(std::make_shared<SubscriberList>())
    , gate(std::make_shared<DeliveryGate>())
    , requests(std::make_shared<OpenRequests>()) {}

PluginQuenvar::~PluginQuenvar() {
    ScopedTrace trace("PluginQuenvar::~PluginQuenvar", SOURCE_FILE, __LINE__);
    gate->close();
    // Before the services go: what they still have pending then reaches no one.
    requests->close();
}

bool PluginQuenvar::InitialPluginBase(IFrameworkTools* tools) {
    ScopedTrace trace("PluginQuenvar::InitialPluginBase", SOURCE_FILE, __LINE__);
    vcaRuleRetriever = std::make_shared<VcaRuleRetriever>(tools);
    cameraProxy = std::make_shared<CameraProxy>();
    subscribers->setEmitter(tools->GetEventEmitter());
    pluginConnector = tools->GetPluginConnector();
    return true;
}

void PluginQuenvar::AllPluginLoaded() {
    if (pluginConnector)
        pluginConnector->ConnectPluginSignal(VCA_PLUGIN_ID, "2vcaMetadataChanged(const QString &)",
                                             this, "1vcaMetadataChanged(const QString &)",
                                             Qt::AutoConnection);
}

void PluginQuenvar::Request(const QString& command, const QVariant& params,
                            const RequestSenderInfo& sender, ResponseCallback callback) {
    Q_UNUSED(sender);
    ScopedTrace trace("PluginQuenvar::Request", SOURCE_FILE, __LINE__);
    std::optional<Ticket> ticket;
    try {
        const RuleCommand* rule = find(RULE_COMMANDS, command);
        const CameraCommand* camera = rule ? nullptr : find(CAMERA_COMMANDS, command);
        if (!rule && !camera)
            return;
        ticket = Ticket{requests, requests->open(command, callback), command};
        const auto retriever = vcaRuleRetriever;
        const auto proxy = cameraProxy;
        if (rule && retriever)
            rule->start(*retriever, params, *ticket);
        else if (camera && proxy)
            camera->start(*proxy, params.toMap(), *ticket);
        else
            ticket->answer(false, QVariant());
    } catch (const std::exception& error) {
        failRequest(command, ticket, callback, error.what());
    } catch (...) {
        failRequest(command, ticket, callback, nullptr);
    }
}

void PluginQuenvar::RequestBlock(const QString& command, const QVariant& params,
                                 const RequestSenderInfo& sender, IResponser& responser) {
    Q_UNUSED(command);
    Q_UNUSED(params);
    Q_UNUSED(sender);
    Q_UNUSED(responser);
    ScopedTrace trace("PluginQuenvar::RequestBlock", SOURCE_FILE, __LINE__);
}

void PluginQuenvar::SubscribeEventBlock(const QString& subscriberId, const QString& eventName,
                                        const QVariant& params, const RequestSenderInfo& sender,
                                        IResponser& responser) {
    Q_UNUSED(eventName);
    Q_UNUSED(params);
    Q_UNUSED(sender);
    Q_UNUSED(responser);
    ScopedTrace trace("PluginQuenvar::SubscribeEventBlock", SOURCE_FILE, __LINE__);
    subscribers->subscribe(subscriberId);
}

void PluginQuenvar::UnsubscribeEventBlock(const QString& subscriberId, const QVariant& params,
                                          IResponser& responser) {
    Q_UNUSED(params);
    Q_UNUSED(responser);
    ScopedTrace trace("PluginQuenvar::UnsubscribeEventBlock", SOURCE_FILE, __LINE__);
    subscribers->unsubscribe(subscriberId);
}

void PluginQuenvar::setCameraProxy(std::shared_ptr<ICameraProxy> proxy) {
    cameraProxy = std::move(proxy);
}

void PluginQuenvar::setVcaRuleRetriever(std::shared_ptr<VcaRuleRetriever> retriever) {
    vcaRuleRetriever = std::move(retriever);
}

void PluginQuenvar::vcaMetadataChanged(const QString& cameraID) {
    // Bound to this object: a pending fetch dies with it.
    QTimer::singleShot(VCA_CHANGE_DELAY_MS, Qt::CoarseTimer, this,
                       [this, cameraID]() { handleVCAMetadataChanged(cameraID); });
}

void PluginQuenvar::handleVCAMetadataChanged(const QString& cameraID) {
    const auto retriever = vcaRuleRetriever;
    if (!retriever)
        return;
    retriever->getLiveVcaRule(cameraID, [gate = gate, list = subscribers](bool, const QString&,
                                                                          const QString&,
                                                                          const QVariant& payload) {
        gate->pass([&] { list->emitToAll(payload, EVENT_LIVE_VCA_RULE_CHANGED, PLUGIN_ID); });
    });
}
