#include "BuildPaths.h"
#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"

#include <QProcess>
#include <QRegularExpression>

#include <gtest/gtest.h>

#include <climits>
#include <memory>

namespace {

struct Answer {
    bool handled = false;
    QString code;
    QString message;
    QVariant payload;
};

using Answers = std::shared_ptr<QList<Answer>>;

ResponseCallback recordInto(const Answers& answers) {
    return [answers](bool handled, const QString& code, const QString& message,
                     const QVariant& payload) {
        answers->append({handled, code, message, payload});
    };
}

const QStringList CAMERA_COMMAND_NAMES = {
    "retrievePTZIdleAction",
    "setPTZIdleAction",
    "retrievePTZTrackingType",
    "setPTZTrackingType",
    "stopPTZMovement",
    "areaZoom",
    "gotoSmartTrackingAdvPreset",
    "getSmartTrackingAdvPresetList",
};

const QStringList ALL_COMMAND_NAMES =
    QStringList{"retrieveVcaRawRuleInfo", "getRecordingVCARule"} + CAMERA_COMMAND_NAMES;

QVariantMap cameraParams() {
    return {{"host", "10.1.2.3"}, {"port", 8080},     {"user", "admin"},    {"pass", "secret"},
            {"useSSL", false},    {"zoomRatio", 2.5}, {"nodeID", "node-9"}, {"presetName", "Gate"}};
}

class DispatchTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(plugin.InitialPluginBase(&tools));
        plugin.setCameraProxy(camera);
        plugin.setVcaRuleRetriever(rules);
    }

    void request(const QString& command, const QVariant& params) {
        plugin.Request(command, params, RequestSenderInfo{}, recordInto(answers));
    }

    FakeFrameworkTools tools;
    PluginQuenvar plugin;
    std::shared_ptr<FakeCameraProxy> camera = std::make_shared<FakeCameraProxy>();
    std::shared_ptr<FakeVcaRuleRetriever> rules = std::make_shared<FakeVcaRuleRetriever>();
    Answers answers = std::make_shared<QList<Answer>>();
};

// What the camera operation hands its callback, and so what the client's payload must be.
enum class Payload { Map, None, Variant, StringList };

struct CameraCase {
    const char* command;
    const char* operation;
    Payload payload;
};

void PrintTo(const CameraCase& row, std::ostream* out) {
    *out << row.command;
}

class CameraDispatchTest
    : public DispatchTest
    , public ::testing::WithParamInterface<CameraCase> {
protected:
    QVariant resultOnSuccess() const {
        switch (GetParam().payload) {
        case Payload::Map:
            return QVariantMap{{"enabled", true}, {"interval", 30}};
        case Payload::None:
            return {};
        case Payload::Variant:
            return QStringLiteral("moved to Gate");
        case Payload::StringList:
            return QStringList{"Gate", "Door"};
        }
        return {};
    }

    QVariant resultOnFailure() const {
        switch (GetParam().payload) {
        case Payload::Map:
            return QVariantMap{};
        case Payload::None:
            return {};
        case Payload::Variant:
            return QStringLiteral("404 Not Found");
        case Payload::StringList:
            return QStringList{};
        }
        return {};
    }
};

TEST_P(CameraDispatchTest, ReachesItsOperationAndAnswersWithCodeAndPayload) {
    request(GetParam().command, cameraParams());
    request(GetParam().command, cameraParams());
    ASSERT_EQ(camera->calls.size(), 2);
    for (const auto& call : camera->calls) {
        EXPECT_EQ(call.operation, GetParam().operation);
        EXPECT_EQ(call.params, cameraParams());
    }
    EXPECT_TRUE(answers->isEmpty());
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_TRUE(rules->recordingCalls.isEmpty());

    camera->calls[0].complete(true, resultOnSuccess());
    camera->calls[1].complete(false, resultOnFailure());

    ASSERT_EQ(answers->size(), 2);
    const QVariant expected[] = {resultOnSuccess(), resultOnFailure()};
    for (int i = 0; i < 2; ++i) {
        SCOPED_TRACE(i == 0 ? "success" : "failure");
        const Answer& answer = answers->at(i);
        EXPECT_TRUE(answer.handled);
        EXPECT_EQ(answer.code, i == 0 ? "0" : "-1");
        EXPECT_TRUE(answer.message.isEmpty());
        if (GetParam().payload == Payload::None) {
            EXPECT_FALSE(answer.payload.isValid());
        } else {
            EXPECT_EQ(answer.payload.metaType(), expected[i].metaType());
            EXPECT_EQ(answer.payload, expected[i]);
        }
    }
}

