// The eight camera commands, each with the parameters it needs besides the camera's address.
#pragma once

#include <QJsonArray>
#include <QJsonObject>
#include <QVariantMap>

#include <array>

// Blank-separated key=value pairs as a map of texts.
inline QVariantMap keyValues(const char* text) {
    QVariantMap map;
    for (const QString& pair : QString::fromLatin1(text).split(' ', Qt::SkipEmptyParts))
        map.insert(pair.section('=', 0, 0), pair.section('=', 1));
    return map;
}

struct CameraCommand {
    const char* name;
    const char* params; // as keyValues() reads them
    // The answer's payload when the camera request fails; undefined: the camera's body, as text.
    QJsonValue failurePayload = {};

    // The parameters with a loopback camera's address and credentials added.
    QVariantMap to(quint16 port, const QString& password = "admin", bool useSSL = false) const {
        QVariantMap all = keyValues(params);
        all.insert({{"host", "127.0.0.1"},
                    {"port", port},
                    {"user", "admin"},
                    {"pass", password},
                    {"useSSL", useSSL}});
        return all;
    }
};

inline const std::array<CameraCommand, 8>& cameraCommands() {
    static const std::array<CameraCommand, 8> commands{{
        {"retrievePTZIdleAction", "", QJsonObject()},
        {"setPTZIdleAction", "enabled=1 interval=30", QJsonValue::Null},
        {"retrievePTZTrackingType", "nodeID=n1",
         QJsonObject{{"nodeID", "n1"}, {"type", "autotracking"}}},
        {"setPTZTrackingType", "type=smarttracking", QJsonValue::Null},
        {"stopPTZMovement", "", QJsonValue::Null},
        {"areaZoom",
         "zoomCenterX=320 zoomCenterY=240 viewCellWidth=640 viewCellHeight=480 "
         "resolutionWidth=1920 resolutionHeight=1080 zoomRatio=1.5",
         QJsonValue::Null},
        {"gotoSmartTrackingAdvPreset", "presetName=Entrance", QJsonValue::Undefined},
        {"getSmartTrackingAdvPresetList", "", QJsonArray()},
    }};
    return commands;
}
