// A server's WWW-Authenticate text on any bytes: the chosen challenge keeps to its limits, and an
// answer to it never holds a control character, whatever the server sent.
#include "WendrelAuth.h"
#include "WendrelChallenge.h"

#include <QByteArray>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

namespace {

bool hasControl(const QByteArray& text) {
    for (const char c : text) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            return true;
    }
    return false;
}

} // namespace

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
        if (value->size() > WendrelChallenge::maxValueBytes || hasControl(*value))
            std::abort();
    }
    const QByteArray answer =
        WendrelAuth::respond(*chosen, "GET", "/cgi-bin/a.cgi?b=1", QStringLiteral("admin\"\\ é"),
                             QStringLiteral("pw"), "0a4f113b", 1);
    if (hasControl(answer))
        std::abort();
    return 0;
}
