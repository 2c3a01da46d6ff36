#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"

#include <gtest/gtest.h>

namespace {

// Plays the VCA plugin for signal connections.
class VcaPluginStandIn : public QObject {
    Q_OBJECT
signals:
    void vcaMetadataChanged(const QString& cameraID);
};

} // namespace

TEST(PluginQuenvarTest, InitialisesEveryTimeItIsAsked)
{
    FakeFrameworkTools tools;
    PluginQuenvar plugin;
    EXPECT_TRUE(plugin.InitialPluginBase(&tools));
    EXPECT_TRUE(plugin.InitialPluginBase(&tools));
}

TEST(PluginQuenvarTest, AllPluginLoadedConnectsTheVcaChangeSignal)
{
    FakeFrameworkTools tools;
    VcaPluginStandIn vca;
    tools.registerPlugin(VCA_PLUGIN_ID, &vca);
    PluginQuenvar plugin;
    plugin.InitialPluginBase(&tools);
    plugin.AllPluginLoaded();

    ASSERT_EQ(tools.connections.size(), 1);
    const auto& connection = tools.connections.first();
    EXPECT_EQ(connection.pluginId, VCA_PLUGIN_ID);
    EXPECT_EQ(connection.signal, QByteArray("2vcaMetadataChanged(const QString &)"));
    EXPECT_EQ(connection.receiver, &plugin);
    EXPECT_EQ(connection.method, QByteArray("1vcaMetadataChanged(const QString &)"));
    EXPECT_EQ(connection.connectionType, static_cast<int>(Qt::AutoConnection));
    EXPECT_TRUE(connection.connected);
}

#include "PluginQuenvarTest.moc"
