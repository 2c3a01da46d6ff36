// A server's WWW-Authenticate text on any bytes: the chosen challenge keeps to its limits, and an
// answer to it never holds a control character, whatever the server sent.
#include "WendrelAuth.h"
#include "WendrelChallenge.h"

#include <QByteArray>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QByteArray text(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    if (const auto challenges = WendrelChallenge::parse(text)) {
        if (challenges->size() > size_t(WendrelChallenge::maxChallenges))
            std::abort();
    }
    const auto chosen = WendrelChallenge::choose(text);
    if (!chosen)
        return 0;
    for (const QByteArray* value : {&chosen->realm, &chosen->nonce, &chosen->opaque}) {
        if (value->size() > WendrelChallenge::maxValueBytes || WendrelChallenge::hasControl(*value))
            std::abort();
    }
    const QByteArray answer =
        WendrelAuth::respond(*chosen, "GET", "/cgi-bin/a.cgi?b=1", QStringLiteral("admin\"\\ é"),
                             QStringLiteral("pw"), "0a4f113b", 1);
    if (WendrelChallenge::hasControl(answer))
        std::abort();
    return 0;
}
