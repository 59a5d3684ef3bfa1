#pragma once

#include <QtGlobal>

#include <optional>
#include <string>
#include <string_view>

namespace Kdd
{

/// Bytes of an object, 0-based, both ends inclusive.
struct ByteRange
{
    qint64 first = 0;
    qint64 last = -1;

    qint64 length() const { return last - first + 1; }

    /// "bytes=first-last", as a request names it.
    std::string text() const;
};

/// What a response says of the part that it carries: the header Content-Range, "bytes first-last/total".
struct ContentRange
{
    ByteRange range;
    qint64 total = -1;  // of the whole object [bytes]; -1: the server does not say, "*"

    /// Nothing unless the value is of that form, first <= last < total, and each number below 2^63, `last` by one more.
    static std::optional<ContentRange> parse(std::string_view value);

    /// What such a value says in the place of the total, whatever stands before; nothing without a "/".
    static std::optional<std::string_view> totalIn(std::string_view value);
};

/// A range as a caller words it: "first-last", "first-" for all from there on, "-count" for the last bytes.
class WantedRange
{
public:
    /// `text` is what follows "bytes=". Anything else, as several ranges, is passed on to the server as it stands and
    /// every part that it sends is taken.
    explicit WantedRange(std::string_view text);

    /// Whether the whole object, sent without regard to the range, is what the caller wants.
    bool isWholeObject() const { return mForm == From && mFirst == 0; }

    /// Whether the part that came is the one that was asked for, cut at the object's end.
    bool isAnsweredBy(const ContentRange& answer) const;

    /// Whether only the server can tell what the text means.
    bool isUnknown() const { return mForm == Unknown; }

private:
    enum Form { Closed, From, Suffix, Unknown };

    Form mForm = Unknown;
    qint64 mFirst = 0;
    qint64 mLast = 0;  // Suffix: how many
};

/// Whether a header line of a request asks for a range.
bool isRangeHeader(const std::string& line);

/// A decimal number without sign, below 2^63.
std::optional<qint64> parseByteCount(std::string_view digits);

}  // namespace Kdd
