#include "BuildPaths.h"

#include <QDir>
#include <QFile>
#include <QProcess>
#include <QRegularExpression>
#include <QTemporaryDir>

#include <gtest/gtest.h>

namespace {

struct ProbeRun {
    int exitCode = -1;
    QString output; // standard error without the logging library's time stamps
};

ProbeRun runProbe(const QString& program, const char* level, const QStringList& arguments) {
    QProcess probe;
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert(QStringLiteral("KALBLOG_LEVEL"), QString::fromLatin1(level));
    environment.remove(QStringLiteral("KALBLOG_FILE"));
    probe.setProcessEnvironment(environment);
    probe.start(program, arguments);
    ProbeRun run;
    if (probe.waitForFinished(30000) && probe.exitStatus() == QProcess::NormalExit)
        run.exitCode = probe.exitCode();
    run.output =
        QString::fromLocal8Bit(probe.readAllStandardError())
            .remove(QRegularExpression(R"(^\S+ \S+ (?=\[))", QRegularExpression::MultilineOption));
    return run;
}

// The module's log lines are read in a child process: the logging library reads its set-up when
// the plugin module loads.
struct LogCase {
    const char* name;
    const char* level;
    QStringList arguments; // for log-probe
    QStringList lines;     // what it writes to standard error; %L stands for any line number
};

void PrintTo(const LogCase& row, std::ostream* out) {
    *out << row.name;
}

class LogTest : public ::testing::TestWithParam<LogCase> {};

TEST_P(LogTest, WritesExactlyTheseLines) {
    const ProbeRun run = runProbe(BuildPaths::bin(QStringLiteral("log-probe")), GetParam().level,
                                  GetParam().arguments);
    EXPECT_EQ(run.exitCode, 0);
    QString pattern = QRegularExpression::escape(GetParam().lines.join('\n') + '\n');
    pattern.replace(QStringLiteral("\\%L"), QStringLiteral("\\d+"));
    EXPECT_TRUE(QRegularExpression(QRegularExpression::anchoredPattern(pattern))
                    .match(run.output)
                    .hasMatch())
        << qPrintable(run.output);
}

const QString PLUGIN = QStringLiteral("[Quenvar] L5 src/PluginQuenvar:");
const QString PRESET = QStringLiteral("[Quenvar] L2 src/PluginQuenvar:%L ");
const QString RULES = QStringLiteral("[Quenvar] L2 src/QUILImplementation/VcaRuleRetriever:");

INSTANTIATE_TEST_SUITE_P(
    Probe, LogTest,
    ::testing::Values(
        LogCase{"TracesAtLevelFive",
                "5",
                {},
                {PLUGIN + "%L PluginQuenvar::InitialPluginBase, Enter",
                 PLUGIN + "0 PluginQuenvar::InitialPluginBase, Leave",
                 PLUGIN + "%L PluginQuenvar::~PluginQuenvar, Enter",
                 PLUGIN + "0 PluginQuenvar::~PluginQuenvar, Leave"}},
        LogCase{"GotoPresetFails",
                "2",
                {"gotoSmartTrackingAdvPreset", "10.0.0.7", "fail", "no such preset"},
                {PRESET + "Go to SmartTrackingAdv preset failed,  ip: 10.0.0.7, response: no "
                          "such preset",
                 "answer 1 -1"}},
        LogCase{"PresetListFails",
                "2",
                {"getSmartTrackingAdvPresetList", "cam.local", "fail", "Gate", "Door"},
                {PRESET + "get SmartTrackingAdv preset list failed, ip: cam.local, response: "
                          "Gate,Door",
                 "answer 1 -1"}},
        LogCase{"GotoPresetSucceeds",
                "2",
                {"gotoSmartTrackingAdvPreset", "h", "ok", "x"},
                {"answer 1 0"}},
        LogCase{"PresetListSucceeds",
                "2",
                {"getSmartTrackingAdvPresetList", "h", "ok", "x"},
                {"answer 1 0"}},
        LogCase{
            "OtherCommandFailsSilently", "2", {"setPTZIdleAction", "h", "fail"}, {"answer 1 -1"}},
        LogCase{"RuleFailures",
                "2",
                {"rules"},
                {RULES + "%L getLiveVcaRule, getLiveVcaRule failed, 80000404", "answer 1 -1",
                 RULES + "195 queryRecordingVCARuleCB, queryRecordingVCARuleCB failed, 80000001",
                 "answer 1 -1",
                 RULES + "204 queryRecordingVCARuleCB, parse message failed, not xml",
                 "answer 1 -1"}}),
    [](const ::testing::TestParamInfo<LogCase>& info) { return info.param.name; });

bool copyInto(const QString& source, const QString& folder) {
    QDir().mkpath(folder);
    return QFile::copy(source, folder + QLatin1Char('/') + QFileInfo(source).fileName());
}

TEST(LogWithoutLibraryTest, PluginWorksSilently) {
    // A copy of the build without the logging library next to the plugin.
    QTemporaryDir tree;
    const QString bin = tree.filePath(QStringLiteral("bin"));
    ASSERT_TRUE(copyInto(BuildPaths::bin(QStringLiteral("log-probe")), bin));
    for (const QString& name : QDir(BuildPaths::lib()).entryList({"*.so*"}, QDir::Files)) {
        if (!name.contains(QStringLiteral("KalbLogUtl"))) {
            ASSERT_TRUE(copyInto(BuildPaths::lib() + '/' + name, tree.filePath("lib")));
        }
    }
    ASSERT_TRUE(copyInto(BuildPaths::plugins() + QStringLiteral("/libPluginQuenvar.so"),
                         tree.filePath(QStringLiteral("plugins"))));

    const ProbeRun run = runProbe(bin + QStringLiteral("/log-probe"), "5", {"rules"});
    EXPECT_EQ(run.exitCode, 0);
    EXPECT_EQ(run.output.toStdString(), "answer 1 -1\nanswer 1 -1\nanswer 1 -1\n");
}

} // namespace
