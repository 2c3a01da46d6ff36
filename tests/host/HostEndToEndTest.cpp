#include "BuildPaths.h"
#include "CamsimProcess.h"
#include "EventLoopWait.h"
#include "ServedHost.h"

#include <QDir>
#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QRegularExpression>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <memory>
#include <vector>

namespace {

const QString QUENVAR_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const QString VCA_ID = QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD");
const int WAIT_MS = 20000;
// What the front allows (HttpFront.h).
const size_t MAX_EVENT_STREAMS = 256;
const QString EMPTY_XML_RULES =
    QStringLiteral("<?xml version='1.0' encoding='UTF-8'?><Rules></Rules>");

struct HostRun {
    int exitCode = -1;
    QByteArray output;
    QString errors;
};

HostRun runHost(const QStringList& arguments) {
    QProcess process;
    process.start(BuildPaths::bin("quenvar-host"), arguments);
    HostRun run;
    if (process.waitForFinished(60000) && process.exitStatus() == QProcess::NormalExit)
        run.exitCode = process.exitCode();
    run.output = process.readAllStandardOutput();
    run.errors = QString::fromUtf8(process.readAllStandardError());
    return run;
}

// JSON text in one canonical form (compact, keys sorted), so that answers compare as text.
QString canonical(const QByteArray& json) {
    const QJsonDocument document = QJsonDocument::fromJson(json);
    return document.isNull() ? QString::fromUtf8(json.trimmed())
                             : QString::fromUtf8(document.toJson(QJsonDocument::Compact));
}

bool writeFile(const QString& path, const QByteArray& content) {
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    return file.open(QIODevice::WriteOnly | QIODevice::Truncate) &&
           file.write(content) == content.size();
}

QByteArray liveRules(const QByteArray& camera, const QByteArray& ruleText) {
    return "<GetVCARulesRes><Camera><CamName>" + camera +
           "</CamName><Rules Format=\"json\"><Rule Type=\"Intrusion\" Name=\"Front%20door\">" +
           ruleText + "</Rule></Rules></Camera></GetVCARulesRes>";
}

// The payload of a live rule answer.
QByteArray livePayload(const QString& camId, bool isJson, const QString& rules,
                       const QString& relayPath = VCA_ID) {
    const QJsonObject payload{
        {"camID", camId}, {"isJSON", isJson}, {"relayPath", relayPath}, {"rules", rules}};
    return QJsonDocument(payload).toJson(QJsonDocument::Compact);
}

QByteArray liveRequestLine(const QByteArray& camera) {
    return "GetVCARules\t<GetVCARules><Cam>" + camera + "</Cam></GetVCARules>";
}

// The first group of each match of pattern in text, one line each.
QStringList captured(const QString& pattern, const QString& text) {
    QStringList found;
    QRegularExpressionMatchIterator matches =
        QRegularExpression(pattern, QRegularExpression::MultilineOption).globalMatch(text);
    while (matches.hasNext())
        found << matches.next().captured(1);
    return found;
}

// Each event of a stream as its name and its data, without the data's time stamp, which must be
// set.
QStringList eventsOf(EventStream& stream) {
    QStringList events;
    for (const QString& event : captured("\n(event: .*\ndata: .*)$", stream.read())) {
        QJsonObject data = QJsonDocument::fromJson(event.section("\ndata: ", 1).toUtf8()).object();
        EXPECT_GT(data.take("timestamp").toDouble(), 0);
        events << event.section('\n', 0, 0).mid(7) + " " +
                      QJsonDocument(data).toJson(QJsonDocument::Compact);
    }
    return events;
}

std::string lines(const QStringList& list) {
    return list.join('\n').toStdString();
}

class HostEndToEndTest : public ::testing::Test {
protected:
    QString vcaPath(const QString& name) const { return QDir(vca.path()).filePath(name); }
    bool startServe(const QStringList& extra = {}) {
        return serve.serve(QStringList{"--vca-dir", vca.path()} + extra);
    }

