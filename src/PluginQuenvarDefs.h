// The words shared by the plugin's sources: command names, request and result keys, VCA command
// texts and plugin identifiers. Compared exactly and case-sensitively.
#pragma once

#include <QString>

// This plugin's identifier: its metadata, the source of its events, the sender of its requests.
static const QString PLUGIN_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
// The VCA plugin, whose vcaMetadataChanged signal the plugin listens to.
static const QString VCA_PLUGIN_ID = QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD");

// Client commands, in the order the dispatcher tests them.
static const QString CMD_RETRIEVE_VCA_RAW_RULE_INFO = QStringLiteral("retrieveVcaRawRuleInfo");
static const QString CMD_GET_RECORDING_VCA_RULE = QStringLiteral("getRecordingVCARule");
static const QString CMD_RETRIEVE_PTZ_IDLE_ACTION = QStringLiteral("retrievePTZIdleAction");
static const QString CMD_SET_PTZ_IDLE_ACTION = QStringLiteral("setPTZIdleAction");
static const QString CMD_RETRIEVE_PTZ_TRACKING_TYPE = QStringLiteral("retrievePTZTrackingType");
static const QString CMD_SET_PTZ_TRACKING_TYPE = QStringLiteral("setPTZTrackingType");
static const QString CMD_STOP_PTZ_MOVEMENT = QStringLiteral("stopPTZMovement");
static const QString CMD_AREA_ZOOM = QStringLiteral("areaZoom");
static const QString CMD_GOTO_SMART_TRACKING_ADV_PRESET =
    QStringLiteral("gotoSmartTrackingAdvPreset");
static const QString CMD_GET_SMART_TRACKING_ADV_PRESET_LIST =
    QStringLiteral("getSmartTrackingAdvPresetList");

// Connection parameters of every camera request.
static const QString KEY_HOST = QStringLiteral("host");
static const QString KEY_PORT = QStringLiteral("port");
static const QString KEY_USER = QStringLiteral("user");
static const QString KEY_PASS = QStringLiteral("pass");
static const QString KEY_USE_SSL = QStringLiteral("useSSL");

static const QString KEY_NODE_ID = QStringLiteral("nodeID");
static const QString KEY_PRESET_NAME = QStringLiteral("presetName");
static const QString KEY_ENABLED = QStringLiteral("enabled");
static const QString KEY_INTERVAL = QStringLiteral("interval");
static const QString KEY_TYPE = QStringLiteral("type");
static const QString KEY_ZOOM_CENTER_X = QStringLiteral("zoomCenterX");
static const QString KEY_ZOOM_CENTER_Y = QStringLiteral("zoomCenterY");
static const QString KEY_VIEW_CELL_WIDTH = QStringLiteral("viewCellWidth");
static const QString KEY_VIEW_CELL_HEIGHT = QStringLiteral("viewCellHeight");
static const QString KEY_RESOLUTION_WIDTH = QStringLiteral("resolutionWidth");
static const QString KEY_RESOLUTION_HEIGHT = QStringLiteral("resolutionHeight");
static const QString KEY_ZOOM_RATIO = QStringLiteral("zoomRatio");
static const QString KEY_LOCATION_IDS = QStringLiteral("locationIDs");
static const QString KEY_TIMESTAMP = QStringLiteral("timestamp");

// VCA rules and their change event.
static const QString EVENT_LIVE_VCA_RULE_CHANGED = QStringLiteral("liveVCARuleChanged");
static const QString VCA_CMD_GET_VCA_RULES = QStringLiteral("GetVCARules");
static const QString VCA_GET_VCA_RULES_FORMAT =
    QStringLiteral("<GetVCARules><Cam>%1</Cam></GetVCARules>");
static const QString VCA_CMD_GET_RECORDING_VCA_RULES = QStringLiteral("GetRecordingVCARules");
static const QString VCA_GET_RECORDING_VCA_RULES_FORMAT =
    QStringLiteral("<GetRecordingVCARules><QueryTime>%1</QueryTime>%2</GetRecordingVCARules>");
static const QString VCA_LOCATION_FORMAT = QStringLiteral("<Loc>%1</Loc>");
static const QString VCA_KEY_CAM_ID = QStringLiteral("camID");
static const QString VCA_KEY_IS_JSON = QStringLiteral("isJSON");
static const QString VCA_KEY_RELAY_PATH = QStringLiteral("relayPath");
static const QString VCA_KEY_RULES = QStringLiteral("rules");
static const QString VCA_KEY_ANALYSIS_ENGINE = QStringLiteral("analysisEngine");
static const QString VCA_KEY_PROJECTION = QStringLiteral("projection");
static const QString VCA_KEY_VCA_RULES = QStringLiteral("vcaRules");
