#pragma once

#include <QObject>

class QSocketNotifier;

// Leaves the application's event loop on SIGINT or SIGTERM, so that serve shuts down cleanly.
class QuitOnSignal : public QObject {
    Q_OBJECT

public:
    QuitOnSignal();
    ~QuitOnSignal() override;

private:
    QSocketNotifier* notifier = nullptr;
};
