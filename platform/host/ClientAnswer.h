#pragma once

#include <QString>
#include <QVariant>

// A plugin's answer to one client request, as its ResponseCallback delivered it.
struct ClientAnswer {
    bool handled = false;
    QString code;
    QString message;
    QVariant payload;
};
