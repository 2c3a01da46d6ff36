#include "CamsimProcess.h"
#include "Completion.h"
#include "PluginQuenvarDefs.h"
#include "camera/CameraProxy.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <vector>

namespace {

const QString USER = QStringLiteral("operator");
const QString PASS = QStringLiteral("p4ss:w&rd");
const std::string CAMCTRL = "/cgi-bin/camctrl/camctrl.cgi";

// CameraProxy with its own Wendrel against the simulated camera, with Digest authentication.
class CameraProxyEndToEndTest : public ::testing::Test {
protected:
    QVariantMap params(const QVariantMap& extra = QVariantMap()) const {
        QVariantMap params{{KEY_HOST, CamsimProcess::host()},
                           {KEY_PORT, camsim.port()},
                           {KEY_USER, USER},
                           {KEY_PASS, PASS}};
        params.insert(extra);
        return params;
    }

    CamsimProcess camsim{{QStringLiteral("--auth"), QStringLiteral("digest"),
                          QStringLiteral("--user"), USER, QStringLiteral("--pass"), PASS}};
};

TEST_F(CameraProxyEndToEndTest, EveryOperationReachesTheCameraAsDescribedAndEndsOnce) {
    ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
    struct Step {
        Operation operation;
        QVariantMap params;
        std::string outcome;
    };
    const QVariantMap zoom{{KEY_ZOOM_CENTER_X, 320},     {KEY_ZOOM_CENTER_Y, 240},
                           {KEY_VIEW_CELL_WIDTH, 640},   {KEY_VIEW_CELL_HEIGHT, 480},
                           {KEY_RESOLUTION_WIDTH, 1920}, {KEY_RESOLUTION_HEIGHT, 1080},
                           {KEY_ZOOM_RATIO, 1.6}};
    const Step steps[] = {
        {Operation::Stop, {{KEY_PASS, "wrong"}}, outcome(1, false)},
        {Operation::GetIdleAction,
         {},
         outcome(1, true, QVariantMap{{KEY_ENABLED, "0"}, {KEY_INTERVAL, "30"}})},
        {Operation::SetIdleAction, {{KEY_ENABLED, 1}, {KEY_INTERVAL, 45}}, outcome(1, true)},
        {Operation::GetIdleAction,
         {},
         outcome(1, true, QVariantMap{{KEY_ENABLED, "1"}, {KEY_INTERVAL, "45"}})},
        {Operation::SetTrackingType, {{KEY_TYPE, "smarttracking"}}, outcome(1, true)},
        {Operation::GetTrackingType,
         {{KEY_NODE_ID, "node-1"}},
         outcome(1, true, QVariantMap{{KEY_TYPE, "smarttracking"}, {KEY_NODE_ID, "node-1"}})},
        {Operation::AreaZoom, zoom, outcome(1, true)},
        {Operation::Stop, {}, outcome(1, true)},
        {Operation::GetPresetList, {}, outcome(1, true, QStringList{"Entrance", "Parking Lot"})},
        {Operation::GotoPreset,
         {{KEY_PRESET_NAME, "a b&auto=stop"}},
         outcome(1, true, QStringLiteral("ptztrack_track='a b&auto=stop'\r\n"))},
    };
    CameraProxy proxy;
    for (std::size_t index = 0; index < std::size(steps); ++index) {
        const auto completion = start(steps[index].operation, proxy, params(steps[index].params));
        EXPECT_TRUE(completion->wait()) << "step " << index << " did not complete";
        EXPECT_EQ(completion->outcome(), steps[index].outcome) << "step " << index;
    }

    // The refused stop never reached the camera, and the preset name's "&auto=stop" stayed in it.
    EXPECT_EQ(
        camsim.logLines(),
        (std::vector<std::string>{
            "GET\t/cgi-bin/admin/getparam.cgi?camctrl\t",
            "POST\t/cgi-bin/admin/setparam.cgi\tcamctrl_c0_idleaction_enable=1"
            "&camctrl_c0_idleaction_type=objtrack&camctrl_c0_idleaction_interval=45",
            "GET\t/cgi-bin/admin/getparam.cgi?camctrl\t",
            "POST\t" + CAMCTRL + "\tptztrack=setSmartTracking",
            "GET\t" + CAMCTRL + "?ptztrack=getCurrentType\t",
            "GET\t" + CAMCTRL + "?getratio&getmaxratio\t",
            "GET\t" + CAMCTRL + "?x=320&y=240&videosize=640x480&resolution=1920x1080&stretch=1\t",
            "GET\t" + CAMCTRL + "?setptmode=nonblock&setratio=1.6\t",
            "GET\t" + CAMCTRL + "?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop\t",
            "GET\t/VCA/PTZAdv/PresetWithRule\t",
            "GET\t" + CAMCTRL + "?ptztrack=track&name=a%20b%26auto%3Dstop\t",
        }));
    EXPECT_EQ(camsim.state(),
              R"({"center":{"resolution":"1920x1080","videosize":"640x480","x":320,"y":240},)"
              R"("idleEnable":"1","idleInterval":"45","idleType":"objtrack",)"
              R"("lastPreset":"a b&auto=stop","maxratio":20,"stopCount":1,)"
              R"("trackingType":"smarttracking","zoom":1.6})");

    // The zoom's later steps hold neither the proxy nor, once it goes, its client.
    auto released = std::make_unique<CameraProxy>();
    const auto completion = start(Operation::AreaZoom, *released, params({{KEY_ZOOM_RATIO, 2}}));
    released.reset();
    ASSERT_TRUE(completion->wait());
    EXPECT_THAT(completion->outcome(), ::testing::StartsWith("1x "));
}

} // namespace
