#include "CameraProxy.h"

#include "PluginQuenvarDefs.h"
#include "Wendrel.h"

#include <QJsonDocument>
#include <QRegularExpression>
#include <QUrl>

#include <cmath>
#include <optional>

namespace {

const uint REQUEST_TIMEOUT = 10000;
const QString FORM_CONTENT_TYPE = QStringLiteral("application/x-www-form-urlencoded");
const QString CAMCTRL_PATH = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
const QString SETPARAM_PATH = QStringLiteral("/cgi-bin/admin/setparam.cgi");
const QString STOP_PATH =
    QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop");
const QString GET_RATIO_PATH = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio&getmaxratio");
const QString CENTER_PATH_FORMAT =
    QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?x=%1&y=%2&videosize=%3&resolution=%4&stretch=1");
const QString SET_RATIO_PATH_FORMAT =
    QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?setptmode=nonblock&setratio=%1");
const QString GET_IDLE_ACTION_PATH = QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl");
const QString GET_TRACKING_TYPE_PATH =
    QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?ptztrack=getCurrentType");
const QString PRESET_LIST_PATH = QStringLiteral("/VCA/PTZAdv/PresetWithRule");
const QString GOTO_PRESET_PATH_FORMAT =
    QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?ptztrack=track&name=%1");

// Reported for a request that never went out because its port cannot be addressed.
const QNetworkReply::NetworkError UNADDRESSABLE = QNetworkReply::ProtocolInvalidOperationError;

struct Connection {
    QString host;
    quint16 port = 0;
    bool useSSL = false;
    QString user;
    QString pass;
};

// toUInt would wrap a negative number into a large one and the low 16 bits would then pick some
// unrelated port, so the sign is kept and anything outside 0..65535 is refused. A value that is no
// number at all reads as 0, as toUInt reads it.
std::optional<quint16> portOf(const QVariant& value) {
    bool ok = false;
    const qlonglong number = value.toLongLong(&ok);
    if (ok) {
        if (number < 0 || number > 65535)
            return std::nullopt;
        return static_cast<quint16>(number);
    }
    value.toULongLong(&ok);
    if (ok)
        return std::nullopt;
    return quint16(0);
}

std::optional<Connection> connectionOf(const QVariantMap& params) {
    const std::optional<quint16> port = portOf(params.value(KEY_PORT));
    if (!port)
        return std::nullopt;
    return Connection{params.value(KEY_HOST).toString(), *port, params.value(KEY_USE_SSL).toBool(),
                      params.value(KEY_USER).toString(), params.value(KEY_PASS).toString()};
}

// The camera GET. A request that cannot go out is answered at once, the way a transport failure
// with an empty body would be, so every operation has one failure path.
void sendGet(ISimpleHTTPClient& client, const QVariantMap& params, const QString& path,
             HttpReplyCallback reply) {
    const std::optional<Connection> connection = connectionOf(params);
    if (!connection) {
        reply(UNADDRESSABLE, QByteArray(), QByteArray(), false);
        return;
    }
    client.Get(connection->host, path, connection->port, connection->useSSL, connection->user,
               connection->pass, std::move(reply), REQUEST_TIMEOUT, QStringList());
}

// Values spliced into a query or a form body, so that they cannot add parameters of their own.
QString encodedText(const QVariant& value) {
    return QString::fromLatin1(QUrl::toPercentEncoding(value.toString()));
}

// The form's values are Latin-1, as the camera reads them: "\u00e9" goes as %E9, and a
// character beyond Latin-1 as a question mark, %3F, which is what the camera would read of it
// unencoded. Encoded, a value cannot add fields of its own.
QByteArray latin1FormValue(const QVariant& value) {
    return value.toString().toLatin1().toPercentEncoding();
}

double capturedRatio(const QRegularExpression& expression, const QString& text) {
    const QRegularExpressionMatch match = expression.match(text);
    return match.hasMatch() ? match.captured(1).toDouble() : 1.0;
}

} // namespace

CameraProxy::CameraProxy()
    : httpClient(std::make_shared<Wendrel>()) {}

CameraProxy::CameraProxy(const CameraProxy& other) = default;
CameraProxy& CameraProxy::operator=(const CameraProxy& other) = default;
CameraProxy::~CameraProxy() = default;

void CameraProxy::setHTTPClient(std::shared_ptr<ISimpleHTTPClient> client) {
    httpClient = std::move(client);
}

void CameraProxy::postData(const QVariantMap& params, const QByteArray& data, const QString& path,
                           const std::function<void(bool)>& callback) const {
    const std::optional<Connection> connection = connectionOf(params);
    if (!connection) {
        callback(false);
        return;
    }
    httpClient->Post(
        connection->host, data, path, connection->port, connection->useSSL, connection->user,
        connection->pass, FORM_CONTENT_TYPE,
        [callback](QNetworkReply::NetworkError outcome, const QByteArray&, const QByteArray&,
                   bool) { callback(outcome == QNetworkReply::NoError); },
        REQUEST_TIMEOUT);
}

