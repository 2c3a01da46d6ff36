#include "BuildPaths.h"
#include "CamsimProcess.h"
#include "EventLoopWait.h"
#include "ListeningProcess.h"

#include <QDir>
#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QProcess>
#include <QRegularExpression>
#include <QTemporaryDir>

#include <gtest/gtest.h>
#include <httplib.h>

#include <csignal>
#include <cstdio>
#include <memory>

namespace {

const QString QUENVAR_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const QString VCA_ID = QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD");
// serve's bearer token, given through the environment.
const char TOKEN[] = "end-to-end-test-token";
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

// One subscriber's event stream of quenvar-host serve, read as the event loop runs.
class EventStream {
public:
    EventStream(QNetworkAccessManager& network, quint16 port, const QString& subscriberId)
        : reply(network.get(request(port, subscriberId))) {}

    // Waits for the opening comment, which says the host has subscribed, or for events.
    bool waitFor(const char* text, int times = 1) {
        return runEventLoopUntil([this, text, times]() { return read().count(text) >= times; });
    }

    // Each event as its name and its data, without the data's time stamp, which must be set.
    QStringList events() {
        QStringList events;
        for (const QString& block : QString::fromUtf8(read()).split("\n\n")) {
            const QStringList lines = block.split('\n');
            if (!block.startsWith("event: ") || !lines.value(1).startsWith("data: "))
                continue;
            QJsonObject data = QJsonDocument::fromJson(lines[1].mid(6).toUtf8()).object();
            EXPECT_GT(data.take("timestamp").toDouble(), 0);
            events << lines[0].mid(7) + " " + QJsonDocument(data).toJson(QJsonDocument::Compact);
        }
        return events;
    }

private:
    static QNetworkRequest request(quint16 port, const QString& subscriberId) {
        QNetworkRequest request(QUrl(QStringLiteral("http://127.0.0.1:%1/api/events?subscriber=%2")
                                         .arg(port)
                                         .arg(subscriberId)));
        request.setRawHeader("Authorization", QByteArray("Bearer ") + TOKEN);
        return request;
    }

    const QByteArray& read() { return text += reply->readAll(); }

    std::unique_ptr<QNetworkReply> reply;
    QByteArray text;
};

std::string lines(const QStringList& list) {
    return list.join('\n').toStdString();
}

class HostEndToEndTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { std::signal(SIGPIPE, SIG_IGN); }

    QString vcaPath(const QString& name) const { return QDir(vca.path()).filePath(name); }
    bool startServe(const QStringList& extra = {}) {
        QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
        environment.insert("QUENVAR_HOST_TOKEN", TOKEN);
        return serve.start(
            BuildPaths::bin("quenvar-host"),
            QStringList{"serve", "--listen", "127.0.0.1:0", "--vca-dir", vca.path()} + extra,
            environment);
    }

    QTemporaryDir vca;
    ListeningProcess serve;
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
        {"retrievePTZTrackingType", R"({CAMERA,"nodeID":"node-7"})", "0",
         R"({"nodeID":"node-7","type":"autotracking"})"},
        {"gotoSmartTrackingAdvPreset", R"({CAMERA,"presetName":"Entrance"})", "0",
         R"("ptztrack_track='Entrance'\r\n")"},
        {"getSmartTrackingAdvPresetList", "{CAMERA}", "0", R"(["Entrance","Parking Lot"])"},
        {"GetVCARules", "{}", {}, {}},
    };

    QStringList answers;
    QStringList expected;
    QByteArray vcaLog;
    httplib::Client client("127.0.0.1", serve.port());
    client.set_bearer_token_auth(TOKEN);
    client.set_read_timeout(60, 0);
    for (const auto& row : rows) {
        const QByteArray params = QByteArray(row.params).replace("CAMERA", connection);
        // Past runHost's patience: a request nothing can answer any more must end at once.
        const HostRun run = runHost(
            {"request", "--vca-dir", vca.path(), "--timeout-ms", "600000", row.command, params});
        answers << row.command + " request " + QString::number(run.exitCode) + " " +
                       canonical(run.output);
        const QByteArray body = "{\"command\":\"" + row.command + "\",\"params\":" + params + "}";
        const httplib::Result result =
            client.Post("/api/request", body.toStdString(), "application/json");
        answers << row.command + " serve " + QString::number(result ? result->status : 0) + " " +
                       canonical(result ? QByteArray::fromStdString(result->body) : QByteArray());

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
    // The set commands of both fronts reached the camera.
    const QJsonDocument state = QJsonDocument::fromJson(QByteArray::fromStdString(camera.state()));
    EXPECT_EQ(state["idleInterval"].toString(), "45");
    EXPECT_EQ(state["lastPreset"].toString(), "Entrance");
}