    QTemporaryDir vca;
    ServedHost serve;
};

// Rule commands and camera commands through quenvar-host to the simulated camera (Digest
// authentication) and the simulated VCA plugin, over the command line and over HTTP.
TEST_F(HostEndToEndTest, AnswersOverBothFronts) {
    ASSERT_TRUE(writeFile(vcaPath("live/cam1.xml"), liveRules("cam1", "{\"sensitivity\":80}")));
    ASSERT_TRUE(writeFile(vcaPath("live/cam2.xml"), liveRules("cam2", "{}")));
    ASSERT_TRUE(writeFile(vcaPath("live/cam2.status"), "80000001"));
    ASSERT_TRUE(writeFile(vcaPath("recording/1700000000.xml"),
                          "<GetRecordingVCARulesRes><Location><LocName>loc-1</LocName>"
                          "<JsonRules>{\"Intrusion\":{\"Front%20door\":{}}}</JsonRules>"
                          "<Projection>%7B%22fov%22%3A90%7D</Projection></Location>"
                          "<Location><LocName>loc-2</LocName><JsonRules/></Location>"
                          "</GetRecordingVCARulesRes>"));
    const CamsimProcess camera({"--auth", "digest", "--user", "operator", "--pass", "s3cret pass"});
    ASSERT_NE(camera.port(), 0) << qPrintable(camera.error());
    ASSERT_TRUE(startServe()) << qPrintable(serve.errorOutput());
    const QByteArray connection = QStringLiteral(R"("host":"127.0.0.1","port":%1,)"
                                                 R"("user":"operator","pass":"s3cret pass")")
                                      .arg(camera.port())
                                      .toUtf8();

    const QByteArray cam1 =
        livePayload("cam1", true, R"({"Intrusion":{"Front door":{"sensitivity":80}}})");
    const QByteArray cam2 = livePayload("cam2", true, R"({"Intrusion":{"Front door":{}}})");
    const QByteArray noRules = livePayload("", false, EMPTY_XML_RULES);
    const struct {
        QByteArray command;
        QByteArray params;
        QByteArray code;
        QByteArray payload; // empty: nothing answers
        QByteArray vcaRequest = {};
    } rows[] = {
        {"retrieveVcaRawRuleInfo", R"("cam1")", "0", cam1, liveRequestLine("cam1")},
        // A failure status of the VCA plugin, and a camera it has no rules for.
        {"retrieveVcaRawRuleInfo", R"("cam2")", "-1", cam2, liveRequestLine("cam2")},
        {"retrieveVcaRawRuleInfo", R"("cam9")", "-1", noRules, liveRequestLine("cam9")},
        // Names that would leave the folder; the log escapes line breaks and backslashes.
        {"retrieveVcaRawRuleInfo", R"("../recording/1700000000")", "-1", noRules,
         liveRequestLine("../recording/1700000000")},
        {"retrieveVcaRawRuleInfo", R"("x\n\\y")", "-1", noRules, liveRequestLine(R"(x\n\\y)")},
        {"getRecordingVCARule", R"({"locationIDs":["loc-1","loc-2"],"timestamp":1700000000})", "0",
         R"({"loc-1":{"analysisEngine":"{}","isJSON":true,"projection":"{\"fov\":90}",)"
         R"("vcaRules":"{\"Intrusion\":{\"Front door\":{}}}"},)"
         R"("loc-2":{"analysisEngine":"{}","isJSON":true,"projection":"{}","vcaRules":""}})",
         "GetRecordingVCARules\t<GetRecordingVCARules><QueryTime>1700000000</QueryTime>"
         "<Loc>loc-1</Loc><Loc>loc-2</Loc></GetRecordingVCARules>"},
        {"setPTZIdleAction", R"({CAMERA,"enabled":1,"interval":45})", "0", "null"},
        {"retrievePTZIdleAction", "{CAMERA}", "0", R"({"enabled":"1","interval":"45"})"},
        {"retrievePTZTrackingType", R"({CAMERA,"nodeID":"node-7"})", "0",
         R"({"nodeID":"node-7","type":"autotracking"})"},
        {"setPTZTrackingType", R"({CAMERA,"type":"smarttracking"})", "0", "null"},
        {"areaZoom",
         R"({CAMERA,"zoomCenterX":320,"zoomCenterY":240,"viewCellWidth":640,"viewCellHeight":480,)"
         R"("resolutionWidth":1920,"resolutionHeight":1080,"zoomRatio":1.6})",
         "0", "null"},
        {"stopPTZMovement", "{CAMERA}", "0", "null"},
        {"gotoSmartTrackingAdvPreset", R"({CAMERA,"presetName":"Entrance"})", "0",
         R"("ptztrack_track='Entrance'\r\n")"},
        {"getSmartTrackingAdvPresetList", "{CAMERA}", "0", R"(["Entrance","Parking Lot"])"},
        {"GetVCARules", "{}", {}, {}},
    };

