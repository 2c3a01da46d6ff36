// The eight camera commands, each with the parameters it needs besides the camera's address.
#pragma once

#include <QString>
#include <QVariantMap>

#include <array>

struct CameraCommand {
    const char* name;
    QVariantMap params;

    // The parameters with the camera's address and credentials added.
    QVariantMap to(const QString& host, quint16 port, const QString& user, const QString& password,
                   bool useSSL = false) const {
        QVariantMap all = params;
        all.insert("host", host);
        all.insert("port", port);
        all.insert("user", user);
        all.insert("pass", password);
        all.insert("useSSL", useSSL);
        return all;
    }
};

inline const std::array<CameraCommand, 8>& cameraCommands() {
    static const std::array<CameraCommand, 8> commands{{
        {"retrievePTZIdleAction", {}},
        {"setPTZIdleAction", {{"enabled", "1"}, {"interval", "30"}}},
        {"retrievePTZTrackingType", {{"nodeID", "n1"}}},
        {"setPTZTrackingType", {{"type", "smarttracking"}}},
        {"stopPTZMovement", {}},
        {"areaZoom",
         {{"zoomCenterX", 320},
          {"zoomCenterY", 240},
          {"viewCellWidth", 640},
          {"viewCellHeight", 480},
          {"resolutionWidth", 1920},
          {"resolutionHeight", 1080},
          {"zoomRatio", 1.5}}},
        {"gotoSmartTrackingAdvPreset", {{"presetName", "Entrance"}}},
        {"getSmartTrackingAdvPresetList", {}},
    }};
    return commands;
}
