// The preset-list answer parser, through getSmartTrackingAdvPresetList, on any camera answer.
#include "CameraFuzzing.h"

#include <cstdlib>

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv) {
    CameraFuzzing::initialise(argc, argv);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QByteArray body(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    for (const auto outcome : {QNetworkReply::NoError, QNetworkReply::TimeoutError}) {
        CameraFuzzing::prepare(outcome, body);
        int calls = 0;
        CameraFuzzing::proxy().getSmartTrackingAdvPresetList(CameraFuzzing::params(),
                                                             [&](bool ok, QList<QString> presets) {
                                                                 ++calls;
                                                                 // A failed request lists nothing,
                                                                 // whatever its body.
                                                                 if (!ok && !presets.isEmpty())
                                                                     std::abort();
                                                             });
        CameraFuzzing::expectOneCall(calls);
    }
    return 0;
}
