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

struct NameQuestion
{
    const char* name;
    const char* query;
    bool isFound;
};

const NameQuestion kNames[] = {
    {"Doe^John", "doe", true},
    {"Doe^John", "DOE^JOHN", true},
    {"Doe^John", "Do", false},
    {"Doe^John", "john", false},
    {"Doe^John", "^John", true},
    {"Doe^John^^Dr", "^John^^Dr", true},
    {"Doe^Johnny", "^John", false},
    {"Doe^^John", "^John", false},
    {"Doe^John", "Doe^", true},
    {"Doe^John", "*oh*", true},
    {"Doe^John", "*ohn", true},
    {"Doe^John", "oh*", false},
    {"Doe^John", "d*^j*", true},
    {"Müller^Éva", "muller^eva", true},
    {"Muller^Eva", "MÜLLER", true},
    {"Straße^A", "strasse", true},
    {"Yamada^Tarou=山田^太郎=やまだ^たろう", "山田", true},
    {"Yamada^Tarou=山田^太郎=やまだ^たろう", "=山田", true},
    {"Yamada^Tarou=山田^太郎=やまだ^たろう", "==山田", false},
    {"Yamada^Tarou=山田^太郎=やまだ^たろう", "yamada=山田^太郎", true},
    {"Yamada^Tarou=山田^太郎=やまだ^たろう", "*田*", true},
    {"Yamada^Tarou=山田^太郎=やまだ^たろう", "*郎^*", false},
    {"=山田^太郎", "*山*", true},
    {"Doe^John", "*", true},
    {"", "*", true},
    {"", "Doe", false},
    {"A%B^_", "*%*", true},
    {"AB^C", "*%*", false},
    {"A^B", "*q*", false},  // the marks between components are nobody's letters
    {"Doe^J[1]", "^J[1]", true},
};

TEST(SearchText, FindsNamesByGroupAndComponent)
{
    for (const NameQuestion& each : kNames) {
        const SearchPatterns patterns = namePatterns(QString::fromUtf8(each.query));
        const bool isFound = matches(searchName(QString::fromUtf8(each.name)), patterns);
        if (patterns.isExact || each.isFound) {
            EXPECT_EQ(isFound, each.isFound) << each.name << " by " << each.query;
        }
    }
}

TEST(SearchText, SaysWhenAPatternFindsMore)
{
    for (const char* exact : {"doe", "*oe*", "doe^john", "^john", "=doe", "*"})
        EXPECT_TRUE(namePatterns(QString::fromUtf8(exact)).isExact) << exact;
    for (const char* wide : {"d?e", "d*e", "d*^j*", "=*oe*", "doe^^dr"})
        EXPECT_FALSE(namePatterns(QString::fromUtf8(wide)).isExact) << wide;
}

TEST(SearchText, TellsWhatIsCodedFromWhatIsWritten)
{
    // A character beyond ASCII is five letters that no text has.
    EXPECT_TRUE(matches(searchText(QStringLiteral("山田")), textPatterns(QStringLiteral("*田*"))));
    EXPECT_FALSE(matches(searchText(QStringLiteral("ZHBPAA")), textPatterns(QStringLiteral("*灰*"))));
    EXPECT_EQ(searchText(QStringLiteral("ABC")), "abc");
}

struct WrittenTime
{
    const char* written;
    const char* first;
    const char* last;
};

constexpr WrittenTime kTimes[] = {
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
    for (const WrittenTime& time : kTimes) {
        EXPECT_EQ(searchTime(time.written), time.first) << time.written;
        EXPECT_EQ(lastTime(time.written), time.last) << time.written;
    }
    EXPECT_EQ(searchDate("2024.01.31"), "20240131");
    EXPECT_EQ(searchDate("202401"), "");
}

}  // namespace