    QStringList answers;
    QStringList expected;
    QByteArray vcaLog;
    for (const auto& row : rows) {
        const QByteArray params = QByteArray(row.params).replace("CAMERA", connection);
        // Past runHost's patience: a request nothing can answer any more must end at once.
        const HostRun run = runHost(
            {"request", "--vca-dir", vca.path(), "--timeout-ms", "600000", row.command, params});
        answers << row.command + " request " + QString::number(run.exitCode) + " " +
                       canonical(run.output);
        const ServedHost::Reply reply =
            serve.post({"{\"command\":\"" + row.command + "\",\"params\":" + params + "}"})[0];
        answers << row.command + " serve " + QString::number(reply.status) + " " +
                       canonical(reply.body);

        const QString answer =
            row.payload.isEmpty()
                ? QStringLiteral("{\"answered\":false}")
                : canonical("{\"handled\":true,\"code\":\"" + row.code +
                            "\",\"message\":\"\",\"payload\":" + row.payload + "}");
        expected << row.command + " request " + (row.payload.isEmpty() ? "3 " : "0 ") + answer
                 << row.command + " serve " + (row.payload.isEmpty() ? "504 " : "200 ") + answer;
        if (!row.vcaRequest.isEmpty())
            vcaLog += row.vcaRequest + '\n' + row.vcaRequest + '\n';
    }
    EXPECT_EQ(lines(answers), lines(expected));

    QFile logged(vcaPath("requests.log"));
    ASSERT_TRUE(logged.open(QIODevice::ReadOnly));
    EXPECT_EQ(logged.readAll().toStdString(), vcaLog.toStdString());
    // The set commands of both fronts reached the camera; the second zoom multiplied the first.
    EXPECT_EQ(
        camera.state(),
        R"({"center":{"resolution":"1920x1080","videosize":"640x480","x":320,"y":240},)"
        R"("idleEnable":"1","idleInterval":"45","idleType":"objtrack","lastPreset":"Entrance",)"
        R"("maxratio":20,"stopCount":2,"trackingType":"smarttracking","zoom":2.6})");
}

