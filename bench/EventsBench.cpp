// One event delivered to N subscribers through a counting emitter, against building the same
// records without delivering them.
#include "PluginQuenvarDefs.h"
#include "SubscriberList.h"

#include <QDateTime>

#include <benchmark/benchmark.h>

namespace {

QVariant eventPayload() {
    QVariantMap payload;
    payload.insert(VCA_KEY_CAM_ID, QStringLiteral("cam-1"));
    payload.insert(VCA_KEY_RELAY_PATH, VCA_PLUGIN_ID);
    payload.insert(VCA_KEY_IS_JSON, true);
    payload.insert(VCA_KEY_RULES, QStringLiteral("{\"Line\":{\"l1\":{\"x\":1}}}"));
    return payload;
}

QStringList subscriberIds(int count) {
    QStringList ids;
    ids.reserve(count);
    for (int i = 0; i < count; ++i)
        ids.append(QStringLiteral("client-%1").arg(i));
    return ids;
}

void BM_BuildRecords(benchmark::State& state) {
    const QStringList ids = subscriberIds(static_cast<int>(state.range(0)));
    const QVariant payload = eventPayload();
    for (auto _ : state) {
        for (const QString& id : ids) {
            PluginObjBase_EventSignalInfo record;
            record.timestamp = QDateTime::currentMSecsSinceEpoch();
            record.eventName = EVENT_LIVE_VCA_RULE_CHANGED;
            record.eventData = payload;
            record.sourcePluginId = PLUGIN_ID;
            record.subscriberId = id;
            benchmark::DoNotOptimize(&record);
        }
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_BuildRecords)->Arg(1)->Arg(100)->Arg(10000);

void BM_EmitToAll(benchmark::State& state) {
    SubscriberList subscribers;
    for (const QString& id : subscriberIds(static_cast<int>(state.range(0))))
        subscribers.subscribe(id);
    qint64 delivered = 0;
    subscribers.setEmitter([&delivered](PluginObjBase_EventInfoBase* record) {
        benchmark::DoNotOptimize(record);
        ++delivered;
    });
    const QVariant payload = eventPayload();
    for (auto _ : state)
        subscribers.emitToAll(payload, EVENT_LIVE_VCA_RULE_CHANGED, PLUGIN_ID);
    if (delivered != state.iterations() * state.range(0))
        state.SkipWithError("a delivery went missing");
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_EmitToAll)->Arg(1)->Arg(100)->Arg(10000);

} // namespace

BENCHMARK_MAIN();