TEST_P(CameraDispatchTest, EmptyClientCallbackIsNeverCalled) {
    plugin.Request(GetParam().command, cameraParams(), RequestSenderInfo{}, ResponseCallback());
    ASSERT_EQ(camera->calls.size(), 1);
    EXPECT_NO_THROW(camera->calls[0].complete(true, resultOnSuccess()));
    EXPECT_NO_THROW(camera->calls[0].complete(false, resultOnFailure()));
}

INSTANTIATE_TEST_SUITE_P(
    CameraCommands, CameraDispatchTest,
    ::testing::Values(CameraCase{"retrievePTZIdleAction", "getPTZIdleAction", Payload::Map},
                      CameraCase{"setPTZIdleAction", "setPTZIdleAction", Payload::None},
                      CameraCase{"retrievePTZTrackingType", "getPTZTrackingType", Payload::Map},
                      CameraCase{"setPTZTrackingType", "setPTZTrackingType", Payload::None},
                      CameraCase{"stopPTZMovement", "stopPTZMovement", Payload::None},
                      CameraCase{"areaZoom", "areaZoom", Payload::None},
                      CameraCase{"gotoSmartTrackingAdvPreset", "gotoSmartTrackingAdvPreset",
                                 Payload::Variant},
                      CameraCase{"getSmartTrackingAdvPresetList", "getSmartTrackingAdvPresetList",
                                 Payload::StringList}),
    [](const ::testing::TestParamInfo<CameraCase>& info) { return info.param.command; });

TEST_F(DispatchTest, CameraCommandWithoutAMapGetsAnEmptyMap) {
    request("stopPTZMovement", QStringLiteral("10.1.2.3"));
    ASSERT_EQ(camera->calls.size(), 1);
    EXPECT_TRUE(camera->calls[0].params.isEmpty());
}

TEST_F(DispatchTest, EveryCameraCommandReachesTheProxySetLast) {
    const auto replacement = std::make_shared<FakeCameraProxy>();
    plugin.setCameraProxy(replacement);
    for (const QString& command : CAMERA_COMMAND_NAMES)
        request(command, cameraParams());

    QStringList reached;
    for (const auto& call : replacement->calls)
        reached << call.operation;
    EXPECT_EQ(reached,
              (QStringList{"getPTZIdleAction", "setPTZIdleAction", "getPTZTrackingType",
                           "setPTZTrackingType", "stopPTZMovement", "areaZoom",
                           "gotoSmartTrackingAdvPreset", "getSmartTrackingAdvPresetList"}));
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_EQ(camera.use_count(), 1) << "the replaced proxy is still held";
}

TEST_F(DispatchTest, LiveRuleCommandPassesTheParameterAsTextAndTheCallbackUnchanged) {
    const QList<std::pair<QVariant, QString>> rows = {
        {QStringLiteral("cam-7"), "cam-7"},
        {42, "42"},
        {QVariantMap{{"cam", "cam-7"}}, ""},
    };
    for (const auto& [params, cameraId] : rows)
        request("retrieveVcaRawRuleInfo", params);

    ASSERT_EQ(rules->liveCalls.size(), rows.size());
    for (int i = 0; i < rows.size(); ++i)
        EXPECT_EQ(rules->liveCalls[i].cameraId, rows[i].second);
    EXPECT_TRUE(answers->isEmpty());

    rules->liveCalls[0].callback(false, "7", "from the rules", QVariant(3));
    ASSERT_EQ(answers->size(), 1);
    EXPECT_FALSE(answers->at(0).handled);
    EXPECT_EQ(answers->at(0).code, "7");
    EXPECT_EQ(answers->at(0).message, "from the rules");
    EXPECT_EQ(answers->at(0).payload, QVariant(3));
    EXPECT_TRUE(camera->calls.isEmpty());
}

struct RecordingCase {
    const char* name;
    QVariant params;
    QStringList locationIDs;
    quint64 timestamp;
};

void PrintTo(const RecordingCase& row, std::ostream* out) {
    *out << row.name;
}

