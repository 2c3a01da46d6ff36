#include "camera/CameraProxy.h"

#include "PluginQuenvarDefs.h"
#include "QtPrinters.h"
#include "RecordingHttpClient.h"

#include <gtest/gtest.h>

#include <memory>

namespace {

using Error = QNetworkReply::NetworkError;

enum class Operation {
    GetIdleAction,
    SetIdleAction,
    GetTrackingType,
    SetTrackingType,
    Stop,
    AreaZoom,
    GotoPreset,
    GetPresetList,
};

const Operation ALL_OPERATIONS[] = {
    Operation::GetIdleAction,   Operation::SetIdleAction, Operation::GetTrackingType,
    Operation::SetTrackingType, Operation::Stop,          Operation::AreaZoom,
    Operation::GotoPreset,      Operation::GetPresetList,
};

std::string nameOf(Operation operation) {
    switch (operation) {
    case Operation::GetIdleAction:
        return "GetIdleAction";
    case Operation::SetIdleAction:
        return "SetIdleAction";
    case Operation::GetTrackingType:
        return "GetTrackingType";
    case Operation::SetTrackingType:
        return "SetTrackingType";
    case Operation::Stop:
        return "Stop";
    case Operation::AreaZoom:
        return "AreaZoom";
    case Operation::GotoPreset:
        return "GotoPreset";
    case Operation::GetPresetList:
        return "GetPresetList";
    }
    return "Unknown";
}

// What an operation's completion callback delivered; the result is wrapped in a variant.
struct Completion {
    int count = 0;
    bool success = false;
    QVariant result;

    void record(bool ok, const QVariant& value = QVariant()) {
        ++count;
        success = ok;
        result = value;
    }
};

std::shared_ptr<Completion> start(Operation operation, CameraProxy& proxy,
                                  const QVariantMap& params) {
    auto completion = std::make_shared<Completion>();
    const auto plain = [completion](bool ok) { completion->record(ok); };
    const auto withMap = [completion](bool ok, const QVariantMap& result) {
        completion->record(ok, result);
    };
    switch (operation) {
    case Operation::GetIdleAction:
        proxy.getPTZIdleAction(params, withMap);
        break;
    case Operation::SetIdleAction:
        proxy.setPTZIdleAction(params, plain);
        break;
    case Operation::GetTrackingType:
        proxy.getPTZTrackingType(params, withMap);
        break;
    case Operation::SetTrackingType:
        proxy.setPTZTrackingType(params, plain);
        break;
    case Operation::Stop:
        proxy.stopPTZMovement(params, plain);
        break;
    case Operation::AreaZoom:
        proxy.areaZoom(params, plain);
        break;
    case Operation::GotoPreset:
        proxy.gotoSmartTrackingAdvPreset(params, [completion](bool ok, const QVariant& answer) {
            completion->record(ok, answer);
        });
        break;
    case Operation::GetPresetList:
        proxy.getSmartTrackingAdvPresetList(params, [completion](bool ok, QList<QString> names) {
            completion->record(ok, QStringList(names));
        });
        break;
    }
    return completion;
}

// The result an operation delivers with a failure and an empty body.
QVariant failureResult(Operation operation) {
    switch (operation) {
    case Operation::GetIdleAction:
        return QVariantMap();
    case Operation::GetTrackingType:
        return QVariantMap{{KEY_TYPE, QStringLiteral("autotracking")}, {KEY_NODE_ID, QString()}};
    case Operation::GotoPreset:
        return QString();
    case Operation::GetPresetList:
        return QStringList();
    default:
        return QVariant();
    }
}

QVariantMap cameraParams(const QVariantMap& extra = QVariantMap()) {
    QVariantMap params{{KEY_HOST, QStringLiteral("10.1.2.3")},
                       {KEY_PORT, 8443},
                       {KEY_USE_SSL, true},
                       {KEY_USER, QStringLiteral("admin")},
                       {KEY_PASS, QStringLiteral("s3cret&x=1")}};
    params.insert(extra);
    return params;
}

void expectCameraArguments(const RecordingHttpClient::Request& request) {
    EXPECT_EQ(request.host, "10.1.2.3");
    EXPECT_EQ(request.port, 8443);
    EXPECT_TRUE(request.useSSL);
    EXPECT_EQ(request.user, "admin");
    EXPECT_EQ(request.password, "s3cret&x=1");
    EXPECT_EQ(request.timeout, 10000u);
    if (request.method == "GET") {
        EXPECT_TRUE(request.headers.isEmpty());
    } else {
        EXPECT_EQ(request.contentType, "application/x-www-form-urlencoded");
    }
}

const QString CAMCTRL = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
const QString RATIO_ANSWER = QStringLiteral("zoom=2\nmaxratio=20\n");

class CameraProxyTest : public ::testing::Test {
protected:
    CameraProxyTest() { proxy.setHTTPClient(client); }

