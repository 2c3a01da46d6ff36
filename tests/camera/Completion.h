// Runs any ICameraProxy operation and records how it completed, on whatever thread that happens.
#pragma once

#include "camera/ICameraProxy.h"

#include <QDebug>
#include <QStringList>
#include <QVariant>

#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

// In the order of the operations in start().
enum class Operation {
    GetIdleAction,
    SetIdleAction,
    GetTrackingType,
    SetTrackingType,
    Stop,
    AreaZoom,
    GotoPreset,
    GetPresetList
};

// The whole outcome as one text, so that a test compares it in one go; the result is shown with
// its types, so a number where text belongs shows up.
inline std::string outcome(int calls, bool success, const QVariant& result = QVariant()) {
    QString text;
    QDebug(&text).nospace() << calls << "x " << success << ' ' << result;
    return text.toStdString();
}

class Completion {
public:
    void record(bool ok, const QVariant& value = QVariant()) {
        std::lock_guard<std::mutex> lock(mutex);
        ++calls;
        success = ok;
        result = value;
        done.notify_all();
    }

    bool wait() {
        std::unique_lock<std::mutex> lock(mutex);
        return done.wait_for(lock, std::chrono::seconds(15), [this] { return calls > 0; });
    }

    std::string outcome() {
        std::lock_guard<std::mutex> lock(mutex);
        return ::outcome(calls, success, result);
    }

private:
    std::mutex mutex;
    std::condition_variable done;
    int calls = 0;
    bool success = false;
    QVariant result;
};

inline std::shared_ptr<Completion> start(Operation operation, ICameraProxy& proxy,
                                         const QVariantMap& params) {
    auto completion = std::make_shared<Completion>();
    // Fits every completion callback: the flag, then nothing, a map, a variant or a list.
    const auto record = [completion](bool ok, const auto&... result) {
        completion->record(ok, QVariant(result)...);
    };
    const std::function<void()> operations[] = {
        [&] { proxy.getPTZIdleAction(params, record); },
        [&] { proxy.setPTZIdleAction(params, record); },
        [&] { proxy.getPTZTrackingType(params, record); },
        [&] { proxy.setPTZTrackingType(params, record); },
        [&] { proxy.stopPTZMovement(params, record); },
        [&] { proxy.areaZoom(params, record); },
        [&] { proxy.gotoSmartTrackingAdvPreset(params, record); },
        [&] { proxy.getSmartTrackingAdvPresetList(params, record); },
    };
    operations[static_cast<int>(operation)]();
    return completion;
}
