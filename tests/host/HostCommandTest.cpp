#include "BuildPaths.h"
#include "ListeningProcess.h"

#include <QDir>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QTemporaryDir>

#include <gtest/gtest.h>
#include <httplib.h>

#include <csignal>
#include <tuple>

namespace {

const char CAMERA_USER[] = "operator";
const char CAMERA_PASS[] = "s3cret pass";

enum class Front { Request, Serve };

// One client command, its parameters ("CAMERA" stands for the camera's connection members), the
// payload it is answered with, and what it leaves in the simulated camera's state.
struct CommandCase {
    const char* command;
    const char* params;
    const char* payload;    // the whole payload as JSON
    const char* stateKey;   // or nullptr
    const char* stateValue; // JSON
    const char* vcaRequest; // the line the simulated VCA plugin logged, or nullptr
};

const CommandCase COMMANDS[] = {
    {"retrieveVcaRawRuleInfo", R"("cam1")",
     R"({"camID":"cam1","isJSON":true,"relayPath":"2F4484ECD91046658F567F2B3B0FDAFD",)"
     R"("rules":"{\"Intrusion\":{\"Front door\":{\"sensitivity\":80}}}"})",
     nullptr, nullptr, "GetVCARules\t<GetVCARules><Cam>cam1</Cam></GetVCARules>"},
    {"getRecordingVCARule", R"({"locationIDs":["loc-1","loc-2"],"timestamp":1700000000})",
     R"({"loc-1":{"analysisEngine":"{}","isJSON":true,"projection":"{\"fov\":90}",)"
     R"("vcaRules":"{\"Intrusion\":{\"Front door\":{}}}"},)"
     R"("loc-2":{"analysisEngine":"{}","isJSON":true,"projection":"{}","vcaRules":""}})",
     nullptr, nullptr,
     "GetRecordingVCARules\t<GetRecordingVCARules><QueryTime>1700000000</QueryTime>"
     "<Loc>loc-1</Loc><Loc>loc-2</Loc></GetRecordingVCARules>"},
    {"retrievePTZIdleAction", "{CAMERA}", R"({"enabled":"0","interval":"30"})", nullptr, nullptr,
     nullptr},
    {"setPTZIdleAction", R"({CAMERA,"enabled":1,"interval":45})", "null", "idleInterval", R"("45")",
     nullptr},
    {"retrievePTZTrackingType", R"({CAMERA,"nodeID":"node-7"})",
     R"({"nodeID":"node-7","type":"autotracking"})", nullptr, nullptr, nullptr},
    {"setPTZTrackingType", R"({CAMERA,"type":"smarttracking"})", "null", "trackingType",
     R"("smarttracking")", nullptr},
    {"stopPTZMovement", "{CAMERA}", "null", "stopCount", "1", nullptr},
    {"areaZoom",
     R"({CAMERA,"zoomCenterX":480,"zoomCenterY":270,"viewCellWidth":960,"viewCellHeight":540,)"
     R"("resolutionWidth":1920,"resolutionHeight":1080,"zoomRatio":2.5})",
     "null", "zoom", "2.5", nullptr},
    {"gotoSmartTrackingAdvPreset", R"({CAMERA,"presetName":"Entrance"})",
     R"("ptztrack_track='Entrance'\r\n")", "lastPreset", R"("Entrance")", nullptr},
    {"getSmartTrackingAdvPresetList", "{CAMERA}", R"(["Entrance","Parking Lot"])", nullptr, nullptr,
     nullptr},
};

void PrintTo(const CommandCase& command, std::ostream* out) {
    *out << command.command;
}

void PrintTo(Front front, std::ostream* out) {
    *out << (front == Front::Request ? "request" : "serve");
}

bool writeFile(const QString& path, const QByteArray& content) {
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    return file.open(QIODevice::WriteOnly) && file.write(content) == content.size();
}

// Any JSON value as compact text, for comparisons that print readably.
std::string compact(const QJsonValue& value) {
    const QByteArray text = QJsonDocument(QJsonArray{value}).toJson(QJsonDocument::Compact);
    return text.mid(1, text.size() - 2).toStdString();
}

std::string compact(const char* json) {
    return compact(QJsonDocument::fromJson(QByteArray("[") + json + "]").array().first());
}

QJsonObject getJson(quint16 port, const char* path) {
    httplib::Client client("127.0.0.1", port);
    const httplib::Result result = client.Get(path);
    return result ? QJsonDocument::fromJson(QByteArray::fromStdString(result->body)).object()
                  : QJsonObject();
}

} // namespace

// Every command through quenvar-host, to the simulated camera (Digest authentication) and the
// simulated VCA plugin, over the command line and over HTTP.
class HostCommandTest : public ::testing::TestWithParam<std::tuple<CommandCase, Front>> {
protected:
    static void SetUpTestSuite() { std::signal(SIGPIPE, SIG_IGN); }

