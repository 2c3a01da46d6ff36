#include "BuildPaths.h"
#include "PluginFramework.h"

#include <QJsonObject>
#include <QPluginLoader>

#include <gtest/gtest.h>

namespace {

QString pluginPath()
{
#if defined(_WIN32)
    return BuildPaths::plugins() + QStringLiteral("/PluginQuenvar.dll");
#else
    return BuildPaths::plugins() + QStringLiteral("/libPluginQuenvar.so");
#endif
}

} // namespace

TEST(PluginLoaderTest, MetaDataNamesInterfaceClassAndPluginId)
{
    QPluginLoader loader(pluginPath());
    const QJsonObject meta = loader.metaData();
    ASSERT_FALSE(meta.isEmpty()) << qPrintable(loader.errorString());
    EXPECT_EQ(meta.value("IID").toString(), QStringLiteral(QUENVAR_PLUGIN_INTERFACE_IID));
    EXPECT_EQ(meta.value("className").toString(), QStringLiteral("PluginQuenvar"));
    EXPECT_EQ(meta.value("MetaData").toObject().value("PluginID").toString(),
              QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73"));
}

TEST(PluginLoaderTest, InstanceIsSingleAndCastsToThePluginInterface)
{
    QPluginLoader loader(pluginPath());
    QObject* first = loader.instance();
    ASSERT_NE(first, nullptr) << qPrintable(loader.errorString());
    EXPECT_EQ(loader.instance(), first);
    EXPECT_EQ(QPluginLoader(pluginPath()).instance(), first);

    auto* plugin = qobject_cast<IPluginObjectBase*>(first);
    ASSERT_NE(plugin, nullptr);
    EXPECT_EQ(static_cast<QObject*>(plugin), first);
    EXPECT_EQ(first->qt_metacast("PluginQuenvar"), static_cast<void*>(plugin));
    EXPECT_STREQ(first->metaObject()->className(), "PluginQuenvar");
}
