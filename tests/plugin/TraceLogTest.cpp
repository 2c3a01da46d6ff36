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
    QString output;
    QString log;
};

ProbeRun runProbe(const QString& program, const QString& logLevel)
{
    QTemporaryDir dir;
    const QString logFile = dir.filePath(QStringLiteral("trace.log"));
    QProcess probe;
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert(QStringLiteral("KALBLOG_LEVEL"), logLevel);
    environment.insert(QStringLiteral("KALBLOG_FILE"), logFile);
    probe.setProcessEnvironment(environment);
    probe.start(program, {});
    ProbeRun run;
    if (!probe.waitForFinished(30000))
        return run;
    run.exitCode = probe.exitStatus() == QProcess::NormalExit ? probe.exitCode() : -1;
    run.output = QString::fromUtf8(probe.readAllStandardOutput());
    QFile file(logFile);
    if (file.open(QIODevice::ReadOnly))
        run.log = QString::fromUtf8(file.readAll());
    return run;
}

bool copyInto(const QString& source, const QString& folder)
{
    QDir().mkpath(folder);
    return QFile::copy(source, folder + QLatin1Char('/') + QFileInfo(source).fileName());
}

} // namespace

TEST(TraceLogTest, TracesHostCallsAtLevelFive)
{
    const ProbeRun run = runProbe(BuildPaths::bin(QStringLiteral("trace-probe")), "5");
    ASSERT_EQ(run.exitCode, 0) << qPrintable(run.output);
    EXPECT_TRUE(run.log.contains(
        QRegularExpression(R"(\[Quenvar\] L5 src/PluginQuenvar:\d+ PluginQuenvar::InitialPluginBase, Enter)")))
        << qPrintable(run.log);
    EXPECT_TRUE(run.log.contains(
        "[Quenvar] L5 src/PluginQuenvar:0 PluginQuenvar::InitialPluginBase, Leave"))
        << qPrintable(run.log);
    EXPECT_TRUE(run.log.contains("PluginQuenvar::~PluginQuenvar, Leave")) << qPrintable(run.log);
}

TEST(TraceLogTest, DefaultLevelLeavesTracesOut)
{
    const ProbeRun run = runProbe(BuildPaths::bin(QStringLiteral("trace-probe")), "2");
    ASSERT_EQ(run.exitCode, 0);
    EXPECT_FALSE(run.log.contains("Enter")) << qPrintable(run.log);
}

TEST(TraceLogTest, WorksWithoutTheLoggingLibrary)
{
    // A copy of the build without the logging library next to the plugin.
    QTemporaryDir tree;
    const QString bin = tree.filePath(QStringLiteral("bin"));
    const QString lib = tree.filePath(QStringLiteral("lib"));
    ASSERT_TRUE(copyInto(BuildPaths::bin(QStringLiteral("trace-probe")), bin));
    for (const QString& name : QDir(BuildPaths::lib()).entryList({"*.so*"}, QDir::Files)) {
        if (!name.contains(QStringLiteral("KalbLogUtl"))) {
            ASSERT_TRUE(copyInto(BuildPaths::lib() + QLatin1Char('/') + name, lib));
        }
    }
    ASSERT_TRUE(copyInto(BuildPaths::plugins() + QStringLiteral("/libPluginQuenvar.so"),
                         tree.filePath(QStringLiteral("plugins"))));

    const ProbeRun run = runProbe(bin + QStringLiteral("/trace-probe"), "5");
    EXPECT_EQ(run.exitCode, 0);
    EXPECT_TRUE(run.output.contains("initialised=1"));
    EXPECT_TRUE(run.log.isEmpty()) << qPrintable(run.log);
}
