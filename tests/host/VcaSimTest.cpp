#include "BuildPaths.h"
#include "FakeFrameworkTools.h"
#include "PluginFramework.h"

#include <QDir>
#include <QFile>
#include <QPluginLoader>
#include <QSignalSpy>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <cstdio>

namespace {

bool writeFile(const QString& path, const QByteArray& content) {
    QFile file(path);
    return file.open(QIODevice::WriteOnly | QIODevice::Truncate) &&
           file.write(content) == content.size();
}

// What it answers and logs is seen end to end through quenvar-host; here, what it watches.
TEST(VcaSimTest, CreatedChangedAndReplacedLiveFilesEmitOnceEach) {
    QTemporaryDir folder;
    qputenv("VCASIM_DIR", folder.path().toLocal8Bit());
    QPluginLoader loader(BuildPaths::plugins() + "/libPluginVcaSim.so");
    auto* plugin = qobject_cast<IPluginObjectBase*>(loader.instance());
    ASSERT_NE(plugin, nullptr) << qPrintable(loader.errorString());
    FakeFrameworkTools tools;
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    QSignalSpy spy(plugin, SIGNAL(vcaMetadataChanged(QString)));
    ASSERT_TRUE(spy.isValid());
    const QDir dir(folder.path());
    const QString rules = dir.filePath("live/cam7.xml");

    ASSERT_TRUE(writeFile(rules, "<created/>"));
    ASSERT_TRUE(spy.wait(5000));
    ASSERT_TRUE(writeFile(rules, "<modified/>"));
    ASSERT_TRUE(spy.wait(5000));
    // The way editors save: a new file renamed over the old one, which drops out of the watch.
    ASSERT_TRUE(writeFile(dir.filePath("live/cam7.tmp"), "<replaced/>"));
    ASSERT_EQ(std::rename(qPrintable(dir.filePath("live/cam7.tmp")), qPrintable(rules)), 0);
    ASSERT_TRUE(spy.wait(5000));
    ASSERT_TRUE(writeFile(rules, "<modified again/>"));
    ASSERT_TRUE(spy.wait(5000));
    // Any repeat for cam7 would come before the report of a later file.
    ASSERT_TRUE(writeFile(dir.filePath("live/sentinel.xml"), "<s/>"));
    ASSERT_TRUE(spy.wait(5000));

    QStringList cameras;
    for (const QList<QVariant>& arguments : std::as_const(spy))
        cameras.append(arguments.value(0).toString());
    EXPECT_EQ(cameras, (QStringList{"cam7", "cam7", "cam7", "cam7", "sentinel"}));
}

} // namespace