class RecordingDispatchTest
    : public DispatchTest
    , public ::testing::WithParamInterface<RecordingCase> {};

TEST_P(RecordingDispatchTest, ConvertsLocationsAndTime) {
    request("getRecordingVCARule", GetParam().params);

    ASSERT_EQ(rules->recordingCalls.size(), 1);
    EXPECT_EQ(rules->recordingCalls[0].locationIDs, GetParam().locationIDs);
    EXPECT_EQ(rules->recordingCalls[0].timestamp, GetParam().timestamp);
    EXPECT_TRUE(rules->liveCalls.isEmpty());

    rules->recordingCalls[0].callback(true, "0", "", QVariant(5));
    ASSERT_EQ(answers->size(), 1);
    EXPECT_EQ(answers->at(0).payload, QVariant(5));
}

INSTANTIATE_TEST_SUITE_P(
    Parameters, RecordingDispatchTest,
    ::testing::Values(
        RecordingCase{
            "Both",
            QVariantMap{{"locationIDs", QStringList{"loc-1", "loc-2"}}, {"timestamp", 1700000000}},
            {"loc-1", "loc-2"},
            1700000000u},
        RecordingCase{"VariantListOfTexts",
                      QVariantMap{{"locationIDs", QVariantList{"loc-1", "loc-2"}},
                                  {"timestamp", QStringLiteral("12")}},
                      {"loc-1", "loc-2"},
                      12u},
        RecordingCase{
            "NoTimestamp", QVariantMap{{"locationIDs", QStringList{"loc-1"}}}, {"loc-1"}, 0u},
        RecordingCase{"NoLocations", QVariantMap{{"timestamp", 99}}, {}, 99u},
        RecordingCase{"MinusOne", QVariantMap{{"timestamp", -1}}, {}, 0xFFFFFFFFFFFFFFFFull},
        RecordingCase{
            "MostNegative", QVariantMap{{"timestamp", INT_MIN}}, {}, 0xFFFFFFFF80000000ull},
        RecordingCase{"NotAMap", QStringLiteral("loc-1"), {}, 0u}),
    [](const ::testing::TestParamInfo<RecordingCase>& info) { return info.param.name; });

TEST_F(DispatchTest, UnknownCommandsStartNothingAndGetNoAnswer) {
    for (const char* command : {"AreaZoom", "areazoom", "AREAZOOM", "areaZoom ", "GetVCARules",
                                "RetrieveVcaRawRuleInfo", "getRecordingVcaRule", ""}) {
        SCOPED_TRACE(command);
        request(command, cameraParams());
    }
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_TRUE(rules->recordingCalls.isEmpty());
    EXPECT_TRUE(answers->isEmpty());
}

TEST_F(DispatchTest, BlockingRequestsAreNeverAnswered) {
    FakeResponser responser;
    for (const QString& command : ALL_COMMAND_NAMES + QStringList{"unknown"})
        plugin.RequestBlock(command, cameraParams(), RequestSenderInfo{}, responser);
    EXPECT_EQ(responser.count, 0);
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_TRUE(rules->recordingCalls.isEmpty());
}

TEST(DispatchBeforeInitialisationTest, EveryCommandIsAnsweredAsFailed) {
    PluginQuenvar plugin;
    for (const QString& command : ALL_COMMAND_NAMES) {
        SCOPED_TRACE(qPrintable(command));
        const auto answers = std::make_shared<QList<Answer>>();
        plugin.Request(command, cameraParams(), RequestSenderInfo{}, recordInto(answers));
        ASSERT_EQ(answers->size(), 1);
        EXPECT_TRUE(answers->at(0).handled);
        EXPECT_EQ(answers->at(0).code, "-1");
        EXPECT_TRUE(answers->at(0).message.isEmpty());
        EXPECT_FALSE(answers->at(0).payload.isValid());
        EXPECT_NO_THROW(
            plugin.Request(command, cameraParams(), RequestSenderInfo{}, ResponseCallback()));
    }
}

