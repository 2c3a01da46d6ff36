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
    // The first field the caller gave that could change the request's framing or add to it, in
    // words; nullptr when there is none. A user name or password may hold no control character,
    // a header name must be an HTTP token, and a header value, the content type and a bearer
    // token may hold no CR, LF or NUL.
    static const char* unsafeField(const WendrelRequest& request);
};