    void SetUp() override {
        const QDir vcaDir(vca.path());
        ASSERT_TRUE(writeFile(vcaDir.filePath("live/cam1.xml"),
                              "<GetVCARulesRes><Camera><CamName>cam1</CamName>"
                              "<Rules Format=\"json\"><Rule Type=\"Intrusion\" "
                              "Name=\"Front%20door\">{\"sensitivity\":80}</Rule></Rules>"
                              "</Camera></GetVCARulesRes>"));
        ASSERT_TRUE(writeFile(vcaDir.filePath("recording/1700000000.xml"),
                              "<GetRecordingVCARulesRes><Location><LocName>loc-1</LocName>"
                              "<JsonRules>{\"Intrusion\":{\"Front%20door\":{}}}</JsonRules>"
                              "<Projection>%7B%22fov%22%3A90%7D</Projection></Location>"
                              "<Location><LocName>loc-2</LocName><JsonRules/></Location>"
                              "</GetRecordingVCARulesRes>"));
        ASSERT_TRUE(camera.start(BuildPaths::bin("quenvar-camsim"),
                                 {"--listen", "127.0.0.1:0", "--auth", "digest", "--user",
                                  CAMERA_USER, "--pass", CAMERA_PASS}))
            << qPrintable(camera.errorOutput());
        if (front() == Front::Serve) {
            ASSERT_TRUE(serve.start(BuildPaths::bin("quenvar-host"),
                                    {"serve", "--listen", "127.0.0.1:0", "--vca-dir", vca.path()}))
                << qPrintable(serve.errorOutput());
        }
    }

    static Front front() { return std::get<1>(GetParam()); }
    static const CommandCase& command() { return std::get<0>(GetParam()); }

    QByteArray params() const {
        const QByteArray connection = QStringLiteral(R"("host":"127.0.0.1","port":%1,"user":"%2",)"
                                                     R"("pass":"%3","useSSL":false)")
                                          .arg(camera.port())
                                          .arg(CAMERA_USER, CAMERA_PASS)
                                          .toUtf8();
        return QByteArray(command().params).replace("CAMERA", connection);
    }

    // The answer as the front printed or sent it; empty when there was none.
    QJsonObject send(QString* diagnostics) {
        if (front() == Front::Request) {
            QProcess host;
            host.start(BuildPaths::bin("quenvar-host"),
                       {"request", "--vca-dir", vca.path(), "--timeout-ms", "20000",
                        command().command, QString::fromUtf8(params())});
            if (!host.waitForFinished(60000))
                return {};
            *diagnostics = QStringLiteral("exit %1: %2")
                               .arg(host.exitCode())
                               .arg(QString::fromUtf8(host.readAllStandardError()));
            const QByteArray output = host.readAllStandardOutput();
            EXPECT_EQ(output.count('\n'), 1) << output.constData();
            return host.exitCode() == 0 ? QJsonDocument::fromJson(output).object() : QJsonObject();
        }
        httplib::Client client("127.0.0.1", serve.port());
        client.set_read_timeout(60, 0);
        const QByteArray body =
            "{\"command\":\"" + QByteArray(command().command) + "\",\"params\":" + params() + "}";
        const httplib::Result result =
            client.Post("/api/request", body.toStdString(), "application/json");
        if (!result)
            return {};
        *diagnostics = QStringLiteral("HTTP %1: %2")
                           .arg(result->status)
                           .arg(QString::fromStdString(result->body));
        return result->status == 200
                   ? QJsonDocument::fromJson(QByteArray::fromStdString(result->body)).object()
                   : QJsonObject();
    }

    QTemporaryDir vca;
    ListeningProcess camera;
    ListeningProcess serve;
};

TEST_P(HostCommandTest, IsAnsweredAsExpected) {
    QString diagnostics;
    const QJsonObject answer = send(&diagnostics);
    ASSERT_FALSE(answer.isEmpty()) << qPrintable(diagnostics);
    EXPECT_EQ(compact(answer.value("handled")), "true");
    EXPECT_EQ(compact(answer.value("code")), "\"0\"");
    EXPECT_EQ(compact(answer.value("message")), "\"\"");
    EXPECT_EQ(compact(answer.value("payload")), compact(command().payload));
    if (command().stateKey) {
        EXPECT_EQ(compact(getJson(camera.port(), "/_sim/state").value(command().stateKey)),
                  compact(command().stateValue));
    }
    QFile vcaLog(QDir(vca.path()).filePath("requests.log"));
    const QByteArray logged = vcaLog.open(QIODevice::ReadOnly) ? vcaLog.readAll() : QByteArray();
    EXPECT_EQ(logged.toStdString(),
              command().vcaRequest ? std::string(command().vcaRequest) + "\n" : std::string());
}

INSTANTIATE_TEST_SUITE_P(Commands, HostCommandTest,
                         ::testing::Combine(::testing::ValuesIn(COMMANDS),
                                            ::testing::Values(Front::Request, Front::Serve)),
                         [](const ::testing::TestParamInfo<std::tuple<CommandCase, Front>>& info) {
                             return std::string(std::get<0>(info.param).command) +
                                    (std::get<1>(info.param) == Front::Request ? "_request"
                                                                               : "_serve");
                         });
