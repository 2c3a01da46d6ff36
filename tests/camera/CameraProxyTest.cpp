#include "camera/CameraProxy.h"

#include "Completion.h"
#include "PluginQuenvarDefs.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <utility>
#include <vector>

namespace {

using Error = QNetworkReply::NetworkError;
using ::testing::StartsWith;

// Records every call as one line of all its arguments and holds its reply callback until the test
// answers it. Only the host forms of Get and Post are expected.
class RecordingHttpClient : public ISimpleHTTPClient {
public:
    // Answers what is still pending, as a real client does when it goes.
    ~RecordingHttpClient() override { answerAll(QNetworkReply::OperationCanceledError); }

    void answer(std::size_t index, Error outcome, const QByteArray& body = QByteArray()) {
        ASSERT_TRUE(index < replies.size() && replies[index]) << "no pending call " << index;
        // The callback may make further calls, so it runs from a local copy.
        const HttpReplyCallback reply = std::exchange(replies[index], nullptr);
        reply(outcome, QByteArray(), body, outcome == QNetworkReply::NoError);
    }

    // Answers every pending call, including those that the answers make, in order.
    void answerAll(Error outcome, const QByteArray& body = QByteArray()) {
        for (std::size_t index = 0; index < replies.size(); ++index) {
            if (replies[index])
                answer(index, outcome, body);
        }
    }

    bool Get(const QString& host, const QString& path, quint16 port, bool useSSL,
             const QString& user, const QString& password, HttpReplyCallback callback, uint timeout,
             const QStringList& headers) override {
        return record("GET " + path + " [" + headers.join(',') + "]", host, port, useSSL, user,
                      password, timeout, std::move(callback));
    }
    bool Post(const QString& host, const QByteArray& body, const QString& path, quint16 port,
              bool useSSL, const QString& user, const QString& password, const QString& contentType,
              HttpReplyCallback callback, uint timeout) override {
        return record("POST " + path + ' ' + contentType + ' ' + QString::fromLatin1(body), host,
                      port, useSSL, user, password, timeout, std::move(callback));
    }
    bool Get(const QString&, const QString&, const QString&, HttpReplyCallback, uint) override {
        return unexpected();
    }
    bool Post(const QString&, const QByteArray&, const QString&, const QString&, const QString&,
              HttpReplyCallback, uint, const QStringList&) override {
        return unexpected();
    }
    bool PostWithOAuth(const QString&, const QByteArray&, const QString&, quint16, bool,
                       const QString&, const QString&, const QString&, HttpReplyCallback,
                       uint) override {
        return unexpected();
    }
    bool Delete(const QString&, const QByteArray&, const QString&, quint16, bool, const QString&,
                const QString&, const QString&, HttpReplyCallback, uint) override {
        return unexpected();
    }
    bool Put(const QString&, const QByteArray&, const QString&, quint16, bool, const QString&,
             const QString&, const QString&, HttpReplyCallback, uint) override {
        return unexpected();
    }

    std::vector<std::string> calls;

private:
    bool record(const QString& request, const QString& host, quint16 port, bool useSSL,
                const QString& user, const QString& password, uint timeout,
                HttpReplyCallback callback) {
        calls.push_back((request + ' ' + host + ':' + QString::number(port) +
                         (useSSL ? " https " : " http ") + user + ':' + password + ' ' +
                         QString::number(timeout))
                            .toStdString());
        replies.push_back(std::move(callback));
        return true;
    }

    bool unexpected() {
        ADD_FAILURE() << "only the host forms of Get and Post are expected";
        return false;
    }

