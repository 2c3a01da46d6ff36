#include "HttpEventStream.h"

#include "HostJson.h"

#include <algorithm>
#include <cstring>

HttpEventStream::HttpEventStream(std::shared_ptr<EventQueue> queue,
                                 std::shared_ptr<ConnectionPark> park, std::function<void()> onEnd)
    : queue(std::move(queue))
    , park(std::move(park))
    , onEnd(std::move(onEnd)) {}

HttpEventStream::~HttpEventStream() {
    if (onEnd)
        onEnd();
}

ssize_t HttpEventStream::read(char* buffer, size_t max) {
    for (;;) {
        if (written == pending.size()) {
            pending.clear();
            written = 0;
            refill();
        }
        if (!pending.isEmpty()) {
            const size_t count = std::min(max, static_cast<size_t>(pending.size() - written));
            std::memcpy(buffer, pending.constData() + written, count);
            written += static_cast<qsizetype>(count);
            return static_cast<ssize_t>(count);
        }
        if (state == State::Ended)
            return -1;
        // A false park means something came meanwhile: look again.
        if (park->park())
            return 0;
    }
}

void HttpEventStream::refill() {
    if (state == State::Opening) {
        // First, so that the client knows the subscription stands.
        pending = ": subscribed\n\n";
        state = State::Open;
        return;
    }
    if (state == State::Ended)
        return;
    if (queue->isClosed() || park->isClosed()) {
        state = State::Ended;
        return;
    }
    if (const std::optional<HostEvent> event = queue->next(std::chrono::milliseconds(0))) {
        // A line break would end the field early; the data is JSON on one line.
        QByteArray name = event->eventName.toUtf8();
        name.replace('\r', ' ').replace('\n', ' ');
        pending = "event: " + name + "\ndata: " + HostJson::event(*event) + "\n\n";
        return;
    }
    if (park->takeTick())
        pending = ":\n\n";
}
