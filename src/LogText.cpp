#include "LogText.h"

#include <QString>

namespace {

const QByteArray CUT_MARK = QByteArrayLiteral("...");

bool isControl(char32_t c) {
    return c < 0x20 || (c >= 0x7f && c <= 0x9f) || c == 0x2028 || c == 0x2029;
}

QByteArray escaped(char32_t c) {
    switch (c) {
    case '\\':
        return QByteArrayLiteral("\\\\");
    case '\n':
        return QByteArrayLiteral("\\n");
    case '\r':
        return QByteArrayLiteral("\\r");
    case '\t':
        return QByteArrayLiteral("\\t");
    default:
        return (c <= 0xff ? QByteArrayLiteral("\\x") : QByteArrayLiteral("\\u")) +
               QByteArray::number(uint(c), 16).rightJustified(c <= 0xff ? 2 : 4, '0');
    }
}

} // namespace

QByteArray LogText::of(QStringView text) {
    QByteArray out;
    // Where the text is cut when it does not fit: the end of the last character that leaves room
    // for the mark. Character by character, so that a cut never splits a character or an escape,
    // whatever the local encoding; the text may be megabytes long, the loop stops past the limit.
    qsizetype cut = 0;
    for (qsizetype i = 0; i < text.size() && out.size() <= LIMIT;) {
        const bool pair =
            text[i].isHighSurrogate() && i + 1 < text.size() && text[i + 1].isLowSurrogate();
        const char32_t c = pair ? QChar::surrogateToUcs4(text[i], text[i + 1]) : text[i].unicode();
        out += c == '\\' || isControl(c) ? escaped(c)
                                         : text.mid(i, pair ? 2 : 1).toString().toLocal8Bit();
        i += pair ? 2 : 1;
        if (out.size() <= LIMIT - CUT_MARK.size())
            cut = out.size();
    }
    if (out.size() > LIMIT) {
        out.truncate(cut);
        out += CUT_MARK;
    }
    return out;
}

QByteArray LogText::ofError(const char* what) {
    return what ? of(QString::fromLocal8Bit(what)) : QByteArrayLiteral("unknown exception");
}
