#include "FakeResponser.h"

void FakeResponser::Respond(bool, const QString&, const QString&, const QVariant&) {
    ++count;
}