TEST_F(HostEndToEndTest, ServesPluginsAndEventsAndRejectsBadRequests) {
    ASSERT_TRUE(writeFile(vcaPath("live/cam1.xml"), liveRules("cam1", "{\"sensitivity\":80}")));
    ASSERT_TRUE(startServe({"--verbose"})) << qPrintable(serve.errorOutput());
    httplib::Client client("127.0.0.1", serve.port());
    client.set_bearer_token_auth(TOKEN);

    QStringList statuses;
    for (const char* body : {"", "nope", "[]", "{}", R"({"command":7})"}) {
        const httplib::Result result = client.Post("/api/request", body, "application/json");
        statuses << QString::number(result ? result->status : 0);
    }
    const httplib::Result noSubscriber = client.Get("/api/events");
    statuses << QString::number(noSubscriber ? noSubscriber->status : 0);
    EXPECT_EQ(lines(statuses), lines(QStringList(6, "400")));

    const httplib::Result plugins = client.Get("/api/plugins");
    ASSERT_TRUE(plugins);
    EXPECT_EQ(plugins->status, 200);
    const QByteArray entries =
        R"([{"IID":"com.MERIDOX.PluginServer.PluginInterface","className":"PluginQuenvar",)"
        R"("file":"libPluginQuenvar.so","metaData":{"PluginID":"QUENVAR"},"pluginId":"QUENVAR"},)"
        R"({"IID":"com.MERIDOX.PluginServer.PluginInterface","className":"PluginVcaSim",)"
        R"("file":"libPluginVcaSim.so","metaData":{"Commands":["GetVCARules",)"
        R"("GetRecordingVCARules"],"PluginID":"VCA"},"pluginId":"VCA"}])";
    EXPECT_EQ(canonical(QByteArray::fromStdString(plugins->body)).toStdString(),
              canonical(QByteArray(entries)
                            .replace("QUENVAR", QUENVAR_ID.toUtf8())
                            .replace("VCA\"", VCA_ID.toUtf8() + '"'))
                  .toStdString());

    // C leaves before the changes, and so does one of B's two streams.
    QNetworkAccessManager network;
    EventStream a1(network, serve.port(), "A");
    EventStream a2(network, serve.port(), "A");
    EventStream b(network, serve.port(), "B");
    {
        EventStream leavingB(network, serve.port(), "B");
        EventStream leavingC(network, serve.port(), "C");
        for (EventStream* stream : {&a1, &a2, &b, &leavingB, &leavingC})
            ASSERT_TRUE(stream->waitFor(": subscribed"));
    }
    ASSERT_TRUE(
        runEventLoopUntil([this] { return serve.errorOutput().contains("unsubscribing C"); }));
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
        for (EventStream* stream : {&a1, &a2, &b})
            ASSERT_TRUE(stream->waitFor("\nevent: ", i + 1));
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
    EXPECT_EQ(lines(a1.events() + a2.events() + b.events()), lines(expected));
    // The host subscribes with the first stream of each and unsubscribes with the last.
    QStringList subscriptions;
    QRegularExpressionMatchIterator found =
        QRegularExpression("PluginHost\\.cpp:\\d+ (\\S*subscribing \\S+)$",
                           QRegularExpression::MultilineOption)
            .globalMatch(serve.errorOutput());
    while (found.hasNext())
        subscriptions << found.next().captured(1);
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
    QStringList warnings;
    const QRegularExpression failure(
        QStringLiteral(R"(\[QuenvarHost\] L2 platform/host/\S+ (.*))"));
    for (const QString& line : run.errors.split('\n')) {
        const QRegularExpressionMatch match = failure.match(line);
        if (match.hasMatch())
            warnings << match.captured(1).section(" (", 0, 0);
    }
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
