#include "BuildPaths.h"
#include "ListeningProcess.h"
#include "PluginTree.h"
#include "SseClient.h"

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

namespace {

const QString QUENVAR_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const QString VCA_ID = QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD");
const QString CHANGED_EVENT = QStringLiteral("liveVCARuleChanged");

QString host() {
    return BuildPaths::bin(QStringLiteral("quenvar-host"));
}

QString module(const QString& name) {
    return BuildPaths::plugins() + QStringLiteral("/lib") + name + QStringLiteral(".so");
}

QString testModule(const QString& name) {
    return QStringLiteral(QUENVAR_TEST_PLUGIN_DIR "/lib") + name + QStringLiteral(".so");
}

struct RequestRun {
    int exitCode = -1;
    QByteArray output;
    QString errors;
    QJsonObject answer;
};

RequestRun runRequest(const QStringList& arguments) {
    QProcess process;
    process.start(host(), QStringList{QStringLiteral("request")} + arguments);
    RequestRun run;
    if (!process.waitForFinished(60000) || process.exitStatus() != QProcess::NormalExit)
        return run;
    run.exitCode = process.exitCode();
    run.output = process.readAllStandardOutput();
    run.errors = QString::fromUtf8(process.readAllStandardError());
    run.answer = QJsonDocument::fromJson(run.output).object();
    return run;
}

struct HttpReply {
    int status = 0;
    QByteArray body;
};

HttpReply postRequest(quint16 port, const QByteArray& body) {
    httplib::Client client("127.0.0.1", port);
    client.set_read_timeout(60, 0);
    const httplib::Result result =
        client.Post("/api/request", body.toStdString(), "application/json");
    return result ? HttpReply{result->status, QByteArray::fromStdString(result->body)}
                  : HttpReply{};
}

bool writeFile(const QString& path, const QByteArray& content) {
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    return file.open(QIODevice::WriteOnly | QIODevice::Truncate) &&
           file.write(content) == content.size();
}

QByteArray liveRules(const QByteArray& ruleText) {
    return "<GetVCARulesRes><Camera><CamName>cam1</CamName><Rules Format=\"json\">"
           "<Rule Type=\"Intrusion\" Name=\"Front%20door\">" +
           ruleText + "</Rule></Rules></Camera></GetVCARulesRes>";
}

} // namespace

class HostUnmatchedCommandTest : public ::testing::TestWithParam<const char*> {};

TEST_P(HostUnmatchedCommandTest, PrintsNotAnsweredAndExits3) {
    const RequestRun run = runRequest({"--timeout-ms", "3000", GetParam(), "{}"});
    EXPECT_EQ(run.exitCode, 3) << qPrintable(run.errors);
    EXPECT_EQ(run.output, QByteArray("{\"answered\":false}\n"));
}

INSTANTIATE_TEST_SUITE_P(Commands, HostUnmatchedCommandTest,
                         ::testing::Values("GetVCARules", "AreaZoom", "noSuchCommand"));

struct UsageCase {
    QStringList arguments;
    const char* message;
};

class HostUsageTest : public ::testing::TestWithParam<UsageCase> {};

TEST_P(HostUsageTest, ExitsWith2AndAMessage) {
    QProcess process;
    process.start(host(), GetParam().arguments);
    ASSERT_TRUE(process.waitForFinished(30000));
    EXPECT_EQ(process.exitCode(), 2);
    EXPECT_TRUE(process.readAllStandardOutput().isEmpty());
    EXPECT_TRUE(process.readAllStandardError().contains(GetParam().message));
}

INSTANTIATE_TEST_SUITE_P(
    Arguments, HostUsageTest,
    ::testing::Values(UsageCase{{}, "missing the mode"}, UsageCase{{"run"}, "unknown mode"},
                      UsageCase{{"request"}, "missing the COMMAND"},
                      UsageCase{{"request", "areaZoom", "{}", "extra"}, "too many arguments"},
                      UsageCase{{"request", "areaZoom", "{\"host\":"}, "PARAMS_JSON is not JSON"},
                      UsageCase{{"request", "retrieveVcaRawRuleInfo", "cam1"}, "PARAMS_JSON"},
                      UsageCase{{"request", "--timeout-ms", "0", "areaZoom"}, "--timeout-ms"},
                      UsageCase{{"request", "--listen", "127.0.0.1:0", "areaZoom"}, "--listen"},
                      UsageCase{{"request", "--bogus", "areaZoom"}, "bogus"},
                      UsageCase{{"serve", "--listen", "nowhere"}, "--listen"},
                      UsageCase{{"serve", "areaZoom"}, "serve takes no arguments"}));

