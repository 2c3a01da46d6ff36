#include "BuildPaths.h"
#include "FakeFrameworkTools.h"
#include "PluginFramework.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QDir>
#include <QFile>
#include <QJsonArray>
#include <QJsonObject>
#include <QPluginLoader>
#include <QSignalSpy>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <cstdio>
#include <memory>

namespace {

struct Answer {
    bool handled = false;
    QString code;
    QString text;
    int calls = 0;
};

bool writeFile(const QString& path, const QByteArray& content) {
    QFile file(path);
    return file.open(QIODevice::WriteOnly | QIODevice::Truncate) &&
           file.write(content) == content.size();
}

QString liveRequest(const QString& camera) {
    return QStringLiteral("<GetVCARules><Cam>%1</Cam></GetVCARules>").arg(camera);
}

} // namespace

// One simulated VCA plugin for the whole suite, as the host would have it: a Qt plugin is a
// single instance per process.
class VcaSimTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        folder = std::make_unique<QTemporaryDir>();
        const QDir dir(folder->path());
        dir.mkpath("live");
        dir.mkpath("recording");
        writeFile(dir.filePath("live/cam1.xml"), "<GetVCARulesRes>cam1</GetVCARulesRes>");
        writeFile(dir.filePath("live/cam2.xml"), "<GetVCARulesRes>cam2</GetVCARulesRes>");
        writeFile(dir.filePath("live/cam2.status"), "80000001\n");
        writeFile(dir.filePath("live/a&b.xml"), "<GetVCARulesRes>a&amp;b</GetVCARulesRes>");
        writeFile(dir.filePath("recording/1700000000.xml"), "<GetRecordingVCARulesRes/>");
        qputenv("VCASIM_DIR", folder->path().toLocal8Bit());

        loader = std::make_unique<QPluginLoader>(BuildPaths::plugins() + "/libPluginVcaSim.so");
        plugin = qobject_cast<IPluginObjectBase*>(loader->instance());
        if (plugin)
            plugin->InitialPluginBase(&tools);
    }

    static void TearDownTestSuite() {
        loader->unload();
        loader.reset();
        plugin = nullptr;
        folder.reset();
    }

    void SetUp() override { ASSERT_NE(plugin, nullptr) << qPrintable(loader->errorString()); }

    static Answer request(const QString& command, const QString& content) {
        Answer answer;
        plugin->Request(
            command, content, RequestSenderInfo{},
            [&answer](bool handled, const QString& code, const QString&, const QVariant& payload) {
                answer.handled = handled;
                answer.code = code;
                answer.text = payload.toString();
                ++answer.calls;
            });
        return answer;
    }

    static QString path(const QString& name) { return QDir(folder->path()).filePath(name); }

    static std::unique_ptr<QTemporaryDir> folder;
    static std::unique_ptr<QPluginLoader> loader;
    static IPluginObjectBase* plugin;
    static FakeFrameworkTools tools;
};

std::unique_ptr<QTemporaryDir> VcaSimTest::folder;
std::unique_ptr<QPluginLoader> VcaSimTest::loader;
IPluginObjectBase* VcaSimTest::plugin = nullptr;
FakeFrameworkTools VcaSimTest::tools;

