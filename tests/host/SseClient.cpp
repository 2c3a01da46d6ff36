#include "SseClient.h"

#include <QJsonDocument>
#include <QUrl>

#include <httplib.h>

SseClient::SseClient(quint16 port, const QString& subscriberId)
    : client(std::make_unique<httplib::Client>("127.0.0.1", port)) {
    const std::string path =
        "/api/events?subscriber=" + QUrl::toPercentEncoding(subscriberId).toStdString();
    reader = std::thread([this, path]() {
        client->Get(path, [this](const char* data, size_t length) {
            receive(data, length);
            return true;
        });
    });
}

SseClient::~SseClient() {
    close();
}

bool SseClient::waitUntilOpen(int timeoutMs) {
    std::unique_lock<std::mutex> lock(mutex);
    return changed.wait_for(lock, std::chrono::milliseconds(timeoutMs), [this]() { return open; });
}

bool SseClient::waitForEvents(int count, int timeoutMs) {
    std::unique_lock<std::mutex> lock(mutex);
    return changed.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                            [this, count]() { return received.size() >= count; });
}

QList<SseClient::Event> SseClient::events() const {
    std::lock_guard<std::mutex> lock(mutex);
    return received;
}

void SseClient::close() {
    client->stop();
    if (reader.joinable())
        reader.join();
}

void SseClient::receive(const char* data, size_t length) {
    std::lock_guard<std::mutex> lock(mutex);
    buffer.append(data, length);
    // Blocks end with a blank line; comment lines (":") only keep the stream alive.
    for (size_t end = buffer.find("\n\n"); end != std::string::npos; end = buffer.find("\n\n")) {
        const QString block = QString::fromStdString(buffer.substr(0, end));
        buffer.erase(0, end + 2);
        Event event;
        for (const QString& line : block.split(QLatin1Char('\n'))) {
            if (line.startsWith(QStringLiteral(": subscribed")))
                open = true;
            else if (line.startsWith(QStringLiteral("event: ")))
                event.name = line.mid(7);
            else if (line.startsWith(QStringLiteral("data: ")))
                event.data = QJsonDocument::fromJson(line.mid(6).toUtf8()).object();
        }
        if (!event.name.isEmpty())
            received.append(event);
    }
    changed.notify_all();
}
