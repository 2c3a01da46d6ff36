#include "camera/CameraProxy.h"

#include "AnsweringHttpClient.h"
#include "PluginQuenvarDefs.h"

#include <QDebug>

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <utility>
#include <vector>

namespace {

using Error = QNetworkReply::NetworkError;

// In the order of the operations in start().
enum class Operation {
    GetIdleAction,
    SetIdleAction,
    GetTrackingType,
    SetTrackingType,
    Stop,
    AreaZoom,
    GotoPreset,
    GetPresetList
};

// The whole outcome as one text, so that a test compares it in one go; the result is shown with
// its types, so a number where text belongs shows up.
std::string outcome(int calls, bool success, const QVariant& result = QVariant()) {
    QString text;
    QDebug(&text).nospace() << calls << "x " << success << ' ' << result;
    return text.toStdString();
}

// How often an operation completed, and the last outcome.
struct Completion {
    int calls = 0;
    std::string text = outcome(0, false);
};

std::shared_ptr<Completion> start(Operation operation, ICameraProxy& proxy,
                                  const QVariantMap& params) {
    auto completion = std::make_shared<Completion>();
    // Fits every completion callback: the flag, then nothing, a map, a variant or a list.
    const auto record = [completion](bool ok, const auto&... result) {
        completion->text = outcome(++completion->calls, ok, QVariant(result...));
    };
    const std::function<void()> operations[] = {
        [&] { proxy.getPTZIdleAction(params, record); },
        [&] { proxy.setPTZIdleAction(params, record); },
        [&] { proxy.getPTZTrackingType(params, record); },
        [&] { proxy.setPTZTrackingType(params, record); },
        [&] { proxy.stopPTZMovement(params, record); },
        [&] { proxy.areaZoom(params, record); },
        [&] { proxy.gotoSmartTrackingAdvPreset(params, record); },
        [&] { proxy.getSmartTrackingAdvPresetList(params, record); },
    };
    operations[static_cast<int>(operation)]();
    return completion;
}

// Records every call of the host forms of Get and Post, which are all the proxy uses, as one line
// of all its arguments, and holds its reply callback until the test answers it.
class RecordingHttpClient : public AnsweringHttpClient {
public:
    RecordingHttpClient()
        : AnsweringHttpClient(nullptr) {}
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

    using AnsweringHttpClient::Get;
    using AnsweringHttpClient::Post;
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

