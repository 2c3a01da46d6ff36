#pragma once

#include "WendrelRequest.h"

#include <QByteArray>

// The bytes of a request as they go on the wire, beside the URL rules of WendrelUrl.
class WendrelRequestWriter {
public:
    // Request line, Host, the caller's headers but those that the request line and body settle,
    // content type, the Authorization value when there is one, Content-Length and body. Nothing
    // carries over from one request to the next: no credentials but the request's own, and no
    // cookies.
    static QByteArray write(const WendrelRequest& request, const QByteArray& target,
                            const QByteArray& authorization);
};