    const RecordingHttpClient::Request& request(std::size_t index) const {
        return client->requests.at(index);
    }

    std::shared_ptr<RecordingHttpClient> client = std::make_shared<RecordingHttpClient>();
    CameraProxy proxy;
};

template <typename Row>
std::string rowName(const ::testing::TestParamInfo<Row>& info) {
    return info.param.name;
}

// Every request of every operation, with every argument the client receives.
struct RequestCase {
    std::string name;
    Operation operation;
    QVariantMap params;
    QString method;
    QString path;
    QByteArray body;

    friend void PrintTo(const RequestCase& row, std::ostream* out) { *out << row.name; }
};

class CameraProxyRequestTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<RequestCase> {};

TEST_P(CameraProxyRequestTest, SendsExactlyOneRequestWithTheConnectionParameters) {
    const RequestCase& row = GetParam();
    start(row.operation, proxy, cameraParams(row.params));

    ASSERT_EQ(client->requests.size(), 1u);
    EXPECT_EQ(request(0).method, row.method);
    EXPECT_EQ(request(0).path, row.path);
    EXPECT_EQ(request(0).body, row.body);
    expectCameraArguments(request(0));
}

const QByteArray IDLE_TYPE = "&camctrl_c0_idleaction_type=objtrack&camctrl_c0_idleaction_interval=";

INSTANTIATE_TEST_SUITE_P(
    AllOperations, CameraProxyRequestTest,
    ::testing::Values(
        RequestCase{"Stop",
                    Operation::Stop,
                    {},
                    "GET",
                    CAMCTRL + "?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop",
                    {}},
        RequestCase{"AreaZoomAsksForRatios",
                    Operation::AreaZoom,
                    {},
                    "GET",
                    CAMCTRL + "?getratio&getmaxratio",
                    {}},
        RequestCase{"GetIdleAction",
                    Operation::GetIdleAction,
                    {},
                    "GET",
                    "/cgi-bin/admin/getparam.cgi?camctrl",
                    {}},
        RequestCase{"GetTrackingType",
                    Operation::GetTrackingType,
                    {{KEY_NODE_ID, "n1"}},
                    "GET",
                    CAMCTRL + "?ptztrack=getCurrentType",
                    {}},
        RequestCase{
            "GetPresetList", Operation::GetPresetList, {}, "GET", "/VCA/PTZAdv/PresetWithRule", {}},
        RequestCase{"GotoPreset",
                    Operation::GotoPreset,
                    {{KEY_PRESET_NAME, "Home"}},
                    "GET",
                    CAMCTRL + "?ptztrack=track&name=Home",
                    {}},
        RequestCase{"GotoPresetNameStaysOneParameter",
                    Operation::GotoPreset,
                    {{KEY_PRESET_NAME, "a b&auto=stop"}},
                    "GET",
                    CAMCTRL + "?ptztrack=track&name=a%20b%26auto%3Dstop",
                    {}},
        RequestCase{"GotoPresetNameInUtf8",
                    Operation::GotoPreset,
                    {{KEY_PRESET_NAME, QStringLiteral("Caf\u00e9-1_2.3~")}},
                    "GET",
                    CAMCTRL + "?ptztrack=track&name=Caf%C3%A9-1_2.3~",
                    {}},
        RequestCase{"GotoPresetWithoutName",
                    Operation::GotoPreset,
                    {},
                    "GET",
                    CAMCTRL + "?ptztrack=track&name=",
                    {}},
        RequestCase{"SetIdleAction",
                    Operation::SetIdleAction,
                    {{KEY_ENABLED, "1"}, {KEY_INTERVAL, 60}},
                    "POST",
                    "/cgi-bin/admin/setparam.cgi",
                    "camctrl_c0_idleaction_enable=1" + IDLE_TYPE + "60"},
        RequestCase{"SetIdleActionWithoutValues",
                    Operation::SetIdleAction,
                    {},
                    "POST",
                    "/cgi-bin/admin/setparam.cgi",
                    "camctrl_c0_idleaction_enable=" + IDLE_TYPE},
        RequestCase{"SetIdleActionWithBoolean",
                    Operation::SetIdleAction,
                    {{KEY_ENABLED, true}, {KEY_INTERVAL, "30"}},
                    "POST",
                    "/cgi-bin/admin/setparam.cgi",
                    "camctrl_c0_idleaction_enable=true" + IDLE_TYPE + "30"},
        RequestCase{"SetIdleActionValuesStayOneParameterEach",
                    Operation::SetIdleAction,
                    {{KEY_ENABLED, "1&camctrl_c0_idleaction_type=preset"}, {KEY_INTERVAL, "3 0"}},
                    "POST",
                    "/cgi-bin/admin/setparam.cgi",
                    "camctrl_c0_idleaction_enable=1%26camctrl_c0_idleaction_type%3Dpreset" +
                        IDLE_TYPE + "3%200"},
        RequestCase{"SetSmartTracking",
                    Operation::SetTrackingType,
                    {{KEY_TYPE, "smarttracking"}},
                    "POST",
                    CAMCTRL,
                    "ptztrack=setSmartTracking"},
        RequestCase{"SetAutoTracking",
                    Operation::SetTrackingType,
                    {{KEY_TYPE, "autotracking"}},
                    "POST",
                    CAMCTRL,
                    "ptztrack=setAutoTracking"},
        RequestCase{"SetTrackingIsCaseSensitive",
                    Operation::SetTrackingType,
                    {{KEY_TYPE, "SmartTracking"}},
                    "POST",
                    CAMCTRL,
                    "ptztrack=setAutoTracking"},
        RequestCase{"SetTrackingWithoutType",
                    Operation::SetTrackingType,
                    {},
                    "POST",
                    CAMCTRL,
                    "ptztrack=setAutoTracking"}),
    rowName<RequestCase>);

TEST_F(CameraProxyTest, MissingConnectionParametersAreSentEmpty) {
    start(Operation::Stop, proxy, QVariantMap());

    ASSERT_EQ(client->requests.size(), 1u);
    EXPECT_EQ(request(0).host, QString());
    EXPECT_EQ(request(0).port, 0);
    EXPECT_FALSE(request(0).useSSL);
    EXPECT_EQ(request(0).user, QString());
    EXPECT_EQ(request(0).password, QString());
}

// The port as given, and what reaches the client: a port, or nothing at all.
struct PortCase {
    std::string name;
    QVariant port;
    int sent; // -1: refused

