#include "BuildPaths.h"

#include <QFile>
#include <QProcess>
#include <QRegularExpression>
#include <QTemporaryDir>

#include <gtest/gtest.h>

namespace {

TEST(VcaRuleLogTest, FailuresAreLoggedAtLevelTwo) {
    QTemporaryDir dir;
    ASSERT_TRUE(dir.isValid());
    const QString logFile = dir.filePath(QStringLiteral("trace.log"));
    QProcess probe;
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert(QStringLiteral("KALBLOG_LEVEL"), QStringLiteral("2"));
    environment.insert(QStringLiteral("KALBLOG_FILE"), logFile);
    probe.setProcessEnvironment(environment);
    probe.start(BuildPaths::bin(QStringLiteral("vca-rule-log-probe")), {});
    ASSERT_TRUE(probe.waitForFinished(30000));
    ASSERT_EQ(probe.exitStatus(), QProcess::NormalExit);
    ASSERT_EQ(probe.exitCode(), 0) << probe.readAllStandardOutput().constData();

    QFile file(logFile);
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QString log = QString::fromUtf8(file.readAll());
    EXPECT_TRUE(log.contains(QRegularExpression(
        R"(\[Quenvar\] L2 src/QUILImplementation/VcaRuleRetriever:\d+ getLiveVcaRule, )"
        R"(getLiveVcaRule failed, 80000404\n)")))
        << qPrintable(log);
    EXPECT_TRUE(log.contains("[Quenvar] L2 src/QUILImplementation/VcaRuleRetriever:195 "
                             "queryRecordingVCARuleCB, queryRecordingVCARuleCB failed, 80000001\n"))
        << qPrintable(log);
    EXPECT_TRUE(log.contains("[Quenvar] L2 src/QUILImplementation/VcaRuleRetriever:204 "
                             "queryRecordingVCARuleCB, parse message failed, not xml\n"))
        << qPrintable(log);
    EXPECT_EQ(log.count(QLatin1Char('\n')), 3) << qPrintable(log);
}

} // namespace
