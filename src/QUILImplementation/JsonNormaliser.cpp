#include "QUILImplementation/JsonNormaliser.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QJsonValue>
#include <QLocale>

#include <algorithm>
#include <cmath>
#include <rapidjson/reader.h>
#include <string>
#include <string_view>
#include <vector>

namespace {

// Qt refuses documents nested deeper than 1024; anything deeper than this goes to Qt to decide,
// which also bounds the recursion of RapidJSON's parser.
const std::size_t DEPTH_LIMIT = 512;
// At most 18 digits always fit in a 64-bit integer.
const std::size_t PLAIN_INTEGER_DIGITS = 18;

// In place: the reader then needs no stack of its own for strings and numbers.
const unsigned PARSE_FLAGS = rapidjson::kParseInsituFlag | rapidjson::kParseValidateEncodingFlag |
                             rapidjson::kParseNumbersAsStringsFlag;

char hexDigit(unsigned value) {
    return char(value < 10 ? '0' + value : 'a' + value - 10);
}

// Qt's escape of one ASCII character, or nothing when it stands as itself.
bool appendEscapedAscii(std::string& out, unsigned char c) {
    if (c >= 0x20 && c != '"' && c != '\\')
        return false;
    out += '\\';
    switch (c) {
    case '"':
    case '\\':
        out += char(c);
        break;
    case '\b':
        out += 'b';
        break;
    case '\f':
        out += 'f';
        break;
    case '\n':
        out += 'n';
        break;
    case '\r':
        out += 'r';
        break;
    case '\t':
        out += 't';
        break;
    default:
        out += "u00";
        out += hexDigit(c >> 4);
        out += hexDigit(c & 0xf);
    }
    return true;
}

// UTF-8 as RapidJSON delivers it: valid, except that an escaped lone surrogate comes as its
// three-byte form, which Qt keeps as UTF-16 and writes escaped. Such a text goes to Qt.
bool appendQuotedUtf8(std::string& out, const char* text, std::size_t length) {
    const unsigned char SURROGATE_LEAD = 0xed;
    const unsigned char FIRST_SURROGATE_CONTINUATION = 0xa0;
    out += '"';
    std::size_t runStart = 0;
    for (std::size_t i = 0; i < length; ++i) {
        const unsigned char c = static_cast<unsigned char>(text[i]);
        if (c >= 0x20 && c != '"' && c != '\\' && c != SURROGATE_LEAD)
            continue;
        if (c == SURROGATE_LEAD) {
            if (i + 1 < length &&
                static_cast<unsigned char>(text[i + 1]) >= FIRST_SURROGATE_CONTINUATION)
                return false;
            continue;
        }
        out.append(text + runStart, i - runStart);
        appendEscapedAscii(out, c);
        runStart = i + 1;
    }
    out.append(text + runStart, length - runStart);
    out += '"';
    return true;
}

// Qt orders keys by UTF-16 code units when it stores them as UTF-16 and by code points when it
// keeps them in UTF-8, which differ only for characters beyond the BMP. Such keys go to Qt.
bool beyondBmp(const char* text, std::size_t length) {
    return std::any_of(text, text + length,
                       [](char c) { return static_cast<unsigned char>(c) >= 0xf0; });
}

// Qt's reading of a number: an integer when its text has no exponent and only zeros after the
// point and fits, else a double, which becomes an integer again when it is one within 64 bits.
bool appendNumber(std::string& out, const char* text, std::size_t length) {
    const bool negative = text[0] == '-';
    const std::size_t digits = length - (negative ? 1 : 0);
    const char* first = text + (negative ? 1 : 0);
    if (digits <= PLAIN_INTEGER_DIGITS &&
        std::all_of(first, first + digits, [](char c) { return c >= '0' && c <= '9'; })) {
        if (digits == 1 && *first == '0')
            out += '0';
        else
            out.append(text, length);
        return true;
    }

    const QByteArray number = QByteArray::fromRawData(text, qsizetype(length));
    bool integral = true;
    bool fraction = false;
    for (const char c : number) {
        if (c == 'e' || c == 'E')
            integral = false;
        else if (c == '.')
            fraction = true;
        else if (fraction && c != '0')
            integral = false;
    }
    bool ok = false;
    if (integral) {
        const qlonglong value = number.toLongLong(&ok);
        if (ok) {
            out += QByteArray::number(value).toStdString();
            return true;
        }
    }
    const double value = number.toDouble(&ok);
    if (!ok)
        return false;
    // [-2^63, 2^63): both bounds are exact doubles.
    if (value >= -9223372036854775808.0 && value < 9223372036854775808.0 &&
        std::trunc(value) == value)
        out += QByteArray::number(qint64(value)).toStdString();
    else
        out += QByteArray::number(value, 'g', QLocale::FloatingPointShortest).toStdString();
    return true;
}

// A SAX handler that writes what it reads in Qt's compact form. Members are written as they come;
// an object whose keys did not arrive strictly ascending is rewritten sorted when it ends. The
// wrapper object itself is not written: only the text of its last member called name is kept.
class Writer : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, Writer> {
public:
    // name in UTF-8, as RapidJSON delivers keys.
    Writer(std::string_view name, std::size_t expectedSize)
        : name(name) {
        out.reserve(expectedSize);
    }