    friend void PrintTo(const PortCase& row, std::ostream* out) { *out << row.name; }
};

class CameraProxyPortTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<PortCase> {};

TEST_P(CameraProxyPortTest, SendsAnAddressablePortAndRefusesTheRest) {
    const PortCase& row = GetParam();
    QVariantMap params = cameraParams();
    params.insert(KEY_PORT, row.port);
    if (!row.port.isValid())
        params.remove(KEY_PORT);

    const auto get = start(Operation::Stop, proxy, params);
    const auto post = start(Operation::SetTrackingType, proxy, params);

    if (row.sent < 0) {
        EXPECT_TRUE(client->requests.empty());
        EXPECT_EQ(get->count, 1);
        EXPECT_FALSE(get->success);
        EXPECT_EQ(post->count, 1);
        EXPECT_FALSE(post->success);
        return;
    }
    ASSERT_EQ(client->requests.size(), 2u);
    EXPECT_EQ(request(0).port, row.sent);
    EXPECT_EQ(request(1).port, row.sent);
    EXPECT_EQ(get->count + post->count, 0);
}

INSTANTIATE_TEST_SUITE_P(
    Ports, CameraProxyPortTest,
    ::testing::Values(PortCase{"Missing", QVariant(), 0}, PortCase{"Zero", 0, 0},
                      PortCase{"Number", 80, 80}, PortCase{"Text", "8080", 8080},
                      PortCase{"WholeDouble", 443.0, 443}, PortCase{"Highest", 65535, 65535},
                      PortCase{"NotANumberReadsAsZero", "abc", 0}, PortCase{"JustAbove", 65536, -1},
                      PortCase{"TextAbove", "70000", -1}, PortCase{"Negative", -1, -1},
                      PortCase{"NegativeText", "-1", -1},
                      PortCase{"WrapsToHttpInSixteenBits", qlonglong(65536 + 80), -1},
                      PortCase{"BeyondSigned64Bits", "18446744073709551615", -1}),
    rowName<PortCase>);

// Behaviour every operation shares.
class CameraProxyOperationTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<Operation> {};

TEST_P(CameraProxyOperationTest, RefusesAnUnaddressablePortOnceWithoutSending) {
    const auto completion = start(GetParam(), proxy, cameraParams({{KEY_PORT, 70000}}));

    EXPECT_TRUE(client->requests.empty());
    EXPECT_EQ(completion->count, 1);
    EXPECT_FALSE(completion->success);
    EXPECT_EQ(completion->result, failureResult(GetParam()));
}

TEST_P(CameraProxyOperationTest, SucceedsOnTransportSuccessWhateverTheAnswerSays) {
    const auto completion = start(GetParam(), proxy, cameraParams());
    EXPECT_EQ(completion->count, 0);

    client->answerAll(QNetworkReply::NoError, "Error 500: camera says no");

    EXPECT_EQ(completion->count, 1);
    EXPECT_TRUE(completion->success);
}

TEST_P(CameraProxyOperationTest, FailsOnceOnTransportFailureAndSendsNothingMore) {
    const auto completion = start(GetParam(), proxy, cameraParams());

    client->answerAll(QNetworkReply::ConnectionRefusedError);

    EXPECT_EQ(client->requests.size(), 1u);
    EXPECT_EQ(completion->count, 1);
    EXPECT_FALSE(completion->success);
    EXPECT_EQ(completion->result, failureResult(GetParam()));
}

TEST_P(CameraProxyOperationTest, CompletesAfterTheProxyIsReleased) {
    auto released = std::make_unique<CameraProxy>(proxy);
    const auto completion = start(GetParam(), *released, cameraParams());
    released.reset();

    client->answerAll(QNetworkReply::NoError, RATIO_ANSWER.toUtf8());

    EXPECT_EQ(client->requests.size(), GetParam() == Operation::AreaZoom ? 3u : 1u);
    EXPECT_EQ(completion->count, 1);
    EXPECT_TRUE(completion->success);
}

INSTANTIATE_TEST_SUITE_P(AllOperations, CameraProxyOperationTest,
                         ::testing::ValuesIn(ALL_OPERATIONS),
                         [](const ::testing::TestParamInfo<Operation>& info) {
                             return nameOf(info.param);
                         });

TEST_F(CameraProxyTest, CopiesSendThroughTheSameClient) {
    CameraProxy copy(proxy);
    CameraProxy assigned;
    assigned = proxy;

    start(Operation::Stop, proxy, cameraParams());
    start(Operation::Stop, copy, cameraParams());
    start(Operation::Stop, assigned, cameraParams());

    EXPECT_EQ(client->requests.size(), 3u);
}

TEST_F(CameraProxyTest, SetHttpClientSendsThroughTheNewClientAndReleasesTheOld) {
    const std::weak_ptr<RecordingHttpClient> previous = client;
    auto replacement = std::make_shared<RecordingHttpClient>();
    proxy.setHTTPClient(replacement);
    client.reset();
    EXPECT_TRUE(previous.expired());

    start(Operation::Stop, proxy, cameraParams());

    EXPECT_EQ(replacement->requests.size(), 1u);
}

TEST_F(CameraProxyTest, AssignmentReleasesThePreviousClient) {
    CameraProxy target;
    auto own = std::make_shared<RecordingHttpClient>();
    const std::weak_ptr<RecordingHttpClient> previous = own;
    target.setHTTPClient(std::move(own));

    target = proxy;

    EXPECT_TRUE(previous.expired());
    start(Operation::Stop, target, cameraParams());
    EXPECT_EQ(client->requests.size(), 1u);
}

// Nothing but the pending requests keeps a client alive: releasing the proxy releases its client,
// which cancels the zoom, reported once.
TEST_F(CameraProxyTest, ReleasingTheOnlyOwnerCancelsAZoomInFlight) {
    auto own = std::make_shared<RecordingHttpClient>();
    const std::weak_ptr<RecordingHttpClient> watched = own;
    auto alone = std::make_unique<CameraProxy>(proxy);
    alone->setHTTPClient(std::move(own));
    const auto completion = start(Operation::AreaZoom, *alone, cameraParams());

    alone.reset();

    EXPECT_TRUE(watched.expired());
    EXPECT_EQ(completion->count, 1);
    EXPECT_FALSE(completion->success);
}

// The ratio reply, the requested factor and the setratio value sent.
struct ZoomCase {
    std::string name;
    QString ratioAnswer;
    QVariant zoomRatio;
    QString setRatio;

