#include "PluginQuenvar.h"

#include "DeliveryGate.h"
#include "PluginQuenvarDefs.h"
#include "QUILImplementation/VcaRuleRetriever.h"
#include "QuenvarLog.h"
#include "ScopedTrace.h"
#include "SubscriberList.h"
#include "camera/CameraProxy.h"

#include <QTimer>

#include <exception>

namespace {

const char SOURCE_FILE[] = "src/PluginQuenvar";
const int VCA_CHANGE_DELAY_MS = 2000;
const QString CODE_OK = QStringLiteral("0");
const QString CODE_FAILED = QStringLiteral("-1");

void answer(const ResponseCallback& callback, bool ok, const QVariant& payload) {
    if (callback)
        callback(true, ok ? CODE_OK : CODE_FAILED, QString(), payload);
}

std::function<void(bool, const QVariantMap&)> mapResultAdapter(const ResponseCallback& callback) {
    return
        [callback](bool ok, const QVariantMap& result) { answer(callback, ok, QVariant(result)); };
}

std::function<void(bool)> noResultAdapter(const ResponseCallback& callback) {
    return [callback](bool ok) { answer(callback, ok, QVariant()); };
}

// The preset adapters keep the camera's host for their failure message.
std::function<void(bool, const QVariant&)> presetAdapter(const ResponseCallback& callback,
                                                         const QVariantMap& params) {
    return [callback, host = params.value(KEY_HOST).toString()](bool ok, const QVariant& result) {
        if (!ok)
            quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__,
                             "Go to SmartTrackingAdv preset failed,  ip: %s, response: %s",
                             host.toLocal8Bit().constData(),
                             result.toString().toLocal8Bit().constData());
        answer(callback, ok, result);
    };
}

std::function<void(bool, QList<QString>)> presetListAdapter(const ResponseCallback& callback,
                                                            const QVariantMap& params) {
    return [callback, host = params.value(KEY_HOST).toString()](bool ok, QList<QString> presets) {
        if (!ok)
            quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__,
                             "get SmartTrackingAdv preset list failed, ip: %s, response: %s",
                             host.toLocal8Bit().constData(),
                             presets.join(QLatin1Char(',')).toLocal8Bit().constData());
        answer(callback, ok, QVariant(QStringList(presets)));
    };
}

// The host may deliver a rule answer after the plugin is gone: it then reaches no one.
ResponseCallback whilePluginLives(const std::shared_ptr<DeliveryGate>& gate,
                                  ResponseCallback callback) {
    return [gate, callback = std::move(callback)](bool handled, const QString& code,
                                                  const QString& message, const QVariant& payload) {
        if (callback)
            gate->pass([&] { callback(handled, code, message, payload); });
    };
}

using CameraOperation = void (*)(ICameraProxy&, const QVariantMap&, const ResponseCallback&);

struct CameraCommand {
    const QString& name;
    CameraOperation start;
};

// In the order the dispatcher tests them, after the two rule commands.
const CameraCommand CAMERA_COMMANDS[] = {
    {CMD_RETRIEVE_PTZ_IDLE_ACTION,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.getPTZIdleAction(params, mapResultAdapter(callback));
     }},
    {CMD_SET_PTZ_IDLE_ACTION,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.setPTZIdleAction(params, noResultAdapter(callback));
     }},
    {CMD_RETRIEVE_PTZ_TRACKING_TYPE,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.getPTZTrackingType(params, mapResultAdapter(callback));
     }},
    {CMD_SET_PTZ_TRACKING_TYPE,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.setPTZTrackingType(params, noResultAdapter(callback));
     }},
    {CMD_STOP_PTZ_MOVEMENT,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.stopPTZMovement(params, noResultAdapter(callback));
     }},
    {CMD_AREA_ZOOM,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.areaZoom(params, noResultAdapter(callback));
     }},
    {CMD_GOTO_SMART_TRACKING_ADV_PRESET,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.gotoSmartTrackingAdvPreset(params, presetAdapter(callback, params));
     }},
    {CMD_GET_SMART_TRACKING_ADV_PRESET_LIST,
     [](ICameraProxy& proxy, const QVariantMap& params, const ResponseCallback& callback) {
         proxy.getSmartTrackingAdvPresetList(params, presetListAdapter(callback, params));
     }},
};

} // namespace

PluginQuenvar::PluginQuenvar()
    : subscribers(std::make_shared<SubscriberList>())
    , gate(std::make_shared<DeliveryGate>()) {}

PluginQuenvar::~PluginQuenvar() {
    ScopedTrace trace("PluginQuenvar::~PluginQuenvar", SOURCE_FILE, __LINE__);
    gate->close();
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
    try {
        if (command == CMD_RETRIEVE_VCA_RAW_RULE_INFO) {
            if (const auto retriever = vcaRuleRetriever)
                retriever->getLiveVcaRule(params.toString(),
                                          whilePluginLives(gate, std::move(callback)));
            else
                answer(callback, false, QVariant());
            return;
        }
        if (command == CMD_GET_RECORDING_VCA_RULE) {
            if (const auto retriever = vcaRuleRetriever) {
                const QVariantMap map = params.toMap();
                // A 32-bit time, sign-extended as the operation's unsigned 64-bit argument.
                const auto timestamp =
                    static_cast<quint64>(static_cast<qint64>(map.value(KEY_TIMESTAMP).toInt()));
                retriever->getRecordingVcaRule(map.value(KEY_LOCATION_IDS).toStringList(),
                                               timestamp,
                                               whilePluginLives(gate, std::move(callback)));
            } else {
                answer(callback, false, QVariant());
            }
            return;
        }
        for (const CameraCommand& entry : CAMERA_COMMANDS) {
            if (command != entry.name)
                continue;
            if (const auto proxy = cameraProxy)
                entry.start(*proxy, params.toMap(), callback);
            else
                answer(callback, false, QVariant());
            return;
        }
    } catch (const std::exception& error) {
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, failed, %s",
                         "PluginQuenvar::Request", error.what());
    } catch (...) {
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, failed",
                         "PluginQuenvar::Request");
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