// Needs the rule service that sends through the host's request channel.
TEST(DispatchReinitialisationTest, RuleRequestsGoThroughTheLatestTools) {
    FakeFrameworkTools first;
    FakeFrameworkTools second;
    PluginQuenvar plugin;
    ASSERT_TRUE(plugin.InitialPluginBase(&first));
    ASSERT_TRUE(plugin.InitialPluginBase(&second));

    plugin.Request("retrieveVcaRawRuleInfo", QStringLiteral("cam-1"), RequestSenderInfo{},
                   [](bool, const QString&, const QString&, const QVariant&) {});

    EXPECT_EQ(first.channel.count(), 0);
    ASSERT_EQ(second.channel.count(), 1);
    EXPECT_EQ(second.channel.sent()[0].command, "GetVCARules");
}

// The failure messages need the real logging library, which reads its set-up when the plugin
// module loads, so they are observed in a child process: preset-log-probe makes one request,
// completes it as told and writes the answer to standard error, where the library logs too.
struct PresetLogCase {
    const char* name;
    QStringList probeArguments; // command, host, ok|fail, answer parts
    QString message;            // the level-2 message, or empty for none
    QString answerCode;
};

void PrintTo(const PresetLogCase& row, std::ostream* out) {
    *out << row.name;
}

class PresetLogTest : public ::testing::TestWithParam<PresetLogCase> {};

TEST_P(PresetLogTest, LogsFailuresWithHostAndResponseBeforeAnswering) {
    QProcess probe;
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert(QStringLiteral("KALBLOG_LEVEL"), QStringLiteral("2"));
    environment.remove(QStringLiteral("KALBLOG_FILE"));
    probe.setProcessEnvironment(environment);
    probe.start(BuildPaths::bin(QStringLiteral("preset-log-probe")), GetParam().probeArguments);
    ASSERT_TRUE(probe.waitForFinished(30000));
    ASSERT_EQ(probe.exitStatus(), QProcess::NormalExit);
    ASSERT_EQ(probe.exitCode(), 0);

    const QStringList lines = QString::fromLocal8Bit(probe.readAllStandardError())
                                  .split(QLatin1Char('\n'), Qt::SkipEmptyParts);
    const QRegularExpression logLine(R"(\[Quenvar\] L(\d+) src/PluginQuenvar:\d+ (.*)$)");
    QStringList messages;
    int answerLine = -1;
    int messageLine = -1;
    for (int i = 0; i < lines.size(); ++i) {
        const auto match = logLine.match(lines[i]);
        if (match.hasMatch() && match.captured(1) == "2") {
            messages << match.captured(2);
            messageLine = i;
        } else if (lines[i].startsWith("answer ")) {
            answerLine = i;
        }
    }

    ASSERT_NE(answerLine, -1) << qPrintable(lines.join('\n'));
    EXPECT_EQ(lines[answerLine], "answer true " + GetParam().answerCode);
    if (GetParam().message.isEmpty()) {
        EXPECT_TRUE(messages.isEmpty()) << qPrintable(lines.join('\n'));
    } else {
        EXPECT_EQ(messages, QStringList{GetParam().message});
        EXPECT_LT(messageLine, answerLine);
    }
}

INSTANTIATE_TEST_SUITE_P(
    PresetCommands, PresetLogTest,
    ::testing::Values(
        PresetLogCase{"GotoFails",
                      {"gotoSmartTrackingAdvPreset", "10.0.0.7", "fail", "no such preset"},
                      "Go to SmartTrackingAdv preset failed,  ip: 10.0.0.7, response: no such "
                      "preset",
                      "-1"},
        PresetLogCase{
            "GotoSucceeds", {"gotoSmartTrackingAdvPreset", "10.0.0.7", "ok", "done"}, {}, "0"},
        PresetLogCase{"ListFails",
                      {"getSmartTrackingAdvPresetList", "cam.local", "fail", "Gate", "Door"},
                      "get SmartTrackingAdv preset list failed, ip: cam.local, response: "
                      "Gate,Door",
                      "-1"},
        PresetLogCase{"ListFailsEmpty",
                      {"getSmartTrackingAdvPresetList", "10.0.0.8", "fail"},
                      "get SmartTrackingAdv preset list failed, ip: 10.0.0.8, response: ",
                      "-1"},
        PresetLogCase{
            "ListSucceeds", {"getSmartTrackingAdvPresetList", "10.0.0.8", "ok", "Gate"}, {}, "0"},
        PresetLogCase{"OtherCommandFails", {"setPTZIdleAction", "10.0.0.9", "fail"}, {}, "-1"}),
    [](const ::testing::TestParamInfo<PresetLogCase>& info) { return info.param.name; });

} // namespace