    friend void PrintTo(const ZoomCase& row, std::ostream* out) { *out << row.name; }
};

class CameraProxyZoomTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<ZoomCase> {};

TEST_P(CameraProxyZoomTest, ComputesTheTargetRatio) {
    const ZoomCase& row = GetParam();
    QVariantMap params = cameraParams();
    if (row.zoomRatio.isValid())
        params.insert(KEY_ZOOM_RATIO, row.zoomRatio);
    const auto completion = start(Operation::AreaZoom, proxy, params);

    client->answer(0, QNetworkReply::NoError, row.ratioAnswer.toUtf8());
    ASSERT_EQ(client->requests.size(), 2u);
    client->answer(1, QNetworkReply::NoError);
    ASSERT_EQ(client->requests.size(), 3u);
    EXPECT_EQ(request(2).path, CAMCTRL + "?setptmode=nonblock&setratio=" + row.setRatio);
    EXPECT_EQ(completion->count, 0);
    client->answer(2, QNetworkReply::NoError);

    EXPECT_EQ(completion->count, 1);
    EXPECT_TRUE(completion->success);
    for (const auto& sent : client->requests)
        expectCameraArguments(sent);
}

INSTANTIATE_TEST_SUITE_P(
    Ratios, CameraProxyZoomTest,
    ::testing::Values(
        ZoomCase{"WholeProduct", RATIO_ANSWER, 1.5, "3"},
        ZoomCase{"RoundsUpToTenths", "zoom=1\nmaxratio=20", 2.34, "2.4"},
        ZoomCase{"SmallExcessRoundsUp", "zoom=1\nmaxratio=20", 1.01, "1.1"},
        ZoomCase{"ProductJustAboveTenthsRoundsUp", "zoom=1.5\nmaxratio=20", 1.6, "2.5"},
        ZoomCase{"WithinOneOfMaximumBecomesMaximum", "zoom=10\nmaxratio=20", 1.95, "20"},
        ZoomCase{"AtLeastOneBelowMaximumIsKept", "zoom=10\nmaxratio=20", 1.8, "18"},
        ZoomCase{"ExactlyOneBelowMaximumIsKept", "zoom=1\nmaxratio=19.5", 18.5, "18.5"},
        ZoomCase{"ZoomsOut", "zoom=4\nmaxratio=20", 0.5, "2"},
        ZoomCase{"MissingMaximumHoldsAtOne", "zoom=2", 1.5, "1"},
        ZoomCase{"MissingZoomReadsAsOne", "maxratio=20", 2, "2"},
        ZoomCase{"NegativeZoomReadsAsOne", "zoom=-3\nmaxratio=20", 2, "2"},
        ZoomCase{"MissingFactorGivesZero", RATIO_ANSWER, QVariant(), "0"},
        ZoomCase{"FactorAsText", RATIO_ANSWER, "1.5", "3"},
        ZoomCase{"SixSignificantDigits", "zoom=1\nmaxratio=1000000", 123456.7, "123457"}),
    rowName<ZoomCase>);

// The area-zoom parameters and the query of the centring request.
struct CenterCase {
    std::string name;
    QVariantMap params;
    QString query;