    std::vector<HttpReplyCallback> replies;
};

const QString CAMCTRL = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
const QString SETPARAM = QStringLiteral("/cgi-bin/admin/setparam.cgi");
const QString STOP = CAMCTRL + "?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop";
const QByteArray RATIO_ANSWER = "zoom=2\nmaxratio=20\n";

QVariantMap cameraParams(const QVariantMap& extra = QVariantMap()) {
    QVariantMap params{{KEY_HOST, QStringLiteral("10.1.2.3")},
                       {KEY_PORT, 8443},
                       {KEY_USE_SSL, true},
                       {KEY_USER, QStringLiteral("admin")},
                       {KEY_PASS, QStringLiteral("s3cret&x=1")}};
    params.insert(extra);
    return params;
}

// How cameraParams() reach the client, as RecordingHttpClient writes them.
QString camera(int port = 8443) {
    return "10.1.2.3:" + QString::number(port) + " https admin:s3cret&x=1 10000";
}

std::string get(const QString& path, const QString& connection = camera()) {
    return ("GET " + path + " [] " + connection).toStdString();
}

std::string post(const QString& path, const QString& body, const QString& connection = camera()) {
    return ("POST " + path + " application/x-www-form-urlencoded " + body + ' ' + connection)
        .toStdString();
}

QString idleForm(const QString& enabled, const QString& interval) {
    return "camctrl_c0_idleaction_enable=" + enabled +
           "&camctrl_c0_idleaction_type=objtrack&camctrl_c0_idleaction_interval=" + interval;
}

class CameraProxyTest : public ::testing::Test {
protected:
    CameraProxyTest() { proxy.setHTTPClient(client); }