TEST_F(VcaSimTest, MetaDataNamesTheVcaPluginAndItsCommands) {
    const QJsonObject meta = loader->metaData().value("MetaData").toObject();
    EXPECT_EQ(meta.value("PluginID").toString(),
              QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD"));
    EXPECT_EQ(meta.value("Commands").toArray(),
              (QJsonArray{"GetVCARules", "GetRecordingVCARules"}));
}

struct FileCase {
    const char* command;
    QString content;
    const char* code;
    const char* text;
};

class VcaSimAnswerTest
    : public VcaSimTest
    , public ::testing::WithParamInterface<FileCase> {};

TEST_P(VcaSimAnswerTest, AnswersFromTheFilesOfTheDataFolder) {
    const Answer answer = request(GetParam().command, GetParam().content);
    EXPECT_EQ(answer.calls, 1);
    EXPECT_TRUE(answer.handled);
    EXPECT_EQ(answer.code, QString::fromUtf8(GetParam().code));
    EXPECT_EQ(answer.text, QString::fromUtf8(GetParam().text));
}

INSTANTIATE_TEST_SUITE_P(
    Files, VcaSimAnswerTest,
    ::testing::Values(
        FileCase{"GetVCARules", liveRequest("cam1"), "0", "<GetVCARulesRes>cam1</GetVCARulesRes>"},
        FileCase{"GetVCARules", liveRequest("cam2"), "80000001",
                 "<GetVCARulesRes>cam2</GetVCARulesRes>"},
        FileCase{"GetVCARules", liveRequest("cam9"), "80000404", ""},
        FileCase{"GetVCARules", liveRequest("a&amp;b"), "0",
                 "<GetVCARulesRes>a&amp;b</GetVCARulesRes>"},
        FileCase{"GetVCARules", liveRequest("a&b"), "0",
                 "<GetVCARulesRes>a&amp;b</GetVCARulesRes>"},
        FileCase{"GetVCARules", liveRequest("../recording/1700000000"), "80000404", ""},
        FileCase{"GetVCARules", liveRequest(""), "80000404", ""},
        FileCase{"GetRecordingVCARules",
                 "<GetRecordingVCARules><QueryTime>1700000000</QueryTime><Loc>l1</Loc>"
                 "</GetRecordingVCARules>",
                 "0", "<GetRecordingVCARulesRes/>"},
        FileCase{"GetRecordingVCARules",
                 "<GetRecordingVCARules><QueryTime>5</QueryTime></GetRecordingVCARules>",
                 "80000404", ""}));

TEST_F(VcaSimTest, LogsEveryRequestOnOneLine) {
    request("GetVCARules", "<GetVCARules>\n\t<Cam>cam1</Cam>\r\n</GetVCARules>");
    request("SomethingElse", "x\\y");
    QFile log(path("requests.log"));
    ASSERT_TRUE(log.open(QIODevice::ReadOnly));
    const QList<QByteArray> lines = log.readAll().split('\n');
    ASSERT_GE(lines.size(), 3);
    EXPECT_EQ(lines.at(lines.size() - 3),
              QByteArray("GetVCARules\t<GetVCARules>\\n\\t<Cam>cam1</Cam>\\r\\n</GetVCARules>"));
    EXPECT_EQ(lines.at(lines.size() - 2), QByteArray("SomethingElse\tx\\\\y"));
    EXPECT_TRUE(lines.last().isEmpty());
}

TEST_F(VcaSimTest, CreatedChangedAndReplacedLiveFilesEmitOnceEach) {
    QSignalSpy spy(plugin, SIGNAL(vcaMetadataChanged(QString)));
    ASSERT_TRUE(spy.isValid());
    const QString rules = path("live/cam7.xml");

    ASSERT_TRUE(writeFile(rules, "<created/>"));
    ASSERT_TRUE(spy.wait(5000));
    ASSERT_TRUE(writeFile(rules, "<modified/>"));
    ASSERT_TRUE(spy.wait(5000));
    // The way editors save: a new file renamed over the old one, which drops out of the watch.
    ASSERT_TRUE(writeFile(path("live/cam7.tmp"), "<replaced/>"));
    ASSERT_EQ(std::rename(qPrintable(path("live/cam7.tmp")), qPrintable(rules)), 0);
    ASSERT_TRUE(spy.wait(5000));
    ASSERT_TRUE(writeFile(rules, "<modified again/>"));
    ASSERT_TRUE(spy.wait(5000));
    // Any repeat for cam7 would come before the report of a later file.
    ASSERT_TRUE(writeFile(path("live/sentinel.xml"), "<s/>"));
    ASSERT_TRUE(spy.wait(5000));

    QStringList cameras;
    for (const QList<QVariant>& arguments : std::as_const(spy))
        cameras.append(arguments.value(0).toString());
    EXPECT_EQ(cameras, (QStringList{"cam7", "cam7", "cam7", "cam7", "sentinel"}));
}