    bool Null() {
        beforeValue();
        out += "null";
        return true;
    }
    bool Bool(bool value) {
        beforeValue();
        out += value ? "true" : "false";
        return true;
    }
    bool RawNumber(const char* text, rapidjson::SizeType length, bool) {
        beforeValue();
        return appendNumber(out, text, length);
    }
    bool String(const char* text, rapidjson::SizeType length, bool) {
        beforeValue();
        return appendQuotedUtf8(out, text, length);
    }
    bool StartObject() { return open(true); }
    bool StartArray() { return open(false); }
    bool EndArray(rapidjson::SizeType) {
        out += ']';
        frames.pop_back();
        return true;
    }
    bool Key(const char* text, rapidjson::SizeType length, bool);
    bool EndObject(rapidjson::SizeType);

    std::optional<QByteArray> result() const {
        if (!haveValue)
            return std::nullopt;
        return QByteArray(out.data() + valueStart, qsizetype(valueEnd - valueStart));
    }

private:
    struct Member {
        std::size_t keyStart; // in keys
        std::size_t keyLength;
        std::size_t start; // in out, at the member's quoted key
        std::size_t end;   // in out, after its value
    };
    struct Frame {
        bool object;
        std::size_t start;     // in out, at the opening bracket
        std::size_t keysStart; // in keys
        std::size_t count = 0;
        bool ascending = true;
    };

    std::string_view key(const Member& member) const {
        return std::string_view(keys).substr(member.keyStart, member.keyLength);
    }
    std::vector<Member>& membersOf(std::size_t depth) {
        if (membersByDepth.size() <= depth)
            membersByDepth.resize(depth + 1);
        return membersByDepth[depth];
    }

    void beforeValue() {
        if (!frames.empty() && !frames.back().object && frames.back().count++ > 0)
            out += ',';
    }
    bool open(bool object) {
        if (frames.size() >= DEPTH_LIMIT)
            return false;
        beforeValue();
        // The wrapper writes nothing of its own.
        if (object && !frames.empty())
            membersOf(frames.size()).clear();
        if (!frames.empty())
            out += object ? '{' : '[';
        frames.push_back(Frame{object, out.size() - (frames.empty() ? 0 : 1), keys.size()});
        return true;
    }
    void endWrapperMember() {
        if (!inWrapperMember)
            return;
        if (wrapperMemberIsValue) {
            valueStart = memberStart;
            valueEnd = out.size();
            haveValue = true;
        } else {
            out.resize(memberStart);
        }
    }
    void sortMembers(Frame& frame, std::vector<Member>& members);

    const std::string_view name;
    std::string out;
    std::string keys;
    std::vector<Frame> frames;
    std::vector<std::vector<Member>> membersByDepth;

