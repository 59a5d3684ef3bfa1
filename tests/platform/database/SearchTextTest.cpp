#include "platform/database/SearchText.h"

#include <QRegularExpression>

#include <gtest/gtest.h>

using namespace Kxg;

namespace
{

/// As the engines do it.
bool matches(const QByteArray& text, const SearchPatterns& patterns)
{
    for (const QByteArray& pattern : patterns.patterns) {
        QString expression = QRegularExpression::escape(QString::fromLatin1(pattern));
        expression.replace(QLatin1String("\\*"), QLatin1String(".*"));
        if (!QRegularExpression(QRegularExpression::anchoredPattern(expression))
                 .match(QString::fromLatin1(text))
                 .hasMatch())
            return false;
    }
    return true;
}

TEST(SearchText, TellsWhatIsCodedFromWhatIsWritten)
{
    // A character beyond ASCII is five letters that no text has.
    EXPECT_TRUE(matches(searchText(QStringLiteral("山田")), textPatterns(QStringLiteral("*田*"))));
    EXPECT_FALSE(matches(searchText(QStringLiteral("ZHBPAA")), textPatterns(QStringLiteral("*灰*"))));
    EXPECT_EQ(searchText(QStringLiteral("ABC")), "abc");
}

const std::tuple<const char*, const char*, const char*> kTimes[] = {
    {"10", "100000.000000", "105959.999999"},
    {"1030", "103000.000000", "103059.999999"},
    {"103015", "103015.000000", "103015.999999"},
    {"103015.5", "103015.500000", "103015.599999"},
    {"10:30:15", "103015.000000", "103015.999999"},
    {"1", "", ""},
    {"10301", "", ""},
    {"1030.5", "", ""},
    {"103015.1234567", "", ""},
    {"ab", "", ""},
    {"", "", ""},
};

TEST(SearchText, KnowsTheFirstAndLastMomentOfATime)
{
    for (const auto& [written, first, last] : kTimes) {
        EXPECT_EQ(searchTime(written), first) << written;
        EXPECT_EQ(lastTime(written), last) << written;
    }
    EXPECT_EQ(searchDate("2024.01.31"), "20240131");
    EXPECT_EQ(searchDate("202401"), "");
}

}  // namespace
