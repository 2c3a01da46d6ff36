#pragma once

#include "ConnectionPark.h"
#include "EventQueue.h"

#include <QByteArray>

#include <functional>
#include <memory>
#include <sys/types.h>

// The body of one event stream of the HTTP front (Server-Sent Events): a comment when it opens,
// then each event of its queue, and a comment line on each tick of the front's clock while
// nothing else is written, which is how a client that went away is noticed. With nothing to
// write it parks its connection until an event, a tick or the end comes. Runs on the server's
// thread.
class HttpEventStream {
public:
    HttpEventStream(std::shared_ptr<EventQueue> queue, std::shared_ptr<ConnectionPark> park,
                    std::function<void()> onEnd);
    ~HttpEventStream(); // calls onEnd
    HttpEventStream(const HttpEventStream&) = delete;
    HttpEventStream& operator=(const HttpEventStream&) = delete;

    // Copies up to max bytes of the stream to buffer. Returns how many, 0 when the connection is
    // parked, or -1 at the end: the queue or the park was closed.
    ssize_t read(char* buffer, size_t max);

private:
    enum class State { Opening, Open, Ended };

    void refill();

    std::shared_ptr<EventQueue> queue;
    std::shared_ptr<ConnectionPark> park;
    std::function<void()> onEnd;
    State state = State::Opening;
    QByteArray pending; // what is still to be written of the current event or comment
    qsizetype written = 0;
};