    bool inWrapperMember = false;
    bool wrapperMemberIsValue = false;
    std::size_t memberStart = 0;
    bool haveValue = false;
    std::size_t valueStart = 0;
    std::size_t valueEnd = 0;
};

bool Writer::Key(const char* text, rapidjson::SizeType length, bool) {
    if (frames.size() == 1) {
        endWrapperMember();
        inWrapperMember = true;
        wrapperMemberIsValue = std::string_view(text, length) == name;
        memberStart = out.size();
        return true;
    }
    if (beyondBmp(text, length))
        return false;
    Frame& frame = frames.back();
    std::vector<Member>& members = membersOf(frames.size() - 1);
    if (!members.empty()) {
        members.back().end = out.size();
        if (key(members.back()) >= std::string_view(text, length))
            frame.ascending = false;
    }
    if (frame.count++ > 0)
        out += ',';
    members.push_back(Member{keys.size(), length, out.size(), 0});
    keys.append(text, length);
    if (!appendQuotedUtf8(out, text, length))
        return false;
    out += ':';
    return true;
}

bool Writer::EndObject(rapidjson::SizeType) {
    if (frames.size() == 1) {
        endWrapperMember();
        frames.pop_back();
        return true;
    }
    Frame& frame = frames.back();
    std::vector<Member>& members = membersOf(frames.size() - 1);
    if (!members.empty()) {
        members.back().end = out.size();
        if (!frame.ascending)
            sortMembers(frame, members);
    }
    out += '}';
    keys.resize(frame.keysStart);
    members.clear();
    frames.pop_back();
    return true;
}

// Qt's order: a stable sort by key, keeping the last of each run of equal keys.
void Writer::sortMembers(Frame& frame, std::vector<Member>& members) {
    std::stable_sort(members.begin(), members.end(),
                     [this](const Member& a, const Member& b) { return key(a) < key(b); });
    const std::size_t bodyStart = frame.start + 1;
    const std::string body = out.substr(bodyStart);
    out.resize(bodyStart);
    bool first = true;
    for (std::size_t i = 0; i < members.size(); ++i) {
        if (i + 1 < members.size() && key(members[i]) == key(members[i + 1]))
            continue;
        if (!first)
            out += ',';
        first = false;
        out.append(body, members[i].start - bodyStart, members[i].end - members[i].start);
    }
}

QByteArray wrap(QStringView name, const QByteArray& text) {
    QByteArray wrapped;
    wrapped.reserve(text.size() + name.size() + 8);
    wrapped.append('{');
    JsonNormaliser::appendString(wrapped, name);
    wrapped.append(':').append(text).append('}');
    return wrapped;
}

std::optional<QByteArray> memberValueByQt(QStringView name, const QByteArray& wrapped) {
    const QJsonValue value = QJsonDocument::fromJson(wrapped).object().value(name);
    if (value.isUndefined())
        return std::nullopt;
    const QByteArray array = QJsonDocument(QJsonArray{value}).toJson(QJsonDocument::Compact);
    return array.mid(1, array.size() - 2);
}

// A lone surrogate has no UTF-8 form to compare RapidJSON's keys with; Qt keeps it as it is.
bool hasLoneSurrogate(QStringView text) {
    for (qsizetype i = 0; i < text.size(); ++i) {
        if (text[i].isHighSurrogate() && i + 1 < text.size() && text[i + 1].isLowSurrogate())
            ++i;
        else if (text[i].isSurrogate())
            return true;
    }
    return false;
}

} // namespace

std::optional<QByteArray> JsonNormaliser::memberValue(QStringView name, const QByteArray& text) {
    if (hasLoneSurrogate(name))
        return memberValueByQt(name, wrap(name, text));
    QByteArray wrapped = wrap(name, text);
    const QByteArray utf8Name = name.toUtf8();
    Writer writer(std::string_view(utf8Name.constData(), std::size_t(utf8Name.size())),
                  std::size_t(text.size()));
    rapidjson::Reader reader;
    rapidjson::InsituStringStream stream(wrapped.data());
    // A NUL inside the text ends RapidJSON's input early; Qt reads on, so the text goes to Qt.
    if (reader.Parse<PARSE_FLAGS>(stream, writer) && stream.Tell() == std::size_t(wrapped.size()))
        return writer.result();
    // Parsing in place has overwritten the copy.
    return memberValueByQt(name, wrap(name, text));
}

void JsonNormaliser::appendString(QByteArray& out, QStringView text) {
    out += '"';
    qsizetype runStart = 0;
    for (qsizetype i = 0; i < text.size(); ++i) {
        const char16_t u = text[i].unicode();
        if (QChar::isHighSurrogate(u) && i + 1 < text.size() && text[i + 1].isLowSurrogate()) {
            ++i;
            continue;
        }
        if (u >= 0x20 && u != '"' && u != '\\' && !QChar::isSurrogate(u))
            continue;
        out += text.mid(runStart, i - runStart).toUtf8();
        std::string escaped;
        if (u < 0x80) {
            appendEscapedAscii(escaped, static_cast<unsigned char>(u));
        } else {
            // Qt's writer escapes a lone surrogate, which has no UTF-8 form.
            escaped = "\\u";
            for (int shift = 12; shift >= 0; shift -= 4)
                escaped += hexDigit((u >> shift) & 0xf);
        }
        out.append(escaped.data(), qsizetype(escaped.size()));
        runStart = i + 1;
    }
    out += text.mid(runStart).toUtf8();
    out += '"';
}
