#pragma once

#include <QByteArray>
#include <QSet>
#include <QStringList>

// Who may use the HTTP front: a request must name the front in its Host header, come from one of
// the front's own origins when it names an origin at all, and carry the bearer token. A web page
// of another site then can neither read an answer (a rebound DNS name is a foreign Host) nor
// send a command (its Origin is foreign, and it does not know the token).
class FrontGate {
public:
    struct Verdict {
        int status = 0; // 0: admitted; otherwise the HTTP status to refuse with
        const char* reason = nullptr;
    };

    // Admits nothing.
    FrontGate() = default;
    // extraNames: names the front answers to besides 127.0.0.1, localhost and ::1 (its listen
    // address, names the user allowed), each without a port; IPv6 addresses with or without
    // brackets.
    FrontGate(const QByteArray& token, const QStringList& extraNames, quint16 port);

    // Each argument is the header's value, or null when the request has none. The names are
    // checked before the token, so that a foreign page learns nothing about it.
    Verdict admit(const char* host, const char* origin, const char* authorization) const;

private:
    QSet<QByteArray> authorities; // "name:port", in lower case
    QByteArray tokenDigest;
};
