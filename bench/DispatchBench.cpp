// Request() for each camera command through a proxy that completes at once, against building the
// request's parameter map alone.
#include "ImmediateCameraProxy.h"
#include "NullFrameworkTools.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"

#include <benchmark/benchmark.h>

namespace {

const QString* const COMMANDS[] = {
    &CMD_RETRIEVE_PTZ_IDLE_ACTION,
    &CMD_SET_PTZ_IDLE_ACTION,
    &CMD_RETRIEVE_PTZ_TRACKING_TYPE,
    &CMD_SET_PTZ_TRACKING_TYPE,
    &CMD_STOP_PTZ_MOVEMENT,
    &CMD_AREA_ZOOM,
    &CMD_GOTO_SMART_TRACKING_ADV_PRESET,
    &CMD_GET_SMART_TRACKING_ADV_PRESET_LIST,
};

QVariant requestParams() {
    QVariantMap params;
    params.insert(KEY_HOST, QStringLiteral("192.0.2.10"));
    params.insert(KEY_PORT, 8080);
    params.insert(KEY_USER, QStringLiteral("admin"));
    params.insert(KEY_PASS, QStringLiteral("secret"));
    params.insert(KEY_USE_SSL, false);
    params.insert(KEY_PRESET_NAME, QStringLiteral("Home"));
    return params;
}

void BM_BuildParams(benchmark::State& state) {
    for (auto _ : state)
        benchmark::DoNotOptimize(requestParams());
}
BENCHMARK(BM_BuildParams);

void BM_Request(benchmark::State& state) {
    const QString& command = *COMMANDS[state.range(0)];
    NullFrameworkTools tools;
    PluginQuenvar plugin;
    plugin.InitialPluginBase(&tools);
    plugin.setCameraProxy(std::make_shared<ImmediateCameraProxy>());
    const RequestSenderInfo sender;
    int answers = 0;
    const ResponseCallback callback = [&answers](bool, const QString&, const QString&,
                                                 const QVariant&) { ++answers; };
    for (auto _ : state)
        plugin.Request(command, requestParams(), sender, callback);
    if (answers != state.iterations())
        state.SkipWithError("an answer went missing");
    state.SetLabel(command.toStdString());
}
BENCHMARK(BM_Request)->DenseRange(0, 7);

} // namespace

BENCHMARK_MAIN();
