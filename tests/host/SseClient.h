#pragma once

#include <QJsonObject>
#include <QList>
#include <QString>

#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

namespace httplib {
class Client;
}

// Reads the event stream of one subscriber of quenvar-host serve, on a thread of its own.
class SseClient {
public:
    struct Event {
        QString name;
        QJsonObject data;
    };

    SseClient(quint16 port, const QString& subscriberId);
    ~SseClient();

    // The stream's opening comment arrived: the host has subscribed.
    bool waitUntilOpen(int timeoutMs = 10000);
    bool waitForEvents(int count, int timeoutMs = 10000);
    QList<Event> events() const;
    // Closes the connection at once, as a client that goes away would.
    void close();

private:
    void receive(const char* data, size_t length);

    std::unique_ptr<httplib::Client> client;
    mutable std::mutex mutex;
    std::condition_variable changed;
    std::string buffer;
    bool open = false;
    QList<Event> received;
    std::thread reader;
};
