// The tracking-type answer parser, through getPTZTrackingType, on any camera answer.
#include "CameraFuzzing.h"

#include <cstdlib>

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv) {
    CameraFuzzing::initialise(argc, argv);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QByteArray body(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    for (const auto outcome : {QNetworkReply::NoError, QNetworkReply::RemoteHostClosedError}) {
        CameraFuzzing::prepare(outcome, body);
        int calls = 0;
        CameraFuzzing::proxy().getPTZTrackingType(
            CameraFuzzing::params(), [&](bool, const QVariantMap& result) {
                ++calls;
                // Always "type" and the request's "nodeID", the type without outer blanks.
                const QString type = result.value(QStringLiteral("type")).toString();
                if (result.size() != 2 ||
                    result.value(QStringLiteral("nodeID")) != QStringLiteral("node1") ||
                    type != type.trimmed())
                    std::abort();
            });
        CameraFuzzing::expectOneCall(calls);
    }
    return 0;
}
