// The area-zoom ratio reply, through areaZoom, on any camera answer to the ratio query.
#include "CameraFuzzing.h"

#include <cstdlib>

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv) {
    CameraFuzzing::initialise(argc, argv);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const QString setRatio = QStringLiteral("&setratio=");
    const QByteArray body(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    CameraFuzzing::prepare(QNetworkReply::NoError, body);
    int calls = 0;
    bool succeeded = false;
    CameraFuzzing::proxy().areaZoom(CameraFuzzing::params(), [&](bool ok) {
        ++calls;
        succeeded = ok;
    });
    CameraFuzzing::expectOneCall(calls);
    // Whatever the ratios read, the zoom is centred and then set to a number.
    const QStringList paths = CameraFuzzing::paths();
    const qsizetype ratioAt = paths.value(2).indexOf(setRatio);
    bool number = false;
    if (ratioAt >= 0)
        paths.value(2).mid(ratioAt + setRatio.size()).toDouble(&number);
    if (!succeeded || paths.size() != 3 || !number)
        std::abort();
    return 0;
}