TEST(HostPluginFolderTest, FolderWithoutPluginQuenvarExits2) {
    PluginTree tree;
    ASSERT_TRUE(tree.isValid());
    ASSERT_TRUE(tree.add(module("PluginVcaSim")));
    const RequestRun run = runRequest({"--plugins", tree.plugins(), "areaZoom", "{}"});
    EXPECT_EQ(run.exitCode, 2);
    EXPECT_TRUE(run.output.isEmpty());
    EXPECT_TRUE(run.errors.contains("no PluginQuenvar")) << qPrintable(run.errors);
}

TEST(HostPluginFolderTest, SkipsBrokenForeignAndIdlessPluginsWithAMessage) {
    PluginTree tree;
    ASSERT_TRUE(tree.isValid());
    ASSERT_TRUE(tree.add(module("PluginQuenvar")));
    ASSERT_TRUE(tree.add(module("PluginVcaSim")));
    ASSERT_TRUE(tree.add(module("PluginVcaSim"), "libPluginVcaSimCopy.so"));
    ASSERT_TRUE(tree.add(testModule("ForeignPlugin")));
    ASSERT_TRUE(tree.add(testModule("NoIdPlugin")));
    ASSERT_TRUE(tree.addFile("libBroken.so", "not a shared library"));
    ASSERT_TRUE(tree.addFile("README.txt", "not a library at all"));
    QTemporaryDir vca;
    ASSERT_TRUE(writeFile(QDir(vca.path()).filePath("live/cam1.xml"), liveRules("{}")));

    const RequestRun run = runRequest({"--plugins", tree.plugins(), "--vca-dir", vca.path(),
                                       "retrieveVcaRawRuleInfo", "\"cam1\""});
    ASSERT_EQ(run.exitCode, 0) << qPrintable(run.errors);
    EXPECT_EQ(run.answer.value("payload").toObject().value("relayPath").toString(), VCA_ID);
    const QStringList skipped = run.errors.split('\n').filter("skipping");
    EXPECT_EQ(skipped.size(), 4) << qPrintable(run.errors);
    EXPECT_TRUE(run.errors.contains("skipping libBroken.so: not a Qt plugin"));
    EXPECT_TRUE(run.errors.contains("skipping libForeignPlugin.so: its interface is "
                                    "\"org.example.OtherHost.Interface\""));
    EXPECT_TRUE(run.errors.contains("skipping libNoIdPlugin.so: its metadata has no PluginID"));
    EXPECT_TRUE(run.errors.contains("skipping libPluginVcaSimCopy.so: PluginID " + VCA_ID +
                                    " is already loaded from libPluginVcaSim.so"));
    EXPECT_FALSE(run.errors.contains("README"));
}

TEST(HostPluginFolderTest, RuleRequestWithoutTheVcaPluginIsAnsweredNoPlugin) {
    PluginTree tree;
    ASSERT_TRUE(tree.isValid());
    ASSERT_TRUE(tree.add(module("PluginQuenvar")));
    const RequestRun run = runRequest(
        {"--plugins", tree.plugins(), "--verbose", "retrieveVcaRawRuleInfo", "\"cam1\""});
    ASSERT_EQ(run.exitCode, 0) << qPrintable(run.errors);
    EXPECT_EQ(run.answer.value("payload").toObject().value("relayPath").toString(), QString());
    EXPECT_TRUE(run.errors.contains("GetVCARules from " + QUENVAR_ID + ": no plugin serves it"))
        << qPrintable(run.errors);
    EXPECT_TRUE(
        run.errors.contains("cannot connect vcaMetadataChanged(const QString &) of plugin " +
                            VCA_ID + ": no plugin with that id"));
}

// quenvar-host serve with the build's plugins and a VCA data folder with one camera's live rules.
class HostServeTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { std::signal(SIGPIPE, SIG_IGN); }

    void SetUp() override {
        ASSERT_TRUE(writeFile(vcaPath("live/cam1.xml"), liveRules("{\"sensitivity\":80}")));
        ASSERT_TRUE(serve.start(
            host(), {"serve", "--listen", "127.0.0.1:0", "--verbose", "--vca-dir", vca.path()}))
            << qPrintable(serve.errorOutput());
    }

    QString vcaPath(const QString& name) const { return QDir(vca.path()).filePath(name); }

    QTemporaryDir vca;
    ListeningProcess serve;
};