    std::vector<HttpReplyCallback> replies;
};

const QString CAMCTRL = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
const QString SETPARAM = QStringLiteral("/cgi-bin/admin/setparam.cgi");
const QString STOP = CAMCTRL + "?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop";
const QByteArray RATIO_ANSWER = "zoom=2\nmaxratio=20\n";
const QByteArray IDLE_ANSWER = "camctrl_c0_idleaction_enable='1'\n"
                               "camctrl_c0_idleaction_type='objtrack'\n"
                               "camctrl_c0_idleaction_interval='30'\n";

QVariantMap cameraParams(const QVariantMap& extra = QVariantMap()) {
    QVariantMap params{{"host", "10.1.2.3"}, {"port", 8443},         {"useSSL", true},
                       {"user", "admin"},    {"pass", "s3cret&x=1"}, {"nodeID", "node-7"}};
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

QByteArray idleAnswer(const QByteArray& from, const QByteArray& to) {
    return QByteArray(IDLE_ANSWER).replace(from, to);
}

QVariantMap tracking(const char* type) {
    return {{"type", QString::fromUtf8(type)}, {"nodeID", "node-7"}};
}

template <typename Row>
class CameraProxyTable : public ::testing::TestWithParam<Row> {
protected:
    CameraProxyTable() { proxy.setHTTPClient(client); }

    std::shared_ptr<RecordingHttpClient> client = std::make_shared<RecordingHttpClient>();
    CameraProxy proxy;
};

template <typename Row>
std::string rowName(const ::testing::TestParamInfo<Row>& info) {
    return info.param.name;
}

struct RequestRow {
    const char* name;
    Operation operation;
    QVariantMap params;
    std::string call;
};

using CameraProxyRequestTest = CameraProxyTable<RequestRow>;

TEST_P(CameraProxyRequestTest, SendsExactlyTheRequestDescribed) {
    const auto completion = start(GetParam().operation, proxy, GetParam().params);
    client->answerAll(QNetworkReply::NoError);

    EXPECT_EQ(client->calls, std::vector<std::string>{GetParam().call});
    EXPECT_EQ(completion->text, outcome(1, true));
}

const RequestRow REQUEST_ROWS[] = {
    {"StopWithoutConnectionParameters", Operation::Stop, {}, get(STOP, ":0 http : 10000")},
    {"PortAsText", Operation::SetTrackingType, cameraParams({{"port", "8080"}}),
     post(CAMCTRL, "ptztrack=setAutoTracking", camera(8080))},
    {"PortHighest", Operation::Stop, cameraParams({{"port", 65535}}), get(STOP, camera(65535))},
    {"SetIdleAction", Operation::SetIdleAction, cameraParams({{"enabled", "1"}, {"interval", 60}}),
     post(SETPARAM, idleForm("1", "60"))},
    {"SetIdleActionWithoutValues", Operation::SetIdleAction, cameraParams(),
     post(SETPARAM, idleForm("", ""))},
    // Latin-1 bytes, each percent-encoded, and a question mark for each UTF-16 unit beyond.
    {"SetIdleActionLatin1Values", Operation::SetIdleAction,
     cameraParams({{"enabled", QString::fromUtf16(u"\u00e9&x=1")},
                   {"interval", QString::fromUtf16(u"6\u00ff0")}}),
     post(SETPARAM, idleForm("%E9%26x%3D1", "6%FF0"))},
    {"SetIdleActionBeyondLatin1", Operation::SetIdleAction,
     cameraParams({{"enabled", QString::fromUtf16(u"\u20ac")},
                   {"interval", QString::fromUtf16(u"\U0001F600")}}),
     post(SETPARAM, idleForm("%3F", "%3F%3F"))},
    {"SetTrackingIsCaseSensitive", Operation::SetTrackingType,
     cameraParams({{"type", "SmartTracking"}}), post(CAMCTRL, "ptztrack=setAutoTracking")},
    {"SetTrackingWithoutType", Operation::SetTrackingType, cameraParams(),
     post(CAMCTRL, "ptztrack=setAutoTracking")},
};

INSTANTIATE_TEST_SUITE_P(Requests, CameraProxyRequestTest, ::testing::ValuesIn(REQUEST_ROWS),
                         rowName<RequestRow>);

struct AnswerRow {
    const char* name;
    Operation operation;
    QByteArray answer;
    QVariant result;
    Error outcome = QNetworkReply::NoError;
};

using CameraProxyAnswerTest = CameraProxyTable<AnswerRow>;

TEST_P(CameraProxyAnswerTest, DeliversWhatTheAnswerHolds) {
    const AnswerRow& row = GetParam();
    QVariantMap params = cameraParams();
    const auto completion = start(row.operation, proxy, params);
    // The node goes back as it was when the operation started.
    params.insert("nodeID", "later");
    client->answer(0, row.outcome, row.answer);

    EXPECT_EQ(completion->text, outcome(1, row.outcome == QNetworkReply::NoError, row.result));
}

const AnswerRow ANSWER_ROWS[] = {
    {"IdleOtherTypeReadsAsDisabled", Operation::GetIdleAction, idleAnswer("'objtrack'", "'x'"),
     QVariantMap{{"enabled", "0"}, {"interval", "30"}}},
    {"IdleTwoDigitFlagIsIgnored", Operation::GetIdleAction, idleAnswer("enable='1'", "enable='12'"),
     QVariantMap{{"interval", "30"}}},
    {"IdleEmptyIntervalIsIgnored", Operation::GetIdleAction, idleAnswer("'30'", "''"),
     QVariantMap{{"enabled", "1"}}},
    {"IdleTypeWithoutFlag", Operation::GetIdleAction,
     idleAnswer("camctrl_c0_idleaction_enable='1'\n", ""), QVariantMap{{"interval", "30"}}},
    {"IdleFailureStillParsed", Operation::GetIdleAction, IDLE_ANSWER,
     QVariantMap{{"enabled", "1"}, {"interval", "30"}}, QNetworkReply::ContentAccessDenied},
    {"TrackingKeepsAllAfterTheFirstEquals", Operation::GetTrackingType, "a=b=c \t",
     tracking("b=c")},
    {"TrackingBlankAfterEquals", Operation::GetTrackingType, "type= \n", tracking("")},
    {"TrackingFailureStillParsed", Operation::GetTrackingType, "type=smarttracking",
     tracking("smarttracking"), QNetworkReply::TimeoutError},
    {"PresetsWithARuleInOrder", Operation::GetPresetList,
     R"({"Other":1,"PresetInfo":[{"Name":"A","HasRule":true},{"Name":"B","HasRule":false},
        {"Name":"C","HasRule":1},{"Name":"D","HasRule":"1"},{"Name":"E","HasRule":"0"},
        {"Name":"F","HasRule":0},{"Name":"G"},{"Name":"H","HasRule":"false"},
        {"Name":"Y","HasRule":"yes"},{"Name":7,"HasRule":true},{"Name":"A","HasRule":true}]})",
     QStringList{"A", "C", "D", "Y", "7", "A"}},
    {"PresetWithoutName", Operation::GetPresetList, R"({"PresetInfo":[{"HasRule":true}]})",
     QStringList{""}},
    {"PresetsNotJson", Operation::GetPresetList, "<html>PresetInfo</html>", QStringList()},
    {"PresetsFailureIgnoresTheBody", Operation::GetPresetList,
     R"({"PresetInfo":[{"Name":"A","HasRule":true}]})", QStringList(),
     QNetworkReply::AuthenticationRequiredError},
    {"GotoPresetAnswerText", Operation::GotoPreset, "OK caf\xc3\xa9\n",
     QString::fromUtf16(u"OK caf\u00e9\n")},
    {"GotoPresetFailureText", Operation::GotoPreset, "no such preset",
     QStringLiteral("no such preset"), QNetworkReply::ContentNotFoundError},
};

