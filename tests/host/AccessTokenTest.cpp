#include "AccessToken.h"

#include <QDir>
#include <QFile>
#include <QRegularExpression>
#include <QSet>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <sys/stat.h>

namespace {

TEST(AccessTokenTest, GeneratedTokensAreUrlSafeLongAndDifferent) {
    QSet<QByteArray> seen;
    for (int i = 0; i < 100; ++i) {
        const QByteArray token = AccessToken::generate();
        // 256 bits in base64 without padding.
        EXPECT_TRUE(QRegularExpression("^[A-Za-z0-9_-]{43}$").match(token).hasMatch())
            << token.constData();
        QString error;
        EXPECT_TRUE(AccessToken::acceptable(token, &error)) << qPrintable(error);
        seen.insert(token);
    }
    EXPECT_EQ(seen.size(), 100);
}

TEST(AccessTokenTest, RefusesShortTokensAndCharactersAHeaderCannotCarry) {
    const struct {
        QByteArray token;
        bool acceptable;
    } rows[] = {
        {"0123456789abcdef", true},
        {"0123456789abcde", false},
        {"", false},
        {"abc-._~+/0123456789==", true},
        {"================", false},
        {"0123456789 abcdef", false},
        {"0123456789abcdef\r\nX: y", false},
        {"0123456789abcdef\"", false},
        {"0123456789=abcdef", false},
        {"0123456789abcd\xc3\xa9", false},
    };
    for (const auto& row : rows) {
        QString error;
        EXPECT_EQ(AccessToken::acceptable(row.token, &error), row.acceptable)
            << row.token.constData();
        EXPECT_EQ(error.isEmpty(), row.acceptable) << qPrintable(error);
    }
}

TEST(AccessTokenTest, FileIsTheOwnersOnlyAlsoWhenAnOlderOneWasNot) {
    QTemporaryDir folder;
    const QString path = folder.filePath("token");
    QFile older(path);
    ASSERT_TRUE(older.open(QIODevice::WriteOnly));
    older.write("an older token\n");
    older.close();
    ASSERT_EQ(::chmod(QFile::encodeName(path).constData(), 0644), 0);

    QString error;
    ASSERT_TRUE(AccessToken::writeFile(path, "0123456789abcdef", &error)) << qPrintable(error);
    struct stat status {};
    ASSERT_EQ(::stat(QFile::encodeName(path).constData(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0600u);
    QFile written(path);
    ASSERT_TRUE(written.open(QIODevice::ReadOnly));
    EXPECT_EQ(written.readAll(), "0123456789abcdef\n");
    // Nothing is left beside it.
    EXPECT_EQ(QDir(folder.path()).entryList(QDir::Files | QDir::Hidden).join(' '), "token");

    EXPECT_FALSE(AccessToken::writeFile(folder.filePath("no/such/folder/token"), "x", &error));
    EXPECT_TRUE(error.contains("no/such/folder")) << qPrintable(error);
}

} // namespace