void CameraProxy::stopPTZMovement(const QVariantMap& params,
                                  const std::function<void(bool)>& callback) {
    sendGet(*httpClient, params, STOP_PATH,
            [callback](QNetworkReply::NetworkError outcome, const QByteArray&, const QByteArray&,
                       bool) { callback(outcome == QNetworkReply::NoError); });
}

void CameraProxy::areaZoom(const QVariantMap& params, const std::function<void(bool)>& callback) {
    getRatio(httpClient, params, callback);
}

void CameraProxy::getRatio(const WeakClient& client, const QVariantMap& params,
                           const std::function<void(bool)>& callback) {
    const std::shared_ptr<ISimpleHTTPClient> sender = client.lock();
    if (!sender) {
        callback(false);
        return;
    }
    sendGet(*sender, params, GET_RATIO_PATH,
            [client, params, callback](QNetworkReply::NetworkError outcome, const QByteArray&,
                                       const QByteArray& body, bool) {
                if (outcome != QNetworkReply::NoError) {
                    callback(false);
                    return;
                }
                static const QRegularExpression zoom(QStringLiteral("zoom=([0-9]*\\.?[0-9]+)"));
                static const QRegularExpression maxRatio(
                    QStringLiteral("maxratio=([0-9]*\\.?[0-9]+)"));
                const QString text = QString::fromUtf8(body);
                setCenterPosition(client, params, capturedRatio(zoom, text),
                                  capturedRatio(maxRatio, text), callback);
            });
}

void CameraProxy::setCenterPosition(const WeakClient& client, const QVariantMap& params,
                                    double currentRatio, double maxRatio,
                                    const std::function<void(bool)>& callback) {
    const std::shared_ptr<ISimpleHTTPClient> sender = client.lock();
    if (!sender) {
        callback(false);
        return;
    }
    // One pass each: a value holding "%3" must not be taken for a later place marker.
    static const QString sizeFormat = QStringLiteral("%1x%2");
    const QString videoSize = sizeFormat.arg(encodedText(params.value(KEY_VIEW_CELL_WIDTH)),
                                             encodedText(params.value(KEY_VIEW_CELL_HEIGHT)));
    const QString resolution = sizeFormat.arg(encodedText(params.value(KEY_RESOLUTION_WIDTH)),
                                              encodedText(params.value(KEY_RESOLUTION_HEIGHT)));
    const QString path = CENTER_PATH_FORMAT.arg(
        QString::number(params.value(KEY_ZOOM_CENTER_X).toInt()),
        QString::number(params.value(KEY_ZOOM_CENTER_Y).toInt()), videoSize, resolution);
    sendGet(*sender, params, path,
            [client, params, currentRatio, maxRatio, callback](
                QNetworkReply::NetworkError outcome, const QByteArray&, const QByteArray&, bool) {
                if (outcome != QNetworkReply::NoError) {
                    callback(false);
                    return;
                }
                setRatio(client, params, currentRatio, maxRatio, callback);
            });
}

void CameraProxy::setRatio(const WeakClient& client, const QVariantMap& params, double currentRatio,
                           double maxRatio, const std::function<void(bool)>& callback) {
    const std::shared_ptr<ISimpleHTTPClient> sender = client.lock();
    if (!sender) {
        callback(false);
        return;
    }
    // Rounded up to whole tenths, and held at the maximum once it comes within 1.0 of it.
    double target = currentRatio * params.value(KEY_ZOOM_RATIO).toDouble();
    target = target * 10.0;
    target = std::ceil(target);
    target = target / 10.0;
    if (target + 1.0 > maxRatio)
        target = maxRatio;
    sendGet(*sender, params, SET_RATIO_PATH_FORMAT.arg(target, 0, 'g', -1),
            [callback](QNetworkReply::NetworkError outcome, const QByteArray&, const QByteArray&,
                       bool) { callback(outcome == QNetworkReply::NoError); });
}

void CameraProxy::getPTZIdleAction(const QVariantMap& params,
                                   const std::function<void(bool, const QVariantMap&)>& callback) {
    sendGet(*httpClient, params, GET_IDLE_ACTION_PATH,
            [callback](QNetworkReply::NetworkError outcome, const QByteArray&,
                       const QByteArray& body, bool) {
                callback(outcome == QNetworkReply::NoError, getPTZIdleActionData(body));
            });
}