    friend void PrintTo(const CenterCase& row, std::ostream* out) { *out << row.name; }
};

class CameraProxyCenterTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<CenterCase> {};

TEST_P(CameraProxyCenterTest, CentresOnThePickedPoint) {
    start(Operation::AreaZoom, proxy, cameraParams(GetParam().params));
    client->answer(0, QNetworkReply::NoError, RATIO_ANSWER.toUtf8());

    ASSERT_EQ(client->requests.size(), 2u);
    EXPECT_EQ(request(1).path, CAMCTRL + "?" + GetParam().query);
}

INSTANTIATE_TEST_SUITE_P(
    Centres, CameraProxyCenterTest,
    ::testing::Values(CenterCase{"Ordinary",
                                 {{KEY_ZOOM_CENTER_X, 320},
                                  {KEY_ZOOM_CENTER_Y, 240},
                                  {KEY_VIEW_CELL_WIDTH, 640},
                                  {KEY_VIEW_CELL_HEIGHT, 480},
                                  {KEY_RESOLUTION_WIDTH, "1920"},
                                  {KEY_RESOLUTION_HEIGHT, "1080"}},
                                 "x=320&y=240&videosize=640x480&resolution=1920x1080&stretch=1"},
                      CenterCase{"NegativeAndMissing",
                                 {{KEY_ZOOM_CENTER_X, -5}, {KEY_VIEW_CELL_WIDTH, 640}},
                                 "x=-5&y=0&videosize=640x&resolution=x&stretch=1"},
                      CenterCase{"ValuesStayInsideTheirParameter",
                                 {{KEY_VIEW_CELL_WIDTH, "64=0&stretch=0"},
                                  {KEY_VIEW_CELL_HEIGHT, "%3"},
                                  {KEY_RESOLUTION_WIDTH, "1920"},
                                  {KEY_RESOLUTION_HEIGHT, "1080&x=1"}},
                                 "x=0&y=0&videosize=64%3D0%26stretch%3D0x%253"
                                 "&resolution=1920x1080%26x%3D1&stretch=1"}),
    rowName<CenterCase>);

class CameraProxyZoomFailureTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<std::size_t> {};

TEST_P(CameraProxyZoomFailureTest, StopsAtTheFailingStepWithOneFalse) {
    const std::size_t failing = GetParam();
    const auto completion = start(Operation::AreaZoom, proxy, cameraParams());

    for (std::size_t step = 0; step < failing; ++step)
        client->answer(step, QNetworkReply::NoError, RATIO_ANSWER.toUtf8());
    client->answer(failing, QNetworkReply::TimeoutError, RATIO_ANSWER.toUtf8());

    EXPECT_EQ(client->requests.size(), failing + 1);
    EXPECT_EQ(client->pendingCount(), 0u);
    EXPECT_EQ(completion->count, 1);
    EXPECT_FALSE(completion->success);
}

INSTANTIATE_TEST_SUITE_P(Steps, CameraProxyZoomFailureTest, ::testing::Values(0u, 1u, 2u));

// A camera answer, how it was delivered, and the result map.
struct ParseCase {
    std::string name;
    Error outcome;
    QByteArray answer;
    QVariantMap expected;

