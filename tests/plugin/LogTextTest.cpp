#include "LogText.h"

#include <QString>

#include <gtest/gtest.h>

namespace {

struct LogTextRow {
    const char* name;
    QString text;
    QByteArray logged;
};

void PrintTo(const LogTextRow& row, std::ostream* out) {
    *out << row.name;
}

class LogTextTest : public ::testing::TestWithParam<LogTextRow> {};

TEST_P(LogTextTest, EscapesControlCharactersAndCutsTo256Bytes) {
    EXPECT_EQ(LogText::of(GetParam().text), GetParam().logged);
}

// Qt takes the local 8-bit encoding of Linux to be UTF-8.
INSTANTIATE_TEST_SUITE_P(
    Texts, LogTextTest,
    ::testing::Values(LogTextRow{"Plain", "no such preset", "no such preset"},
                      LogTextRow{"LineBreaksCannotStartALine",
                                 "bad\r\n2026-01-01 [Quenvar] L2 forged\n\tx",
                                 "bad\\r\\n2026-01-01 [Quenvar] L2 forged\\n\\tx"},
                      LogTextRow{"OtherControlsAndBackslash",
                                 QString::fromUtf16(u"a\0b\x1b[31m\x7f\\n\x85\u2028", 13),
                                 "a\\x00b\\x1b[31m\\x7f\\\\n\\x85\\u2028"},
                      LogTextRow{"NonAsciiKept", QString::fromUtf16(u"caf\u00e9 \U0001F600"),
                                 "caf\xc3\xa9 \xf0\x9f\x98\x80"},
                      LogTextRow{"ExactlyTheLimit", QString(256, 'a'), QByteArray(256, 'a')},
                      LogTextRow{"OneByteOver", QString(257, 'a'), QByteArray(253, 'a') + "..."},
                      // Megabytes of answer: the cut never splits a character or an escape.
                      LogTextRow{"LongTextOfEscapes", QString(4 << 20, '\n'),
                                 QByteArray("\\n").repeated(126) + "..."},
                      LogTextRow{"LongTextOfWideCharacters",
                                 QString::fromUtf16(u"\u00e9").repeated(300),
                                 QByteArray("\xc3\xa9").repeated(126) + "..."},
                      LogTextRow{"Empty", "", ""}),
    [](const ::testing::TestParamInfo<LogTextRow>& info) { return info.param.name; });

} // namespace
