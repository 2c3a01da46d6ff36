#include "PluginQuenvar.h"

#include "BuildPaths.h"
#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvarDefs.h"
#include "ResponseRecorder.h"

#include <QJsonObject>
#include <QPluginLoader>

#include <gtest/gtest.h>

namespace {

TEST(PluginQuenvarTest, LoadsAsOneInstanceOfTheHostInterface) {
    QPluginLoader loader(BuildPaths::plugins() + QStringLiteral("/libPluginQuenvar.so"));
    const QJsonObject meta = loader.metaData();
    EXPECT_EQ(meta.value("IID").toString(), QUENVAR_PLUGIN_INTERFACE_IID);
    EXPECT_EQ(meta.value("className").toString(), "PluginQuenvar");
    EXPECT_EQ(meta.value("MetaData").toObject(), QJsonObject({{"PluginID", PLUGIN_ID}}));

    QObject* instance = loader.instance();
    ASSERT_NE(instance, nullptr) << qPrintable(loader.errorString());
    EXPECT_EQ(loader.instance(), instance);
    EXPECT_NE(qobject_cast<IPluginObjectBase*>(instance), nullptr);
}

// Services set before a second InitialPluginBase, and the first tools, are out of use after it.
TEST(PluginQuenvarTest, SecondInitialisationReplacesBothServicesAndTheTools) {
    FakeFrameworkTools first;
    FakeFrameworkTools second;
    QStringList delivered;
    first.emitter = [&delivered](PluginObjBase_EventInfoBase*) { delivered << "first"; };
    second.emitter = [&delivered](PluginObjBase_EventInfoBase*) { delivered << "second"; };
    PluginQuenvar plugin;
    ASSERT_TRUE(plugin.InitialPluginBase(&first));
    const auto camera = std::make_shared<FakeCameraProxy>();
    const auto rules = std::make_shared<FakeVcaRuleRetriever>();
    plugin.setCameraProxy(camera);
    plugin.setVcaRuleRetriever(rules);
    FakeResponser responser;
    plugin.SubscribeEventBlock("A", EVENT_LIVE_VCA_RULE_CHANGED, {}, {}, responser);
    ASSERT_TRUE(plugin.InitialPluginBase(&second));

    // The new camera proxy refuses an unaddressable port at once.
    ResponseRecorder answers;
    plugin.Request("stopPTZMovement", QVariantMap{{"port", -1}}, {}, answers.callback());
    plugin.handleVCAMetadataChanged("cam-1");
    EXPECT_EQ(answers.responses(), (QList<ResponseRecorder::Response>{{true, "-1", "", {}}}));
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_EQ(first.channel.count(), 0);
    ASSERT_EQ(second.channel.count(), 1);
    second.channel.reply(0, true, "", "relay", "0", "", true);
    EXPECT_EQ(delivered, QStringList{"second"});
}

} // namespace