    friend void PrintTo(const ParseCase& row, std::ostream* out) { *out << row.name; }
};

void expectTextValues(const QVariantMap& map) {
    for (const QVariant& value : map)
        EXPECT_EQ(value.typeId(), QMetaType::QString) << value.typeName();
}

class CameraProxyIdleActionTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<ParseCase> {};

TEST_P(CameraProxyIdleActionTest, ReadsTheIdleAction) {
    const ParseCase& row = GetParam();
    const auto completion = start(Operation::GetIdleAction, proxy, cameraParams());

    client->answer(0, row.outcome, row.answer);

    EXPECT_EQ(completion->count, 1);
    EXPECT_EQ(completion->success, row.outcome == QNetworkReply::NoError);
    EXPECT_EQ(completion->result.toMap(), row.expected);
    expectTextValues(completion->result.toMap());
}

const QByteArray IDLE_ANSWER = "camctrl_c0_idleaction_enable='1'\n"
                               "camctrl_c0_idleaction_type='objtrack'\n"
                               "camctrl_c0_idleaction_interval='30'\n";

QByteArray idleAnswer(const QByteArray& from, const QByteArray& to) {
    return QByteArray(IDLE_ANSWER).replace(from, to);
}

INSTANTIATE_TEST_SUITE_P(
    Answers, CameraProxyIdleActionTest,
    ::testing::Values(ParseCase{"ObjectTracking",
                                QNetworkReply::NoError,
                                IDLE_ANSWER,
                                {{KEY_ENABLED, "1"}, {KEY_INTERVAL, "30"}}},
                      ParseCase{"OtherTypeReadsAsDisabled",
                                QNetworkReply::NoError,
                                idleAnswer("'objtrack'", "'preset'"),
                                {{KEY_ENABLED, "0"}, {KEY_INTERVAL, "30"}}},
                      ParseCase{"TwoDigitFlagIsIgnored",
                                QNetworkReply::NoError,
                                idleAnswer("enable='1'", "enable='12'"),
                                {{KEY_INTERVAL, "30"}}},
                      ParseCase{"EmptyIntervalIsIgnored",
                                QNetworkReply::NoError,
                                idleAnswer("'30'", "''"),
                                {{KEY_ENABLED, "1"}}},
                      ParseCase{"LeadingZerosKept",
                                QNetworkReply::NoError,
                                idleAnswer("'30'", "'0030'"),
                                {{KEY_ENABLED, "1"}, {KEY_INTERVAL, "0030"}}},
                      ParseCase{"TypeWithoutFlag",
                                QNetworkReply::NoError,
                                idleAnswer("camctrl_c0_idleaction_enable='1'\n", ""),
                                {{KEY_INTERVAL, "30"}}},
                      ParseCase{
                          "NoIdleParameters", QNetworkReply::NoError, "camctrl_c0_pan='1'\n", {}},
                      ParseCase{"TransportFailure", QNetworkReply::TimeoutError, "", {}},
                      ParseCase{"TransportFailureStillParsed",
                                QNetworkReply::ContentAccessDenied,
                                IDLE_ANSWER,
                                {{KEY_ENABLED, "1"}, {KEY_INTERVAL, "30"}}}),
    rowName<ParseCase>);

class CameraProxyTrackingTypeTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<ParseCase> {};

TEST_P(CameraProxyTrackingTypeTest, ReadsTheTrackingTypeAndEchoesTheNode) {
    const ParseCase& row = GetParam();
    const auto completion =
        start(Operation::GetTrackingType, proxy, cameraParams({{KEY_NODE_ID, "node-7"}}));

    client->answer(0, row.outcome, row.answer);

    QVariantMap expected = row.expected;
    expected.insert(KEY_NODE_ID, QStringLiteral("node-7"));
    EXPECT_EQ(completion->count, 1);
    EXPECT_EQ(completion->success, row.outcome == QNetworkReply::NoError);
    EXPECT_EQ(completion->result.toMap(), expected);
    expectTextValues(completion->result.toMap());
}

INSTANTIATE_TEST_SUITE_P(
    Answers, CameraProxyTrackingTypeTest,
    ::testing::Values(
        ParseCase{"SmartTracking",
                  QNetworkReply::NoError,
                  "ptztrack_type=smarttracking\r\n",
                  {{KEY_TYPE, "smarttracking"}}},
        ParseCase{
            "KeepsAllAfterTheFirstEquals", QNetworkReply::NoError, "a=b=c \t", {{KEY_TYPE, "b=c"}}},
        ParseCase{"EmptyAnswer", QNetworkReply::NoError, "", {{KEY_TYPE, "autotracking"}}},
        ParseCase{
            "NoEquals", QNetworkReply::NoError, "smarttracking", {{KEY_TYPE, "autotracking"}}},
        ParseCase{"NothingAfterEquals", QNetworkReply::NoError, "type=", {{KEY_TYPE, ""}}},
        ParseCase{"BlankAfterEquals", QNetworkReply::NoError, "type= \n", {{KEY_TYPE, ""}}},
        ParseCase{"TransportFailureStillParsed",
                  QNetworkReply::TimeoutError,
                  "type=smarttracking",
                  {{KEY_TYPE, "smarttracking"}}},
        ParseCase{"TransportFailure",
                  QNetworkReply::HostNotFoundError,
                  "",
                  {{KEY_TYPE, "autotracking"}}}),
    rowName<ParseCase>);

TEST_F(CameraProxyTest, TrackingTypeEchoesTheNodeAsItWasWhenCalled) {
    QVariantMap params = cameraParams({{KEY_NODE_ID, "before"}});
    const auto named = start(Operation::GetTrackingType, proxy, params);
    params.insert(KEY_NODE_ID, QStringLiteral("after"));
    const auto unnamed = start(Operation::GetTrackingType, proxy, cameraParams());

    client->answerAll(QNetworkReply::NoError, "type=autotracking");

    EXPECT_EQ(named->result.toMap().value(KEY_NODE_ID), QStringLiteral("before"));
    ASSERT_TRUE(unnamed->result.toMap().contains(KEY_NODE_ID));
    EXPECT_EQ(unnamed->result.toMap().value(KEY_NODE_ID), QString());
}

// A preset-list answer, how it was delivered, and the names listed.
struct PresetCase {
    std::string name;
    Error outcome;
    QByteArray answer;
    QStringList expected;

