// The answer reader on any bytes: the first byte seeds where the rest is cut, the rest is what a
// server sends before it closes. Read whole and read in pieces, it must come to the same end, keep
// to its limits, and never crash.
#include "WendrelResponseReader.h"

#include <QByteArray>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <random>
#include <vector>

namespace {

using Reader = WendrelResponseReader;

const qint64 MAX_HEADER = 2048;
const qint64 MAX_BODY = 4096;

struct Result {
    Reader::State state;
    Reader::Failure failure;
    Reader::Answer answer;
    qsizetype used;
};

Result read(const char* data, qsizetype size, const std::vector<qsizetype>& cuts) {
    Reader reader(MAX_HEADER, MAX_BODY);
    qsizetype used = 0;
    qsizetype start = 0;
    std::vector<qsizetype> ends = cuts;
    ends.push_back(size);
    for (const qsizetype end : ends) {
        if (reader.state() != Reader::State::Reading)
            break;
        const qsizetype taken = reader.feed(data + start, end - start);
        if (taken > end - start)
            std::abort();
        used += taken;
        start = end;
    }
    reader.endOfInput();
    return {reader.state(), reader.failure(), reader.takeAnswer(), used};
}

bool sameAnswer(const Reader::Answer& a, const Reader::Answer& b) {
    return a.status == b.status && a.reason == b.reason && a.headers == b.headers &&
           a.trailers == b.trailers && a.challenges == b.challenges && a.location == b.location &&
           a.body == b.body && a.keepAlive == b.keepAlive;
}

// How much of a header the reader takes before a malformed byte stops it depends on the cuts, so
// an oversized malformed header may fail either way.
bool sameFailure(Reader::Failure a, Reader::Failure b) {
    const auto headerFault = [](Reader::Failure failure) {
        return failure == Reader::Failure::Malformed || failure == Reader::Failure::HeadersTooLarge;
    };
    return a == b || (headerFault(a) && headerFault(b));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1)
        return 0;
    const char* bytes = reinterpret_cast<const char*>(data + 1);
    const auto length = static_cast<qsizetype>(size - 1);
    std::minstd_rand random(data[0]);
    std::vector<qsizetype> cuts;
    if (length > 1) {
        for (int i = int(random() % 16); i > 0; --i)
            cuts.push_back(qsizetype(1 + random() % quint64(length - 1)));
        std::sort(cuts.begin(), cuts.end());
    }

    const Result whole = read(bytes, length, {});
    const Result pieces = read(bytes, length, cuts);
    if (whole.state != pieces.state || !sameFailure(whole.failure, pieces.failure))
        std::abort();
    if (whole.state == Reader::State::Complete &&
        (!sameAnswer(whole.answer, pieces.answer) || whole.used != pieces.used))
        std::abort();
    for (const Result* result : {&whole, &pieces}) {
        // Within the limits; each stored line adds ": " and CR LF to what was sent.
        if (result->state == Reader::State::Reading || result->answer.body.size() > MAX_BODY ||
            result->answer.headers.size() > MAX_HEADER + 4 ||
            result->answer.trailers.size() > MAX_HEADER + 4)
            std::abort();
    }
    return 0;
}
