#include "WendrelFailure.h"

QByteArray WendrelFailure::peerText(QByteArrayView text) {
    static const char HEX[] = "0123456789abcdef";
    QByteArray result;
    result.reserve(qMin(text.size(), maxPeerText) + 8);
    for (const char c : text) {
        const auto byte = static_cast<unsigned char>(c);
        const qsizetype width = byte < 0x20 || byte >= 0x7f ? 4 : byte == '\\' ? 2 : 1;
        if (result.size() + width > maxPeerText)
            return result.append("...");
        if (width == 4)
            result.append("\\x").append(HEX[byte >> 4]).append(HEX[byte & 0xf]);
        else if (width == 2)
            result.append("\\\\");
        else
            result.append(c);
    }
    return result;
}