    friend void PrintTo(const PresetCase& row, std::ostream* out) { *out << row.name; }
};

class CameraProxyPresetListTest
    : public CameraProxyTest
    , public ::testing::WithParamInterface<PresetCase> {};

TEST_P(CameraProxyPresetListTest, ListsThePresetsWithARule) {
    const PresetCase& row = GetParam();
    const auto completion = start(Operation::GetPresetList, proxy, cameraParams());

    client->answer(0, row.outcome, row.answer);

    EXPECT_EQ(completion->count, 1);
    EXPECT_EQ(completion->success, row.outcome == QNetworkReply::NoError);
    EXPECT_EQ(completion->result.toStringList(), row.expected);
}

INSTANTIATE_TEST_SUITE_P(
    Answers, CameraProxyPresetListTest,
    ::testing::Values(
        PresetCase{"OnlyThoseWithARuleInOrder",
                   QNetworkReply::NoError,
                   R"({"PresetInfo":[{"Name":"A","HasRule":true},{"Name":"B","HasRule":false},
                      {"Name":"C","HasRule":true}],"Other":1})",
                   {"A", "C"}},
        PresetCase{"OneAsNumberAndText",
                   QNetworkReply::NoError,
                   R"({"PresetInfo":[{"Name":"N","HasRule":1},{"Name":"T","HasRule":"1"}]})",
                   {"N", "T"}},
        PresetCase{"ZeroAsTextAndNumberOrMissing",
                   QNetworkReply::NoError,
                   R"({"PresetInfo":[{"Name":"T","HasRule":"0"},{"Name":"N","HasRule":0},
                      {"Name":"M"},{"Name":"F","HasRule":"false"}]})",
                   {}},
        PresetCase{"NoName", QNetworkReply::NoError, R"({"PresetInfo":[{"HasRule":true}]})", {""}},
        PresetCase{"DuplicatesAndNumbersKept",
                   QNetworkReply::NoError,
                   R"({"PresetInfo":[{"Name":"A","HasRule":true},{"Name":7,"HasRule":true},
                      {"Name":"A","HasRule":true}]})",
                   {"A", "7", "A"}},
        PresetCase{"NotJson", QNetworkReply::NoError, "<html>PresetInfo</html>", {}},
        PresetCase{"RootArray", QNetworkReply::NoError, R"([{"Name":"A","HasRule":true}])", {}},
        PresetCase{"PresetInfoNotAnArray",
                   QNetworkReply::NoError,
                   R"({"PresetInfo":{"Name":"A","HasRule":true}})",
                   {}},
        PresetCase{"TransportFailureIgnoresTheBody",
                   QNetworkReply::AuthenticationRequiredError,
                   R"({"PresetInfo":[{"Name":"A","HasRule":true}]})",
                   {}}),
    rowName<PresetCase>);

TEST_F(CameraProxyTest, GotoPresetHandsBackTheAnswerText) {
    const auto moved = start(Operation::GotoPreset, proxy, cameraParams({{KEY_PRESET_NAME, "A"}}));
    const auto failed = start(Operation::GotoPreset, proxy, cameraParams({{KEY_PRESET_NAME, "B"}}));

    client->answer(0, QNetworkReply::NoError, "OK caf\xc3\xa9\n");
    client->answer(1, QNetworkReply::ContentNotFoundError, "no such preset");

    EXPECT_TRUE(moved->success);
    EXPECT_EQ(moved->result.typeId(), QMetaType::QString);
    EXPECT_EQ(moved->result.toString(), QStringLiteral("OK caf\u00e9\n"));
    EXPECT_FALSE(failed->success);
    EXPECT_EQ(failed->result.toString(), QStringLiteral("no such preset"));
}

} // namespace
