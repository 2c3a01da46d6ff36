#pragma once

#include "AnsweringHttpClient.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <future>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

// Answers each request of the host forms with success, in order, on a thread of its own, as the
// real client does: "zoom=2 maxratio=20" to a ratio query, "OK" to the rest. The first Get whose
// path holds slowMarker is slow: it holds its caller (a reply callback on the client's thread)
// until the test releases it. Destroyed on its own thread (its last holder let go in a reply
// callback), it cannot join itself: the thread then ends on its own.
class ThreadedHttpClient : public AnsweringHttpClient {
public:
    static constexpr std::chrono::seconds DEADLINE{15};

    // Shared with the thread and the test, which may each outlive the client.
    struct Shared {
        std::mutex mutex;
        std::condition_variable wake;
        std::deque<std::pair<QString, HttpReplyCallback>> pending;
        bool stopping = false;
        std::promise<void> slowEntered;
        std::promise<void> slowReleased;
        std::promise<void> finished;
    };

    explicit ThreadedHttpClient(QString slowMarker)
        : AnsweringHttpClient(nullptr)
        , slowMarker(std::move(slowMarker))
        , thread(run, shared) {}

    ~ThreadedHttpClient() override {
        std::deque<std::pair<QString, HttpReplyCallback>> pending;
        {
            std::lock_guard<std::mutex> lock(shared->mutex);
            shared->stopping = true;
            pending.swap(shared->pending);
        }
        shared->wake.notify_all();
        if (thread.get_id() == std::this_thread::get_id())
            thread.detach();
        else
            thread.join();
        // What is still pending is cancelled, as the real client does when it goes.
        for (const auto& request : pending)
            request.second(QNetworkReply::OperationCanceledError, {}, {}, false);
    }

    std::shared_ptr<Shared> state() const { return shared; }

    using AnsweringHttpClient::Get;
    using AnsweringHttpClient::Post;
    bool Get(const QString&, const QString& path, quint16, bool, const QString&, const QString&,
             HttpReplyCallback callback, uint, const QStringList&) override {
        if (path.contains(slowMarker) && !slowSeen) {
            slowSeen = true;
            shared->slowEntered.set_value();
            shared->slowReleased.get_future().wait_for(DEADLINE);
        }
        return enqueue(path, std::move(callback));
    }
    bool Post(const QString&, const QByteArray&, const QString& path, quint16, bool, const QString&,
              const QString&, const QString&, HttpReplyCallback callback, uint) override {
        return enqueue(path, std::move(callback));
    }

private:
    bool enqueue(const QString& path, HttpReplyCallback callback) {
        {
            std::lock_guard<std::mutex> lock(shared->mutex);
            if (shared->stopping)
                return false;
            shared->pending.emplace_back(path, std::move(callback));
        }
        shared->wake.notify_all();
        return true;
    }

    static void run(std::shared_ptr<Shared> shared) {
        for (;;) {
            std::pair<QString, HttpReplyCallback> request;
            {
                std::unique_lock<std::mutex> lock(shared->mutex);
                shared->wake.wait(lock,
                                  [&] { return shared->stopping || !shared->pending.empty(); });
                if (shared->stopping)
                    break;
                request = std::move(shared->pending.front());
                shared->pending.pop_front();
            }
            // Outside the lock: the callback may hold the client's last reference.
            request.second(QNetworkReply::NoError, {},
                           request.first.contains("getratio") ? "zoom=2\nmaxratio=20\n" : "OK\n",
                           true);
        }
        shared->finished.set_value();
    }

    const QString slowMarker;
    bool slowSeen = false; // touched on the client's thread only
    const std::shared_ptr<Shared> shared = std::make_shared<Shared>();
    std::thread thread;
};
