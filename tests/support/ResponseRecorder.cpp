#include "ResponseRecorder.h"

#include <QDebug>

bool ResponseRecorder::Response::operator==(const Response& other) const {
    return handled == other.handled && code == other.code && message == other.message &&
           payload == other.payload;
}

ResponseCallback ResponseRecorder::callback() const {
    return [recorded = recorded](bool handled, const QString& code, const QString& message,
                                 const QVariant& payload) {
        recorded->append({handled, code, message, payload});
    };
}

void PrintTo(const ResponseRecorder::Response& response, std::ostream* out) {
    QString text;
    QDebug(&text) << response.handled << response.code << response.message << response.payload;
    *out << text.toStdString();
}
