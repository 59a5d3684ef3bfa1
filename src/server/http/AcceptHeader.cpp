#include "server/http/AcceptHeader.h"

#include <algorithm>
#include <cstring>

namespace Kdd::Http
{
namespace
{

// A browser names a dozen. More cost time and help nobody.
constexpr int kMostRanges = 64;

/// A member of a comma-separated header: what stands before the first ";", and the parameters behind it.
struct Member
{
    QByteArray name;
    QVector<Field> parameters;
};

/// Takes such a header apart. Quoted values may hold any separator.
class MemberScanner
{
public:
    explicit MemberScanner(const QByteArray& text)
        : mText(text)
    {
    }

    bool atEnd() const { return mAt >= mText.size(); }

    Member next()
    {
        Member member;
        member.name = value(",;").toLower();
        while (!atEnd() && mText[mAt] == ';') {
            ++mAt;
            Field parameter;
            parameter.name = value(",;=").toLower();
            if (!atEnd() && mText[mAt] == '=') {
                ++mAt;
                parameter.value = value(",;");
            }
            member.parameters.append(parameter);
        }
        ++mAt;  // the comma, or the end
        return member;
    }

private:
    /// Up to one of the separators, without the blanks around it and the quotes. A quote that is not closed ends with
    /// the text.
    QByteArray value(const char* separators)
    {
        QByteArray found;
        for (; !atEnd() && std::strchr(separators, mText[mAt]) == nullptr; ++mAt) {
            if (mText[mAt] == '"')
                quoted(found);
            else
                found += mText[mAt];
        }
        return found.trimmed();
    }

    void quoted(QByteArray& found)
    {
        for (++mAt; !atEnd() && mText[mAt] != '"'; ++mAt) {
            if (mText[mAt] == '\\' && mAt + 1 < mText.size())
                ++mAt;
            found += mText[mAt];
        }
        // Stay before the end, on which the caller steps.
        mAt = std::min(mAt, mText.size() - 1);
    }

    const QByteArray& mText;
    int mAt = 0;
};

/// "0.5" as 500. What is no number counts as fully welcome: it was named after all.
int thousandths(const QByteArray& text)
{
    bool isNumber = false;
    const double value = text.toDouble(&isNumber);
    if (!isNumber || !(value >= 0 && value <= 1))
        return 1000;
    return static_cast<int>(value * 1000 + 0.5);
}

bool isMediaRange(const QByteArray& name)
{
    const int slash = name.indexOf('/');
    return slash > 0 && slash + 1 < name.size();
}

MediaRange rangeOf(const Member& member)
{
    MediaRange range;
    range.name = member.name;
    for (const Field& parameter : member.parameters) {
        if (parameter.name == "type")
            range.parts = parameter.value.toLower();
        else if (parameter.name == "transfer-syntax")
            range.transferSyntax = parameter.value;
        else if (parameter.name == "charset")
            range.charset = parameter.value.toLower();
        else if (parameter.name == "q")
            range.quality = thousandths(parameter.value);
    }
    return range;
}

}  // namespace

int MediaRange::closeness(const MediaType& type) const
{
    if (name == "*/*")
        return 1;
    if (name.endsWith("/*") && type.name.startsWith(name.left(name.size() - 1)))
        return 2;
    if (name != type.name)
        return 0;
    if (parts.isEmpty() || parts == "*/*")
        return 3;
    if (parts == type.parts)
        return 5;
    return parts.endsWith("/*") && type.parts.startsWith(parts.left(parts.size() - 1)) ? 4 : 0;
}

AcceptHeader AcceptHeader::of(const Request& request)
{
    QByteArray text;
    for (const QByteArray& each : request.parameters("accept"))
        text += (text.isEmpty() ? "" : ",") + each;
    if (text.trimmed().isEmpty())
        text = request.header("accept");
    return AcceptHeader(text.trimmed().isEmpty() ? QByteArray("*/*") : text);
}

AcceptHeader::AcceptHeader(const QByteArray& text)
{
    MemberScanner members(text);
    while (!members.atEnd() && mRanges.size() < kMostRanges) {
        const Member member = members.next();
        if (isMediaRange(member.name))
            mRanges.append(rangeOf(member));
    }
    std::stable_sort(mRanges.begin(), mRanges.end(), [](const MediaRange& one, const MediaRange& other) {
        return one.quality > other.quality;
    });
}

int AcceptHeader::quality(const MediaType& type) const
{
    int closest = 0;
    int quality = 0;
    for (const MediaRange& range : mRanges) {
        const int closeness = range.closeness(type);
        if (closeness > closest) {
            closest = closeness;
            quality = range.quality;
        }
    }
    return quality;
}

int AcceptHeader::choose(const QVector<MediaType>& offers) const
{
    int chosen = -1;
    int best = 0;
    for (int i = 0; i < offers.size(); ++i) {
        const int each = quality(offers[i]);
        if (each > best) {
            best = each;
            chosen = i;
        }
    }
    return chosen;
}

bool acceptsCoding(const Request& request, const QByteArray& coding)
{
    const QByteArray text = request.header("accept-encoding");
    MemberScanner members(text);
    bool isAccepted = false;
    while (!members.atEnd()) {
        const Member member = members.next();
        if (member.name != coding && member.name != "*")
            continue;
        const bool isWelcome = rangeOf(member).quality > 0;
        if (member.name == coding)
            return isWelcome;
        isAccepted = isWelcome;
    }
    return isAccepted;
}

}  // namespace Kdd::Http