// The plugin list, and events to a full set of streams beside requests.
TEST_F(HostEndToEndTest, ServesPluginsAndEventsToAFullSetOfStreams) {
    ASSERT_TRUE(writeFile(vcaPath("live/cam1.xml"), liveRules("cam1", "{\"sensitivity\":80}")));
    ASSERT_TRUE(startServe({"--verbose"})) << qPrintable(serve.errorOutput());
    const ServedHost::Reply plugins = serve.get("/api/plugins");
    EXPECT_EQ(plugins.status, 200);
    const QByteArray entries =
        R"([{"IID":"com.MERIDOX.PluginServer.PluginInterface","className":"PluginQuenvar",)"
        R"("file":"libPluginQuenvar.so","metaData":{"PluginID":"QUENVAR"},"pluginId":"QUENVAR"},)"
        R"({"IID":"com.MERIDOX.PluginServer.PluginInterface","className":"PluginVcaSim",)"
        R"("file":"libPluginVcaSim.so","metaData":{"Commands":["GetVCARules",)"
        R"("GetRecordingVCARules"],"PluginID":"VCA"},"pluginId":"VCA"}])";
    EXPECT_EQ(canonical(plugins.body).toStdString(),
              canonical(QByteArray(entries)
                            .replace("QUENVAR", QUENVAR_ID.toUtf8())
                            .replace("VCA\"", VCA_ID.toUtf8() + '"'))
                  .toStdString());

    // C leaves before the changes, and so does one of B's two streams; eight more subscribers fill
    // the front's 256 streams, more than a thread per stream would allow.
    std::vector<std::unique_ptr<EventStream>> streams;
    for (const char* id : {"A", "A", "B", "B", "C"})
        streams.push_back(std::make_unique<EventStream>(serve, id));
    while (streams.size() < MAX_EVENT_STREAMS)
        streams.push_back(
            std::make_unique<EventStream>(serve, "S" + QByteArray::number(streams.size() % 8)));
    // How many streams have received text at least times times.
    const auto reading = [&streams](const char* text, int times) {
        return static_cast<size_t>(std::count_if(streams.begin(), streams.end(), [&](auto& stream) {
            return stream->read().count(text) >= times;
        }));
    };
    ASSERT_TRUE(
        runEventLoopUntil([&] { return reading(": subscribed", 1) == MAX_EVENT_STREAMS; }, WAIT_MS))
        << reading(": subscribed", 1);
    const ServedHost::Reply refused = serve.get("/api/events?subscriber=S0");
    EXPECT_EQ(refused.status, 503);
    EXPECT_TRUE(refused.json()["error"].isString());
    const ServedHost::Reply answer =
        serve.post({ServedHost::request("retrieveVcaRawRuleInfo", "cam1")})[0];
    EXPECT_EQ(answer.json().value("payload")["camID"].toString(), "cam1")
        << answer.body.constData();
    for (const auto& stream : streams)
        EXPECT_TRUE(stream->isOpen());

    streams.erase(streams.begin() + 3, streams.begin() + 5);
    ASSERT_TRUE(
        runEventLoopUntil([this] { return serve.errorOutput().contains("unsubscribing C"); }));
    // The places of streams that went are free again once the front notices.
    EXPECT_TRUE(runEventLoopUntil(
        [&] {
            if (streams.size() < MAX_EVENT_STREAMS - 1)
                streams.push_back(std::make_unique<EventStream>(serve, "S0"));
            if (streams.back()->read().contains(" 503 "))
                streams.pop_back();
            return streams.size() == MAX_EVENT_STREAMS - 1 &&
                   streams.back()->read().contains(": subscribed");
        },
        WAIT_MS));
    // A file replaced the way editors save (a new file renamed over it), changed again, and a new
    // one: each reaches every stream still open, once.
    const QString changed[] = {"cam1.new", "cam1.xml", "cam2.xml"};
    QStringList events;
    for (int i = 0; i < 3; ++i) {
        const QByteArray camera = changed[i].left(4).toUtf8();
        const QByteArray rule = "{\"sensitivity\":" + QByteArray::number(i) + "}";
        ASSERT_TRUE(writeFile(vcaPath("live/" + changed[i]), liveRules(camera, rule)));
        if (changed[i].endsWith(".new")) {
            ASSERT_EQ(std::rename(qPrintable(vcaPath("live/cam1.new")),
                                  qPrintable(vcaPath("live/cam1.xml"))),
                      0);
        }
        ASSERT_TRUE(runEventLoopUntil([&] { return reading("\nevent: ", i + 1) == streams.size(); },
                                      WAIT_MS))
            << reading("\nevent: ", i + 1);
        events << livePayload(camera, true, R"({"Intrusion":{"Front door":)" + rule + "}}");
    }
    QStringList expected;
    for (const char* id : {"A", "A", "B"}) {
        for (const QString& rules : events)
            expected << "liveVCARuleChanged " +
                            canonical(
                                "{\"eventName\":\"liveVCARuleChanged\",\"sourcePluginId\":\"" +
                                QUENVAR_ID.toUtf8() + "\",\"subscriberId\":\"" + id +
                                "\",\"eventData\":" + rules.toUtf8() + "}");
    }
    EXPECT_EQ(lines(eventsOf(*streams[0]) + eventsOf(*streams[1]) + eventsOf(*streams[2])),
              lines(expected));
    // The host subscribes with the first stream of each and unsubscribes with the last.
    QStringList subscriptions =
        captured("PluginHost\\.cpp:\\d+ (\\S*subscribing [ABC])$", serve.errorOutput());
    subscriptions.sort();
    EXPECT_EQ(lines(subscriptions),
              lines({"subscribing A", "subscribing B", "subscribing C", "unsubscribing C"}));
    // The plugin no longer emits for C.
    EXPECT_FALSE(serve.errorOutput().contains("for subscriber C"))
        << qPrintable(serve.errorOutput());
    EXPECT_EQ(serve.stop(), 0);
}