TEST_F(HostServeTest, RejectsBodiesThatAreNotARequest) {
    for (const QByteArray& body : {QByteArray(), QByteArray("nope"), QByteArray("[]"),
                                   QByteArray("{}"), QByteArray(R"({"command":7})")}) {
        const HttpReply reply = postRequest(serve.port(), body);
        EXPECT_EQ(reply.status, 400) << body.constData();
        EXPECT_FALSE(reply.body.isEmpty());
    }
}

TEST_F(HostServeTest, UnmatchedCommandIsNotAnswered) {
    const HttpReply reply = postRequest(serve.port(), R"({"command":"GetVCARules","params":{}})");
    EXPECT_EQ(reply.status, 504);
    EXPECT_EQ(reply.body.trimmed(), QByteArray("{\"answered\":false}"));
}

TEST_F(HostServeTest, ListsTheLoadedPluginsWithTheirMetadata) {
    httplib::Client client("127.0.0.1", serve.port());
    const httplib::Result result = client.Get("/api/plugins");
    ASSERT_TRUE(result);
    ASSERT_EQ(result->status, 200);
    QStringList ids;
    QJsonArray vcaCommands;
    for (const QJsonValue& entry :
         QJsonDocument::fromJson(QByteArray::fromStdString(result->body)).array()) {
        const QJsonObject plugin = entry.toObject();
        ids.append(plugin.value("pluginId").toString());
        EXPECT_EQ(plugin.value("metaData").toObject().value("PluginID"), plugin.value("pluginId"));
        if (plugin.value("pluginId").toString() == VCA_ID)
            vcaCommands = plugin.value("metaData").toObject().value("Commands").toArray();
    }
    EXPECT_EQ(ids, (QStringList{QUENVAR_ID, VCA_ID}));
    EXPECT_EQ(vcaCommands, (QJsonArray{"GetVCARules", "GetRecordingVCARules"}));
}

TEST_F(HostServeTest, EventStreamNeedsASubscriber) {
    httplib::Client client("127.0.0.1", serve.port());
    const httplib::Result result = client.Get("/api/events");
    ASSERT_TRUE(result);
    EXPECT_EQ(result->status, 400);
}

TEST_F(HostServeTest, EventsReachEverySubscriberAndStopForOneThatLeft) {
    SseClient first(serve.port(), QStringLiteral("A"));
    SseClient second(serve.port(), QStringLiteral("B"));
    ASSERT_TRUE(first.waitUntilOpen());
    ASSERT_TRUE(second.waitUntilOpen());

    ASSERT_TRUE(writeFile(vcaPath("live/cam1.xml"), liveRules("{\"sensitivity\":20}")));
    ASSERT_TRUE(first.waitForEvents(1));
    ASSERT_TRUE(second.waitForEvents(1));
    for (const auto& [client, id] : {std::pair{&first, "A"}, std::pair{&second, "B"}}) {
        const SseClient::Event event = client->events().first();
        EXPECT_EQ(event.name, CHANGED_EVENT);
        EXPECT_EQ(event.data.value("eventName").toString(), CHANGED_EVENT);
        EXPECT_EQ(event.data.value("subscriberId").toString(), QString::fromLatin1(id));
        EXPECT_EQ(event.data.value("sourcePluginId").toString(), QUENVAR_ID);
        EXPECT_GT(event.data.value("timestamp").toDouble(), 0);
        EXPECT_EQ(event.data.value("eventData").toObject().value("rules").toString(),
                  QStringLiteral(R"({"Intrusion":{"Front door":{"sensitivity":20}}})"));
    }

    first.close();
    ASSERT_TRUE(serve.waitForErrorOutput("unsubscribing A"));
    ASSERT_TRUE(writeFile(vcaPath("live/cam1.xml"), liveRules("{\"sensitivity\":30}")));
    ASSERT_TRUE(second.waitForEvents(2));
    EXPECT_EQ(second.events().at(1).data.value("eventData").toObject().value("rules").toString(),
              QStringLiteral(R"({"Intrusion":{"Front door":{"sensitivity":30}}})"));
    EXPECT_EQ(first.events().size(), 1);
    // The plugin no longer emits for A: the host saw one event for it, the first.
    EXPECT_EQ(serve.errorOutput().count("event liveVCARuleChanged for subscriber A:"), 1);
}

TEST_F(HostServeTest, StopsCleanlyWhileAStreamIsOpen) {
    SseClient stream(serve.port(), QStringLiteral("A"));
    ASSERT_TRUE(stream.waitUntilOpen());
    EXPECT_EQ(serve.stop(), 0);
}
