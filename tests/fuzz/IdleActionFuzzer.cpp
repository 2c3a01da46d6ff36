// The idle-action answer parser, through getPTZIdleAction, on any camera answer.
#include "CameraFuzzing.h"

#include <QRegularExpression>

#include <cstdlib>

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv) {
    CameraFuzzing::initialise(argc, argv);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const QRegularExpression digits(QStringLiteral("^\\d+$"));
    const QByteArray body(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    for (const auto outcome : {QNetworkReply::NoError, QNetworkReply::ContentNotFoundError}) {
        CameraFuzzing::prepare(outcome, body);
        int calls = 0;
        CameraFuzzing::proxy().getPTZIdleAction(
            CameraFuzzing::params(), [&](bool, const QVariantMap& result) {
                ++calls;
                // At most the two keys, each holding digits only, "enabled" a single one.
                const QString enabled = result.value(QStringLiteral("enabled")).toString();
                const QString interval = result.value(QStringLiteral("interval")).toString();
                if (result.size() > 2 || enabled.size() > 1 ||
                    (!enabled.isEmpty() && !digits.match(enabled).hasMatch()) ||
                    (!interval.isEmpty() && !digits.match(interval).hasMatch()))
                    std::abort();
            });
        CameraFuzzing::expectOneCall(calls);
    }
    return 0;
}