    std::shared_ptr<RecordingHttpClient> client = std::make_shared<RecordingHttpClient>();
    CameraProxy proxy;
};

template <typename Row>
class CameraProxyTable
    : public CameraProxyTest
    , public ::testing::WithParamInterface<Row> {};

template <typename Row>
std::string rowName(const ::testing::TestParamInfo<Row>& info) {
    return info.param.name;
}

// Every call the client received, one line each.
std::string sent(const std::vector<std::string>& calls) {
    std::string text;
    for (const std::string& call : calls)
        text += call + '\n';
    return text;
}

std::string zoom(const QString& center, const QString& ratio) {
    return get(CAMCTRL + "?getratio&getmaxratio") + '\n' + get(CAMCTRL + '?' + center) + '\n' +
           get(CAMCTRL + "?setptmode=nonblock&setratio=" + ratio);
}

struct RequestRow {
    const char* name;
    Operation operation;
    QVariantMap params;
    std::string calls;
};

using CameraProxyRequestTest = CameraProxyTable<RequestRow>;

TEST_P(CameraProxyRequestTest, SendsExactlyTheRequestsDescribed) {
    // Through a copy released at once, and with the caller's map emptied: what the requests need
    // must travel with them, and the copy must send through the same client.
    auto copy = std::make_unique<CameraProxy>(proxy);
    QVariantMap params = GetParam().params;
    const auto completion = start(GetParam().operation, *copy, params);
    copy.reset();
    params.clear();

    client->answerAll(QNetworkReply::NoError, RATIO_ANSWER);

    EXPECT_EQ(sent(client->calls), GetParam().calls + '\n');
    EXPECT_THAT(completion->outcome(), StartsWith("1x true"));
}

INSTANTIATE_TEST_SUITE_P(
    Requests, CameraProxyRequestTest,
    ::testing::Values(
        RequestRow{"Stop", Operation::Stop, cameraParams(), get(STOP)},
        RequestRow{"StopWithoutConnectionParameters", Operation::Stop, QVariantMap(),
                   get(STOP, QStringLiteral(":0 http : 10000"))},
        RequestRow{"PortAsText", Operation::SetTrackingType, cameraParams({{KEY_PORT, "8080"}}),
                   post(CAMCTRL, "ptztrack=setAutoTracking", camera(8080))},
        RequestRow{"PortHighest", Operation::Stop, cameraParams({{KEY_PORT, 65535}}),
                   get(STOP, camera(65535))},
        RequestRow{"PortNotANumberReadsAsZero", Operation::Stop, cameraParams({{KEY_PORT, "abc"}}),
                   get(STOP, camera(0))},
        RequestRow{"GetIdleAction", Operation::GetIdleAction, cameraParams(),
                   get(QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"))},
        RequestRow{"SetIdleAction", Operation::SetIdleAction,
                   cameraParams({{KEY_ENABLED, "1"}, {KEY_INTERVAL, 60}}),
                   post(SETPARAM, idleForm("1", "60"))},
        RequestRow{"SetIdleActionWithoutValues", Operation::SetIdleAction, cameraParams(),
                   post(SETPARAM, idleForm("", ""))},
        RequestRow{"SetIdleActionWithBoolean", Operation::SetIdleAction,
                   cameraParams({{KEY_ENABLED, true}, {KEY_INTERVAL, "30"}}),
                   post(SETPARAM, idleForm("true", "30"))},
        RequestRow{"SetIdleActionValuesStayInsideTheirParameter", Operation::SetIdleAction,
                   cameraParams({{KEY_ENABLED, "1&camctrl_c0_idleaction_type=preset"},
                                 {KEY_INTERVAL, "3 0"}}),
                   post(SETPARAM, idleForm("1%26camctrl_c0_idleaction_type%3Dpreset", "3%200"))},
        RequestRow{"GetTrackingType", Operation::GetTrackingType, cameraParams(),
                   get(CAMCTRL + "?ptztrack=getCurrentType")},
        RequestRow{"SetSmartTracking", Operation::SetTrackingType,
                   cameraParams({{KEY_TYPE, "smarttracking"}}),
                   post(CAMCTRL, "ptztrack=setSmartTracking")},
        RequestRow{"SetTrackingIsCaseSensitive", Operation::SetTrackingType,
                   cameraParams({{KEY_TYPE, "SmartTracking"}}),
                   post(CAMCTRL, "ptztrack=setAutoTracking")},
        RequestRow{"SetTrackingWithoutType", Operation::SetTrackingType, cameraParams(),
                   post(CAMCTRL, "ptztrack=setAutoTracking")},
        RequestRow{"GetPresetList", Operation::GetPresetList, cameraParams(),
                   get(QStringLiteral("/VCA/PTZAdv/PresetWithRule"))},
        RequestRow{"GotoPreset", Operation::GotoPreset, cameraParams({{KEY_PRESET_NAME, "Home"}}),
                   get(CAMCTRL + "?ptztrack=track&name=Home")},
        RequestRow{"GotoPresetNameStaysOneParameter", Operation::GotoPreset,
                   cameraParams({{KEY_PRESET_NAME, "a b&auto=stop"}}),
                   get(CAMCTRL + "?ptztrack=track&name=a%20b%26auto%3Dstop")},
        RequestRow{"GotoPresetNameInUtf8", Operation::GotoPreset,
                   cameraParams({{KEY_PRESET_NAME, QStringLiteral("Caf\u00e9-1_2.3~")}}),
                   get(CAMCTRL + "?ptztrack=track&name=Caf%C3%A9-1_2.3~")},
        RequestRow{"AreaZoom", Operation::AreaZoom,
                   cameraParams({{KEY_ZOOM_CENTER_X, 320},
                                 {KEY_ZOOM_CENTER_Y, 240},
                                 {KEY_VIEW_CELL_WIDTH, 640},
                                 {KEY_VIEW_CELL_HEIGHT, 480},
                                 {KEY_RESOLUTION_WIDTH, "1920"},
                                 {KEY_RESOLUTION_HEIGHT, "1080"},
                                 {KEY_ZOOM_RATIO, 1.5}}),
                   zoom("x=320&y=240&videosize=640x480&resolution=1920x1080&stretch=1", "3")},
        RequestRow{"AreaZoomValuesStayInsideTheirParameter", Operation::AreaZoom,
                   cameraParams({{KEY_ZOOM_CENTER_X, -5},
                                 {KEY_VIEW_CELL_WIDTH, "64=0&stretch=0"},
                                 {KEY_VIEW_CELL_HEIGHT, "%3"},
                                 {KEY_RESOLUTION_WIDTH, 1920},
                                 {KEY_RESOLUTION_HEIGHT, "1080&x=1"}}),
                   zoom("x=-5&y=0&videosize=64%3D0%26stretch%3D0x%253"
                        "&resolution=1920x1080%26x%3D1&stretch=1",
                        "0")}),
    rowName<RequestRow>);

struct FailureRow {
    const char* name;
    Operation operation;
    QVariant result; // what a failure with an empty body delivers
};

using CameraProxyFailureTest = CameraProxyTable<FailureRow>;

TEST_P(CameraProxyFailureTest, FailsOnceAtAnyStepAndOnAnUnaddressablePort) {
    const FailureRow& row = GetParam();
    const std::size_t steps = row.operation == Operation::AreaZoom ? 3 : 1;
    for (std::size_t failing = 0; failing < steps; ++failing) {
        const std::size_t first = client->calls.size();
        const auto completion = start(row.operation, proxy, cameraParams());
        for (std::size_t step = 0; step < failing; ++step)
            client->answer(first + step, QNetworkReply::NoError, RATIO_ANSWER);
        client->answer(first + failing, QNetworkReply::TimeoutError);

        EXPECT_EQ(client->calls.size(), first + failing + 1) << "step " << failing;
        EXPECT_EQ(completion->outcome(), outcome(1, false, row.result)) << "step " << failing;
    }

    // Nothing goes out for a port outside 0..65535, not even to its low 16 bits.
    const std::size_t sent = client->calls.size();
    for (const QVariant& port :
         {QVariant(65536), QVariant(-1), QVariant("-1"), QVariant(qlonglong(65536 + 80)),
          QVariant("18446744073709551615")}) {
        const auto refused = start(row.operation, proxy, cameraParams({{KEY_PORT, port}}));
        EXPECT_EQ(refused->outcome(), outcome(1, false, row.result)) << qPrintable(port.toString());
    }
    EXPECT_EQ(client->calls.size(), sent);
}

INSTANTIATE_TEST_SUITE_P(
    AllOperations, CameraProxyFailureTest,
    ::testing::Values(FailureRow{"GetIdleAction", Operation::GetIdleAction, QVariantMap()},
                      FailureRow{"SetIdleAction", Operation::SetIdleAction, QVariant()},
                      FailureRow{"GetTrackingType", Operation::GetTrackingType,
                                 QVariantMap{{KEY_TYPE, "autotracking"}, {KEY_NODE_ID, QString()}}},
                      FailureRow{"SetTrackingType", Operation::SetTrackingType, QVariant()},
                      FailureRow{"Stop", Operation::Stop, QVariant()},
                      FailureRow{"AreaZoom", Operation::AreaZoom, QVariant()},
                      FailureRow{"GotoPreset", Operation::GotoPreset, QString()},
                      FailureRow{"GetPresetList", Operation::GetPresetList, QStringList()}),
    rowName<FailureRow>);

// Copies made by construction share the client too: see SendsExactlyTheRequestsDescribed.
TEST_F(CameraProxyTest, AssignmentAndSetHttpClientShareTheNewClientAndReleaseTheOld) {
    CameraProxy assigned;
    auto own = std::make_shared<RecordingHttpClient>();
    const std::weak_ptr<RecordingHttpClient> ownBefore = own;
    assigned.setHTTPClient(std::move(own));
    assigned = proxy;
    EXPECT_TRUE(ownBefore.expired());
    start(Operation::Stop, assigned, cameraParams());
    EXPECT_EQ(client->calls.size(), 1u);

    const std::weak_ptr<RecordingHttpClient> shared = client;
    auto replacement = std::make_shared<RecordingHttpClient>();
    proxy.setHTTPClient(replacement);
    assigned.setHTTPClient(replacement);
    client.reset();
    EXPECT_TRUE(shared.expired());
    start(Operation::Stop, assigned, cameraParams());
    EXPECT_EQ(replacement->calls, std::vector<std::string>{get(STOP)});
}

// Releasing the proxy that alone holds its client releases the client, which cancels the zoom.
TEST_F(CameraProxyTest, ReleasingTheOnlyOwnerEndsAZoomInFlightOnce) {
    auto own = std::make_shared<RecordingHttpClient>();
    const std::weak_ptr<RecordingHttpClient> watched = own;
    auto alone = std::make_unique<CameraProxy>(proxy);
    alone->setHTTPClient(std::move(own));
    const auto completion = start(Operation::AreaZoom, *alone, cameraParams());

    alone.reset();

    EXPECT_TRUE(watched.expired());
    EXPECT_EQ(completion->outcome(), outcome(1, false));
}

struct ZoomRow {
    const char* name;
    QByteArray ratioAnswer;
    QVariant zoomRatio;
    QString setRatio;
};

using CameraProxyZoomTest = CameraProxyTable<ZoomRow>;

TEST_P(CameraProxyZoomTest, SetsTheRatioRoundedUpToTenthsAndHeldBelowTheMaximum) {
    const auto completion =
        start(Operation::AreaZoom, proxy, cameraParams({{KEY_ZOOM_RATIO, GetParam().zoomRatio}}));

    client->answer(0, QNetworkReply::NoError, GetParam().ratioAnswer);
    client->answerAll(QNetworkReply::NoError);

    EXPECT_EQ(client->calls.back(),
              get(CAMCTRL + "?setptmode=nonblock&setratio=" + GetParam().setRatio));
    EXPECT_EQ(completion->outcome(), outcome(1, true));
}

INSTANTIATE_TEST_SUITE_P(
    Ratios, CameraProxyZoomTest,
    ::testing::Values(
        ZoomRow{"RoundsUpToTenths", "zoom=1\nmaxratio=20", 2.34, "2.4"},
        ZoomRow{"ProductJustAboveTenthsRoundsUp", "zoom=1.5\nmaxratio=20", 1.6, "2.5"},
        ZoomRow{"WithinOneOfMaximumBecomesMaximum", "zoom=10\nmaxratio=20", 1.95, "20"},
        ZoomRow{"ExactlyOneBelowMaximumIsKept", "zoom=1\nmaxratio=19.5", 18.5, "18.5"},
        ZoomRow{"ZoomsOut", "zoom=4\nmaxratio=20", 0.5, "2"},
        ZoomRow{"MissingMaximumHoldsAtOne", "zoom=2", 1.5, "1"},
        ZoomRow{"NegativeZoomReadsAsOne", "zoom=-3\nmaxratio=20", 2, "2"},
        ZoomRow{"FactorAsText", RATIO_ANSWER, "1.5", "3"},
        ZoomRow{"MissingFactorGivesZero", RATIO_ANSWER, QVariant(), "0"},
        ZoomRow{"SixSignificantDigits", "zoom=1\nmaxratio=1000000", 123456.7, "123457"}),
    rowName<ZoomRow>);

struct AnswerRow {
    const char* name;
    Operation operation;
    Error outcome;
    QByteArray answer;
    QVariant result;
};

using CameraProxyAnswerTest = CameraProxyTable<AnswerRow>;

TEST_P(CameraProxyAnswerTest, DeliversWhatTheAnswerHolds) {
    const AnswerRow& row = GetParam();
    QVariantMap params = cameraParams({{KEY_NODE_ID, "node-7"}});
    const auto completion = start(row.operation, proxy, params);
    // The node goes back as it was when the operation started.
    params.insert(KEY_NODE_ID, QStringLiteral("later"));

    client->answer(0, row.outcome, row.answer);

    EXPECT_EQ(completion->outcome(), outcome(1, row.outcome == QNetworkReply::NoError, row.result));
}

const QByteArray IDLE_ANSWER = "camctrl_c0_idleaction_enable='1'\n"
                               "camctrl_c0_idleaction_type='objtrack'\n"
                               "camctrl_c0_idleaction_interval='30'\n";

QByteArray idleAnswer(const QByteArray& from, const QByteArray& to) {
    return QByteArray(IDLE_ANSWER).replace(from, to);
}

QVariantMap tracking(const char* type) {
    return {{KEY_TYPE, QString::fromUtf8(type)}, {KEY_NODE_ID, QStringLiteral("node-7")}};
}

INSTANTIATE_TEST_SUITE_P(
    Answers, CameraProxyAnswerTest,
    ::testing::Values(
        AnswerRow{"IdleObjectTracking", Operation::GetIdleAction, QNetworkReply::NoError,
                  IDLE_ANSWER, QVariantMap{{KEY_ENABLED, "1"}, {KEY_INTERVAL, "30"}}},
        AnswerRow{"IdleOtherTypeReadsAsDisabled", Operation::GetIdleAction, QNetworkReply::NoError,
                  idleAnswer("'objtrack'", "'preset'"),
                  QVariantMap{{KEY_ENABLED, "0"}, {KEY_INTERVAL, "30"}}},
        AnswerRow{"IdleTwoDigitFlagIsIgnored", Operation::GetIdleAction, QNetworkReply::NoError,
                  idleAnswer("enable='1'", "enable='12'"), QVariantMap{{KEY_INTERVAL, "30"}}},
        AnswerRow{"IdleEmptyIntervalIsIgnored", Operation::GetIdleAction, QNetworkReply::NoError,
                  idleAnswer("'30'", "''"), QVariantMap{{KEY_ENABLED, "1"}}},
        AnswerRow{"IdleTypeWithoutFlag", Operation::GetIdleAction, QNetworkReply::NoError,
                  idleAnswer("camctrl_c0_idleaction_enable='1'\n", ""),
                  QVariantMap{{KEY_INTERVAL, "30"}}},
        AnswerRow{"IdleNothingToRead", Operation::GetIdleAction, QNetworkReply::NoError,
                  "camctrl_c0_pan='1'\n", QVariantMap()},
        AnswerRow{"IdleFailureStillParsed", Operation::GetIdleAction,
                  QNetworkReply::ContentAccessDenied, IDLE_ANSWER,
                  QVariantMap{{KEY_ENABLED, "1"}, {KEY_INTERVAL, "30"}}},
        AnswerRow{"TrackingSmart", Operation::GetTrackingType, QNetworkReply::NoError,
                  "ptztrack_type=smarttracking\r\n", tracking("smarttracking")},
        AnswerRow{"TrackingKeepsAllAfterTheFirstEquals", Operation::GetTrackingType,
                  QNetworkReply::NoError, "a=b=c \t", tracking("b=c")},
        AnswerRow{"TrackingWithoutEquals", Operation::GetTrackingType, QNetworkReply::NoError,
                  "smarttracking", tracking("autotracking")},
        AnswerRow{"TrackingBlankAfterEquals", Operation::GetTrackingType, QNetworkReply::NoError,
                  "type= \n", tracking("")},
        AnswerRow{"TrackingFailureStillParsed", Operation::GetTrackingType,
                  QNetworkReply::TimeoutError, "type=smarttracking", tracking("smarttracking")},
        AnswerRow{"PresetsWithARuleInOrder", Operation::GetPresetList, QNetworkReply::NoError,
                  R"({"Other":1,"PresetInfo":[{"Name":"A","HasRule":true},
                      {"Name":"B","HasRule":false},{"Name":"C","HasRule":1},
                      {"Name":"D","HasRule":"1"},{"Name":"E","HasRule":"0"},
                      {"Name":"F","HasRule":0},{"Name":"G"},{"Name":"H","HasRule":"false"},
                      {"Name":"Y","HasRule":"yes"},
                      {"Name":7,"HasRule":true},{"Name":"A","HasRule":true}]})",
                  QStringList{"A", "C", "D", "Y", "7", "A"}},
        AnswerRow{"PresetWithoutName", Operation::GetPresetList, QNetworkReply::NoError,
                  R"({"PresetInfo":[{"HasRule":true}]})", QStringList{""}},
        AnswerRow{"PresetsNotJson", Operation::GetPresetList, QNetworkReply::NoError,
                  "<html>PresetInfo</html>", QStringList()},
        AnswerRow{"PresetsInARootArray", Operation::GetPresetList, QNetworkReply::NoError,
                  R"([{"Name":"A","HasRule":true}])", QStringList()},
        AnswerRow{"PresetsFailureIgnoresTheBody", Operation::GetPresetList,
                  QNetworkReply::AuthenticationRequiredError,
                  R"({"PresetInfo":[{"Name":"A","HasRule":true}]})", QStringList()},
        AnswerRow{"GotoPresetAnswerText", Operation::GotoPreset, QNetworkReply::NoError,
                  "OK caf\xc3\xa9\n", QStringLiteral("OK caf\u00e9\n")},
        AnswerRow{"GotoPresetFailureText", Operation::GotoPreset,
                  QNetworkReply::ContentNotFoundError, "no such preset",
                  QStringLiteral("no such preset")}),
    rowName<AnswerRow>);

} // namespace
