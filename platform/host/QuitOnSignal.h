#pragma once

#include <QObject>

class QSocketNotifier;

// Leaves the application's event loop on SIGINT or SIGTERM, so that serve shuts down cleanly.
// Further signals, also after this object is gone, change nothing: the process goes on shutting
// down and exits as it would have.
class QuitOnSignal : public QObject {
    Q_OBJECT

public:
    QuitOnSignal();
    ~QuitOnSignal() override;

    // Whether a signal came; one that came before the event loop ran makes exec() pointless.
    bool received() const { return signalled; }

private:
    QSocketNotifier* notifier = nullptr;
    bool signalled = false;
};