INSTANTIATE_TEST_SUITE_P(Answers, CameraProxyAnswerTest, ::testing::ValuesIn(ANSWER_ROWS),
                         rowName<AnswerRow>);

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
        EXPECT_EQ(completion->text, outcome(1, false, row.result)) << "step " << failing;
    }

    // Nothing goes out for a port outside 0..65535, not even to its low 16 bits.
    const std::size_t sent = client->calls.size();
    for (const QVariant& port :
         {QVariant(65536), QVariant(-1), QVariant("-1"), QVariant(qlonglong(65536 + 80)),
          QVariant("18446744073709551615")}) {
        const auto refused = start(row.operation, proxy, cameraParams({{"port", port}}));
        EXPECT_EQ(refused->text, outcome(1, false, row.result)) << qPrintable(port.toString());
    }
    EXPECT_EQ(client->calls.size(), sent);
}

const FailureRow FAILURE_ROWS[] = {
    {"GetIdleAction", Operation::GetIdleAction, QVariantMap()},
    {"SetIdleAction", Operation::SetIdleAction, QVariant()},
    {"GetTrackingType", Operation::GetTrackingType,
     QVariantMap{{"type", "autotracking"}, {"nodeID", "node-7"}}},
    {"SetTrackingType", Operation::SetTrackingType, QVariant()},
    {"Stop", Operation::Stop, QVariant()},
    {"AreaZoom", Operation::AreaZoom, QVariant()},
    {"GotoPreset", Operation::GotoPreset, QString()},
    {"GetPresetList", Operation::GetPresetList, QStringList()},
};

INSTANTIATE_TEST_SUITE_P(AllOperations, CameraProxyFailureTest, ::testing::ValuesIn(FAILURE_ROWS),
                         rowName<FailureRow>);

struct ZoomRow {
    const char* name;
    QByteArray ratioAnswer;
    QVariant zoomRatio;
    QString setRatio;
};

using CameraProxyZoomTest = CameraProxyTable<ZoomRow>;

TEST_P(CameraProxyZoomTest, SetsTheRatioRoundedUpToTenthsAndHeldBelowTheMaximum) {
    // Through a copy released at once, and with the caller's map emptied: what the later steps
    // need must travel with them, and the copy must send through the same client.
    auto copy = std::make_unique<CameraProxy>(proxy);
    QVariantMap params = cameraParams({{"zoomRatio", GetParam().zoomRatio}});
    const auto completion = start(Operation::AreaZoom, *copy, params);
    copy.reset();
    params.clear();

    client->answer(0, QNetworkReply::NoError, GetParam().ratioAnswer);
    client->answerAll(QNetworkReply::NoError);

    ASSERT_EQ(client->calls.size(), 3u);
    EXPECT_EQ(client->calls.back(),
              get(CAMCTRL + "?setptmode=nonblock&setratio=" + GetParam().setRatio));
    EXPECT_EQ(completion->text, outcome(1, true));
}

const ZoomRow ZOOM_ROWS[] = {
    {"RoundsUpToTenths", "zoom=1\nmaxratio=20", 2.34, "2.4"},
    {"ProductJustAboveTenthsRoundsUp", "zoom=1.5\nmaxratio=20", 1.6, "2.5"},
    {"WithinOneOfMaximumBecomesMaximum", "zoom=10\nmaxratio=20", 1.95, "20"},
    {"ExactlyOneBelowMaximumIsKept", "zoom=1\nmaxratio=19.5", 18.5, "18.5"},
    {"MissingMaximumHoldsAtOne", "zoom=2", 1.5, "1"},
    {"MissingFactorGivesZero", RATIO_ANSWER, QVariant(), "0"},
    {"SixSignificantDigits", "zoom=1\nmaxratio=1000000", 123456.7, "123457"},
};

INSTANTIATE_TEST_SUITE_P(Ratios, CameraProxyZoomTest, ::testing::ValuesIn(ZOOM_ROWS),
                         rowName<ZoomRow>);

} // namespace
