#include "platform/base/Decimal.h"

#include <gtest/gtest.h>

#include <clocale>
#include <cmath>
#include <locale>

using namespace Kdd;

namespace
{

// Without this one a run that is meant to be under decimal commas would show nothing when they are not there.
TEST(Locale, IsTheOneThatTheRunIsMeantToBeUnder)
{
    const char* wanted = std::getenv("KDD_TEST_DECIMAL_POINT");
    if (wanted == nullptr)
        GTEST_SKIP() << "no locale is asked for";
    EXPECT_STREQ(std::localeconv()->decimal_point, wanted);
}

TEST(Decimal, HasAPointUnderEveryLocale)
{
    const std::pair<const char*, double> rows[] = {
        {"1.75", 1.75}, {" -2.5e-1x", -0.25}, {"1,75", 1},  {"+.5", 0.5}, {"1.234.567", 1.234}, {"x", 0},
        {"", 0},        {"1e999", HUGE_VAL},  {"0.1", 0.1}, {"1e-999", 0}};
    for (const auto& [text, number] : rows)
        EXPECT_EQ(decimalNumber(text), number) << text;
}

}  // namespace