TEST_F(HostEndToEndTest, SkipsPluginsItCannotUseAndAnswersWithoutTheVcaPlugin) {
    QTemporaryDir tree;
    const QDir dir(tree.path());
    ASSERT_TRUE(dir.mkpath("plugins"));
    // Where the plugins look for the build's shared libraries.
    ASSERT_TRUE(QFile::link(BuildPaths::lib(), dir.filePath("lib")));
    const QString plugins = dir.filePath("plugins");
    const QString quenvar = BuildPaths::plugins() + "/libPluginQuenvar.so";
    ASSERT_TRUE(QFile::copy(quenvar, plugins + "/libPluginQuenvar.so"));
    ASSERT_TRUE(QFile::copy(quenvar, plugins + "/libPluginQuenvarCopy.so"));
    for (const char* name : {"ForeignPlugin", "NoIdPlugin"}) {
        ASSERT_TRUE(QFile::copy(QStringLiteral(QUENVAR_TEST_PLUGIN_DIR "/lib%1.so").arg(name),
                                QStringLiteral("%1/lib%2.so").arg(plugins, name)));
    }
    ASSERT_TRUE(writeFile(plugins + "/libBroken.so", "not a shared library"));
    ASSERT_TRUE(writeFile(plugins + "/README.txt", "not a library at all"));

    const HostRun run = runHost(
        {"request", "--plugins", plugins, "--verbose", "retrieveVcaRawRuleInfo", "\"cam1\""});
    EXPECT_EQ(run.exitCode, 0);
    EXPECT_EQ(canonical(run.output).toStdString(),
              canonical(R"({"handled":false,"code":"-1","message":"","payload":)" +
                        livePayload("", false, EMPTY_XML_RULES, "") + "}")
                  .toStdString());
    // The host's failures, at the logging library's default level, without file and line.
    QStringList warnings =
        captured(R"(\[QuenvarHost\] L2 platform/host/\S+ (.*?)( \(.*)?$)", run.errors);
    EXPECT_EQ(lines(warnings),
              lines({"skipping libBroken.so: not a Qt plugin",
                     "skipping libForeignPlugin.so: its interface is "
                     "\"org.example.OtherHost.Interface\", not "
                     "\"com.MERIDOX.PluginServer.PluginInterface\"",
                     "skipping libNoIdPlugin.so: its metadata has no PluginID",
                     "skipping libPluginQuenvarCopy.so: PluginID " + QUENVAR_ID +
                         " is already loaded from libPluginQuenvar.so",
                     "cannot connect vcaMetadataChanged(const QString &) of plugin " + VCA_ID +
                         ": no plugin with that id"}));
    EXPECT_TRUE(run.errors.contains("GetVCARules from " + QUENVAR_ID + ": no plugin serves it"))
        << qPrintable(run.errors);
}

TEST(HostUsageTest, ExitsWith2AndAMessage) {
    const struct {
        QStringList arguments;
        const char* message;
    } rows[] = {
        {{}, "missing the mode"},
        {{"run"}, "unknown mode"},
        {{"request"}, "missing the COMMAND"},
        {{"request", "areaZoom", "{}", "extra"}, "too many arguments"},
        // One JSON value of any kind, read as the one element of an array.
        {{"request", "areaZoom", "{\"host\":"}, "PARAMS_JSON is not JSON"},
        {{"request", "areaZoom", "cam1"}, "PARAMS_JSON is not JSON"},
        {{"request", "areaZoom", "1],[2"}, "PARAMS_JSON is not JSON"},
        {{"request", "areaZoom", " "}, "PARAMS_JSON is no JSON value"},
        {{"request", "areaZoom", "1,2"}, "PARAMS_JSON is more than one JSON value"},
        {{"request", "--timeout-ms", "0", "areaZoom"}, "--timeout-ms"},
        {{"request", "--listen", "127.0.0.1:0", "areaZoom"}, "--listen"},
        {{"request", "--allow-host", "console.test", "areaZoom"}, "--allow-host"},
        {{"request", "--token-file", "token", "areaZoom"}, "--token-file"},
        {{"serve", "--allow-host", "console.test:8700"}, "--allow-host"},
        {{"serve", "--allow-host", "a/b"}, "--allow-host"},
        {{"serve", "--allow-host", "cafe:80"}, "--allow-host"},
        {{"serve", "--token-file", ""}, "--token-file"},
        {{"request", "--bogus", "areaZoom"}, "bogus"},
        {{"serve", "--listen", "nowhere"}, "--listen"},
        {{"serve", "areaZoom"}, "serve takes no arguments"},
        {{"request", "--plugins", QUENVAR_TEST_PLUGIN_DIR, "areaZoom"}, "no PluginQuenvar"},
    };
    for (const auto& row : rows) {
        const HostRun run = runHost(row.arguments);
        EXPECT_EQ(run.exitCode, 2) << qPrintable(row.arguments.join(' '));
        EXPECT_TRUE(run.output.isEmpty()) << run.output.constData();
        EXPECT_TRUE(run.errors.contains(row.message)) << qPrintable(run.errors);
    }
}

} // namespace
