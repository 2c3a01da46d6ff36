#pragma once

#include "AnsweringHttpClient.h"
#include "camera/CameraProxy.h"

#include <QVariantMap>

// The set-up the camera fuzzers share: one proxy for the whole run, whose requests are answered
// at once: the first with the fuzz input, every later one with success and an empty body.
class CameraFuzzing {
public:
    // From LLVMFuzzerInitialize: the proxy's default client wants an application object.
    static void initialise(int* argc, char*** argv);
    static CameraProxy& proxy();
    // The answer to the next operation's first request; forgets the paths asked for.
    static void prepare(QNetworkReply::NetworkError outcome, const QByteArray& body);
    // The paths asked for since prepare().
    static QStringList paths();
    // A complete request: camera address, credentials and the area-zoom values.
    static QVariantMap params();
    // Aborts unless exactly one callback came: the fuzzer then reports the input.
    static void expectOneCall(int calls);
};
