#pragma once

#include <QProcess>

#if defined(Q_OS_LINUX)
#include <csignal>
#include <sys/prctl.h>
#endif

// Simulators and hosts that tests start go when the test process goes, also when it crashes.
inline void endWithTestProcess(QProcess& process) {
#if defined(Q_OS_LINUX)
    process.setChildProcessModifier([] { prctl(PR_SET_PDEATHSIG, SIGKILL); });
#else
    Q_UNUSED(process);
#endif
}
