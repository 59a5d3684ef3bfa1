#include "kddlib/net/http/ByteRange.h"

#include <QByteArray>

#include <charconv>
#include <limits>

namespace Kdd
{
namespace
{

constexpr std::size_t kNowhere = std::string_view::npos;

}  // namespace

std::optional<qint64> parseByteCount(std::string_view digits)
{
    qint64 count = 0;
    const char* const end = digits.data() + digits.size();
    const auto [stop, error] = std::from_chars(digits.data(), end, count);
    // An empty text is an error already, so there is a first character to look at. A count has no sign.
    const bool isNumber = error == std::errc() && stop == end && digits.front() != '-';
    return isNumber ? std::optional(count) : std::nullopt;
}

bool isRangeHeader(const std::string& line)
{
    constexpr std::string_view kName = "range:";
    return qstrnicmp(line.c_str(), kName.data(), kName.size()) == 0;
}

std::string ByteRange::text() const
{
    return "bytes=" + std::to_string(first) + '-' + std::to_string(last);
}

std::optional<std::string_view> ContentRange::totalIn(std::string_view value)
{
    const std::size_t slash = value.find('/');
    return slash == kNowhere ? std::nullopt : std::optional(value.substr(slash + 1));
}

std::optional<ContentRange> ContentRange::parse(std::string_view value)
{
    // Strict, for bytes that were put at a guessed place would be taken for the object's own.
    constexpr std::string_view kUnit = "bytes ";
    const auto totalText = totalIn(value);
    const std::size_t dash = value.find('-');
    const std::size_t slash = value.find('/');
    if (value.substr(0, kUnit.size()) != kUnit || !totalText || dash > slash)
        return std::nullopt;
    const auto first = parseByteCount(value.substr(kUnit.size(), dash - kUnit.size()));
    const auto last = parseByteCount(value.substr(dash + 1, slash - dash - 1));
    const bool isOpen = *totalText == "*";
    const auto total = isOpen ? std::optional<qint64>(-1) : parseByteCount(*totalText);
    if (!first || !last || !total || *first > *last || (!isOpen && *last >= *total))
        return std::nullopt;
    // Of an object without a known length: one more byte must still be a number.
    if (*last == std::numeric_limits<qint64>::max())
        return std::nullopt;
    return ContentRange{{*first, *last}, *total};
}

WantedRange::WantedRange(std::string_view text)
{
    // What is of none of the three forms stays Unknown: several ranges, or a server's own unit.
    const std::size_t dash = text.find('-');
    if (dash == kNowhere)
        return;
    const auto first = parseByteCount(text.substr(0, dash));
    const auto last = parseByteCount(text.substr(dash + 1));
    if (first && last && *first <= *last)
        mForm = Closed;
    else if (first && dash + 1 == text.size())
        mForm = From;
    else if (last && dash == 0)
        mForm = Suffix;
    mFirst = first.value_or(0);
    mLast = last.value_or(0);
}

bool WantedRange::isAnsweredBy(const ContentRange& answer) const
{
    const ByteRange& range = answer.range;
    // Fewer bytes than asked for are right only where the object ends. A server that does not know where
    // that is has to be believed.
    const bool isToTheEnd = answer.total < 0 || range.last == answer.total - 1;
    switch (mForm) {
    case Closed:
        return range.first == mFirst && (range.last == mLast || (isToTheEnd && range.last < mLast));
    case From:
        return range.first == mFirst && isToTheEnd;
    case Suffix:
        return isToTheEnd && (range.length() == mLast || (range.first == 0 && range.length() < mLast));
    default:
        return true;
    }
}

}  // namespace Kdd
