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

// The module's log lines are read in a child process: the logging library reads its set-up when
// the plugin module loads.
ProbeRun runProbe(const char* level, const QStringList& arguments,
                  const QString& program = BuildPaths::bin(QStringLiteral("log-probe"))) {
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

// Exactly these lines; %L stands for any line number.
void expectLines(const ProbeRun& run, const QStringList& lines) {
    EXPECT_EQ(run.exitCode, 0);
    QString pattern = QRegularExpression::escape(lines.join('\n') + '\n');
    pattern.replace(QStringLiteral("\\%L"), QStringLiteral("\\d+"));
    EXPECT_TRUE(QRegularExpression(QRegularExpression::anchoredPattern(pattern))
                    .match(run.output)
                    .hasMatch())
        << qPrintable(run.output);
}

TEST(LogTest, TracesAtLevelFive) {
    const QString trace = QStringLiteral("[Quenvar] L5 src/PluginQuenvar:");
    expectLines(runProbe("5", {}), {trace + "%L PluginQuenvar::InitialPluginBase, Enter",
                                    trace + "0 PluginQuenvar::InitialPluginBase, Leave",
                                    trace + "%L PluginQuenvar::~PluginQuenvar, Enter",
                                    trace + "0 PluginQuenvar::~PluginQuenvar, Leave"});
}

// Only the failed rule and preset commands log, with the camera's host and answer (escaped and
// cut), and a request whose operation threw, with the command.
TEST(LogTest, FailuresAtLevelTwo) {
    const QString rules = QStringLiteral("[Quenvar] L2 src/QUILImplementation/VcaRuleRetriever:");
    const QString preset = QStringLiteral("[Quenvar] L2 src/PluginQuenvar:%L ");
    expectLines(
        runProbe("2", {"failures"}),
        {rules + "%L getLiveVcaRule, getLiveVcaRule failed, 80000404", "answer 1 -1",
         rules + "195 queryRecordingVCARuleCB, queryRecordingVCARuleCB failed, 80000001",
         "answer 1 -1", rules + "204 queryRecordingVCARuleCB, parse message failed, not xml",
         "answer 1 -1",
         preset + "Go to SmartTrackingAdv preset failed,  ip: 10.0.0.7, response: no such preset",
         "answer 1 -1",
         preset + "get SmartTrackingAdv preset list failed, ip: cam.local, response: Gate,Door",
         "answer 1 -1", "answer 1 0", "answer 1 0", "answer 1 -1",
         preset +
             "Go to SmartTrackingAdv preset failed,  ip: 10.0.0.8, response: busy\\r\\n"
             "[Quenvar] L2 forged" +
             QString(226, 'x') + "...",
         "answer 1 -1", preset + "PluginQuenvar::Request, areaZoom failed, camera gone",
         "answer 1 -1"});
}

bool copyInto(const QString& source, const QString& folder) {
    QDir().mkpath(folder);
    return QFile::copy(source, folder + QLatin1Char('/') + QFileInfo(source).fileName());
}

TEST(LogWithoutLibraryTest, PluginWorksSilently) {
    // A copy of the build without the logging library next to the plugin.
    QTemporaryDir tree;
    const QString bin = tree.filePath(QStringLiteral("bin"));
    ASSERT_TRUE(copyInto(BuildPaths::bin(QStringLiteral("log-probe")), bin));
    for (const QString& name : QDir(BuildPaths::lib()).entryList({"*.so*"}, QDir::Files))
        ASSERT_TRUE(name.contains(QStringLiteral("KalbLogUtl")) ||
                    copyInto(BuildPaths::lib() + '/' + name, tree.filePath("lib")));
    ASSERT_TRUE(copyInto(BuildPaths::plugins() + QStringLiteral("/libPluginQuenvar.so"),
                         tree.filePath(QStringLiteral("plugins"))));

    expectLines(runProbe("5", {"failures"}, bin + QStringLiteral("/log-probe")),
                QStringList(5, "answer 1 -1") + QStringList{"answer 1 0", "answer 1 0",
                                                            "answer 1 -1", "answer 1 -1",
                                                            "answer 1 -1"});
}

} // namespace
