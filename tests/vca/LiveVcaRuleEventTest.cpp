#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"

#include <gtest/gtest.h>

namespace {

class IgnoredResponser : public IResponser {
public:
    void Respond(bool, const QString&, const QString&, const QVariant&) override {}
};

struct Delivered {
    QString subscriberId;
    QString eventName;
    QVariant eventData;
};

TEST(LiveVcaRuleEventTest, FailedFetchStillReachesEverySubscriber) {
    FakeFrameworkTools tools;
    QList<Delivered> delivered;
    tools.emitter = [&delivered](PluginObjBase_EventInfoBase* event) {
        const auto* signal = dynamic_cast<PluginObjBase_EventSignalInfo*>(event);
        ASSERT_NE(signal, nullptr);
        delivered.append({signal->subscriberId, signal->eventName, signal->eventData});
    };
    PluginQuenvar plugin;
    ASSERT_TRUE(plugin.InitialPluginBase(&tools));
    IgnoredResponser responser;
    plugin.SubscribeEventBlock("A", "liveVCARuleChanged", {}, {}, responser);
    plugin.SubscribeEventBlock("B", "liveVCARuleChanged", {}, {}, responser);

    plugin.handleVCAMetadataChanged("cam1");
    ASSERT_EQ(tools.channel.count(), 1);
    tools.channel.reply(0, false, QString(), "relay", "80000404", QString(), true);

    const QVariant expected(
        QVariantMap{{"camID", ""},
                    {"relayPath", "relay"},
                    {"isJSON", false},
                    {"rules", "<?xml version='1.0' encoding='UTF-8'?><Rules></Rules>"}});
    ASSERT_EQ(delivered.size(), 2);
    EXPECT_EQ(delivered.at(0).subscriberId, "A");
    EXPECT_EQ(delivered.at(1).subscriberId, "B");
    for (const Delivered& event : delivered) {
        EXPECT_EQ(event.eventName, "liveVCARuleChanged");
        EXPECT_EQ(event.eventData, expected);
    }
}

} // namespace