void CameraProxy::setPTZIdleAction(const QVariantMap& params,
                                   const std::function<void(bool)>& callback) {
    postData(params, ptzIdleActionData(params), SETPARAM_PATH, callback);
}

QVariantMap CameraProxy::getPTZIdleActionData(const QByteArray& answer) {
    static const QRegularExpression enable(QStringLiteral("camctrl_c0_idleaction_enable='(\\d)'"));
    static const QRegularExpression interval(
        QStringLiteral("camctrl_c0_idleaction_interval='(\\d+)'"));
    const QString text = QString::fromUtf8(answer);
    QVariantMap result;
    const QRegularExpressionMatch enableMatch = enable.match(text);
    if (enableMatch.hasMatch()) {
        const bool objectTracking =
            text.contains(QLatin1String("camctrl_c0_idleaction_type='objtrack'"));
        result.insert(KEY_ENABLED, objectTracking ? enableMatch.captured(1) : QStringLiteral("0"));
    }
    const QRegularExpressionMatch intervalMatch = interval.match(text);
    if (intervalMatch.hasMatch())
        result.insert(KEY_INTERVAL, intervalMatch.captured(1));
    return result;
}

QByteArray CameraProxy::ptzIdleActionData(const QVariantMap& params) {
    return QByteArrayLiteral("camctrl_c0_idleaction_enable=") +
           latin1FormValue(params.value(KEY_ENABLED)) +
           QByteArrayLiteral(
               "&camctrl_c0_idleaction_type=objtrack&camctrl_c0_idleaction_interval=") +
           latin1FormValue(params.value(KEY_INTERVAL));
}

void CameraProxy::getPTZTrackingType(
    const QVariantMap& params, const std::function<void(bool, const QVariantMap&)>& callback) {
    const QString nodeId = params.value(KEY_NODE_ID).toString();
    sendGet(*httpClient, params, GET_TRACKING_TYPE_PATH,
            [callback, nodeId](QNetworkReply::NetworkError outcome, const QByteArray&,
                               const QByteArray& body, bool) {
                QVariantMap result = getPTZTrackingTypeData(body);
                result.insert(KEY_NODE_ID, nodeId);
                callback(outcome == QNetworkReply::NoError, result);
            });
}

void CameraProxy::setPTZTrackingType(const QVariantMap& params,
                                     const std::function<void(bool)>& callback) {
    postData(params, ptzTrackingTypeData(params), CAMCTRL_PATH, callback);
}

QVariantMap CameraProxy::getPTZTrackingTypeData(const QByteArray& answer) {
    const QString text = QString::fromUtf8(answer);
    const qsizetype separator = text.indexOf(QLatin1Char('='));
    const QString type =
        separator < 0 ? QStringLiteral("autotracking") : text.mid(separator + 1).trimmed();
    return QVariantMap{{KEY_TYPE, type}};
}

QByteArray CameraProxy::ptzTrackingTypeData(const QVariantMap& params) {
    return params.value(KEY_TYPE).toString() == QLatin1String("smarttracking")
               ? QByteArrayLiteral("ptztrack=setSmartTracking")
               : QByteArrayLiteral("ptztrack=setAutoTracking");
}

void CameraProxy::getSmartTrackingAdvPresetList(
    const QVariantMap& params, const std::function<void(bool, QList<QString>)>& callback) {
    sendGet(*httpClient, params, PRESET_LIST_PATH,
            [callback](QNetworkReply::NetworkError outcome, const QByteArray&,
                       const QByteArray& body, bool) {
                if (outcome != QNetworkReply::NoError) {
                    callback(false, QList<QString>());
                    return;
                }
                callback(true, handleGetSmartTrackingAdvPresetList(body));
            });
}

void CameraProxy::gotoSmartTrackingAdvPreset(
    const QVariantMap& params, const std::function<void(bool, const QVariant&)>& callback) {
    sendGet(*httpClient, params,
            GOTO_PRESET_PATH_FORMAT.arg(encodedText(params.value(KEY_PRESET_NAME))),
            [callback](QNetworkReply::NetworkError outcome, const QByteArray&,
                       const QByteArray& body, bool) {
                callback(outcome == QNetworkReply::NoError, QVariant(QString::fromUtf8(body)));
            });
}

QList<QString> CameraProxy::handleGetSmartTrackingAdvPresetList(const QByteArray& answer) {
    const QVariantMap root = QJsonDocument::fromJson(answer).toVariant().toMap();
    const QVariantList presets = root.value(QStringLiteral("PresetInfo")).toList();
    QList<QString> names;
    for (const QVariant& preset : presets) {
        const QVariantMap fields = preset.toMap();
        if (fields.value(QStringLiteral("HasRule")).toBool())
            names.append(fields.value(QStringLiteral("Name")).toString());
    }
    return names;
}
