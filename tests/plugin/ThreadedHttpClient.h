#pragma once

#include "ISimpleHTTPClient.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <future>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

// The moments of a slow call, shared with a test that holds no reference to the client.
struct SlowCall {
    static constexpr std::chrono::seconds DEADLINE{15};

    bool waitUntilEntered() const {
        return enteredFuture.wait_for(DEADLINE) == std::future_status::ready;
    }
    void release() { released.set_value(); }

    std::promise<void> entered;
    std::shared_future<void> enteredFuture = entered.get_future().share();
    std::promise<void> released;
    std::shared_future<void> releasedFuture = released.get_future().share();
};

// Answers each request with success, in order, on a thread of its own, as the real client does.
// Its answer to a ratio query is "zoom=2 maxratio=20". The first Get whose path holds slowMarker
// is slow: the call holds its caller (a reply callback on the client's thread) until the test
// releases it. Destroyed on its own thread (its last holder let go in a reply callback), it cannot
// join itself: the thread then ends on its own and finished() tells when.
class ThreadedHttpClient : public ISimpleHTTPClient {
public:
    ThreadedHttpClient(QString slowMarker, std::shared_ptr<SlowCall> slow)
        : slowMarker(std::move(slowMarker))
        , slow(std::move(slow))
        , finishedFuture(state->finished.get_future().share())
        , thread(run, state) {}

    ~ThreadedHttpClient() override {
        std::deque<Pending> pending;
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            state->stopping = true;
            pending.swap(state->pending);
        }
        state->wake.notify_all();
        if (thread.get_id() == std::this_thread::get_id())
            thread.detach();
        else
            thread.join();
        // What is still pending is cancelled, as the real client does when it goes.
        for (const Pending& request : pending)
            request.callback(QNetworkReply::OperationCanceledError, {}, {}, false);
    }

    std::shared_future<void> finished() const { return finishedFuture; }

    bool Get(const QString&, const QString& path, quint16, bool, const QString&, const QString&,
             HttpReplyCallback callback, uint, const QStringList&) override {
        if (path.contains(slowMarker) && !slowSeen) {
            slowSeen = true;
            slow->entered.set_value();
            slow->releasedFuture.wait_for(SlowCall::DEADLINE);
        }
        return enqueue(path, std::move(callback));
    }
    bool Post(const QString&, const QByteArray&, const QString& path, quint16, bool, const QString&,
              const QString&, const QString&, HttpReplyCallback callback, uint) override {
        return enqueue(path, std::move(callback));
    }
    bool Get(const QString&, const QString&, const QString&, HttpReplyCallback, uint) override {
        return false;
    }
    bool Post(const QString&, const QByteArray&, const QString&, const QString&, const QString&,
              HttpReplyCallback, uint, const QStringList&) override {
        return false;
    }
    bool PostWithOAuth(const QString&, const QByteArray&, const QString&, quint16, bool,
                       const QString&, const QString&, const QString&, HttpReplyCallback,
                       uint) override {
        return false;
    }
    bool Delete(const QString&, const QByteArray&, const QString&, quint16, bool, const QString&,
                const QString&, const QString&, HttpReplyCallback, uint) override {
        return false;
    }
    bool Put(const QString&, const QByteArray&, const QString&, quint16, bool, const QString&,
             const QString&, const QString&, HttpReplyCallback, uint) override {
        return false;
    }

private:
    struct Pending {
        QString path;
        HttpReplyCallback callback;
    };
    // Shared with the thread, which may outlive this object.
    struct State {
        std::mutex mutex;
        std::condition_variable wake;
        std::deque<Pending> pending;
        bool stopping = false;
        std::promise<void> finished;
    };

    bool enqueue(const QString& path, HttpReplyCallback callback) {
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            if (state->stopping)
                return false;
            state->pending.push_back({path, std::move(callback)});
        }
        state->wake.notify_all();
        return true;
    }

    static void run(std::shared_ptr<State> state) {
        for (;;) {
            Pending request;
            {
                std::unique_lock<std::mutex> lock(state->mutex);
                state->wake.wait(lock, [&] { return state->stopping || !state->pending.empty(); });
                if (state->stopping)
                    break;
                request = std::move(state->pending.front());
                state->pending.pop_front();
            }
            const QByteArray body = request.path.contains(QLatin1String("getratio"))
                                        ? QByteArrayLiteral("zoom=2\nmaxratio=20\n")
                                        : QByteArrayLiteral("OK\n");
            request.callback(QNetworkReply::NoError, {}, body, true);
        }
        state->finished.set_value();
    }

    const QString slowMarker;
    const std::shared_ptr<SlowCall> slow;
    bool slowSeen = false; // touched on the client's thread only
    std::shared_ptr<State> state = std::make_shared<State>();
    std::shared_future<void> finishedFuture;
    std::thread thread;
};
