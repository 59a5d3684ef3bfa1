#include "server/http/MultipartReader.h"

#include <QList>

#include <cstring>

namespace Kdd::Http
{
namespace
{

// What no client that means well comes near to [bytes].
constexpr int kLongestPreamble = 64 * 1024;
constexpr int kLongestHeader = 16 * 1024;
constexpr int kLongestPadding = 1024;

int find(const char* text, int size, const QByteArray& what)
{
    const void* found = ::memmem(text, static_cast<std::size_t>(size), what.constData(),
                                 static_cast<std::size_t>(what.size()));
    return found == nullptr ? -1 : static_cast<int>(static_cast<const char*>(found) - text);
}

int find(const QByteArray& text, const QByteArray& what)
{
    return find(text.constData(), text.size(), what);
}

/// How many bytes at the end are such as `what` begins with, and not all of it.
int beginning(const char* text, int size, const QByteArray& what)
{
    int count = qMin(size, what.size() - 1);
    while (count > 0 &&
           std::memcmp(text + size - count, what.constData(), static_cast<std::size_t>(count)) != 0)
        --count;
    return count;
}

/// A header that goes on in the next line belongs together.
QVector<Field> fieldsOf(QByteArray header)
{
    QVector<Field> fields;
    header.replace("\r\n ", " ");
    header.replace("\r\n\t", " ");
    for (const QByteArray& line : header.split('\n')) {
        const int colon = line.indexOf(':');
        if (colon > 0)
            fields.append({line.left(colon).trimmed().toLower(), line.mid(colon + 1).trimmed()});
    }
    return fields;
}

}  // namespace

MultipartReader::MultipartReader(const QByteArray& boundary, Receiver& receiver)
    : mDelimiter("\r\n--" + boundary)
    , mReceiver(receiver)
    // The first delimiter has the end of a line before it, or nothing.
    , mUnread("\r\n")
{
}

bool MultipartReader::fail(const QString& reason)
{
    mState = State::Failed;
    mFault = reason;
    mUnread.clear();
    return false;
}

bool MultipartReader::add(const char* bytes, int size)
{
    if (mState == State::Failed)
        return false;
    if (mState == State::Epilogue)
        return true;
    // What is of a part and of nothing else is handed on where it lies.
    const int passed = mState == State::Body && mUnread.isEmpty() ? passOn(bytes, size) : 0;
    mUnread.append(bytes + passed, size - passed);
    while (advance()) {
    }
    return mState != State::Failed;
}

/// Whether it makes sense to go on with what is there.
bool MultipartReader::advance()
{
    switch (mState) {
    case State::Preamble:
        return readPreamble();
    case State::Delimiter:
        return readDelimiter();
    case State::Header:
        return readHeader();
    case State::Body:
        return readBody();
    case State::Epilogue:
    case State::Failed:
        break;
    }
    mUnread.clear();
    return false;
}

bool MultipartReader::readPreamble()
{
    const int at = find(mUnread, mDelimiter);
    const int passed = at >= 0 ? at : qMax(0, mUnread.size() - mDelimiter.size() + 1);
    mPassed += passed;
    if (mPassed > kLongestPreamble)
        return fail(QStringLiteral("The body does not begin with a part of the boundary that was named"));
    mUnread.remove(0, passed);
    if (at < 0)
        return false;
    mState = State::Delimiter;
    return true;
}

/// A delimiter stands at the beginning, and what follows it tells whether it is one. It is looked at as a whole, for
/// what is none belongs to the part.
bool MultipartReader::readDelimiter()
{
    int at = mDelimiter.size();
    if (mUnread.size() < at + 2)
        return false;
    const bool isLast = mUnread.mid(at, 2) == "--";
    while (at < mUnread.size() && (mUnread.at(at) == ' ' || mUnread.at(at) == '\t'))
        ++at;
    const bool isUndecided = at + 2 > mUnread.size() && at < mDelimiter.size() + kLongestPadding;
    if (!isLast && isUndecided)
        return false;
    const bool isDelimiter = isLast || mUnread.mid(at, 2) == "\r\n";
    if (!isDelimiter) {
        // Text that begins like it: of the preamble, or of the part.
        if (mIsInPart)
            mReceiver.takePart(mUnread.constData(), 2);
        mUnread.remove(0, 2);
        mPassed += 2;
        mState = mIsInPart ? State::Body : State::Preamble;
        return true;
    }
    if (mIsInPart)
        mReceiver.endPart();
    mIsInPart = false;
    // The end of the line stays: a header may be empty.
    mUnread.remove(0, isLast ? at + 2 : at);
    mState = isLast ? State::Epilogue : State::Header;
    return true;
}

bool MultipartReader::readHeader()
{
    const int end = find(mUnread, "\r\n\r\n");
    if (end > kLongestHeader || (end < 0 && mUnread.size() > kLongestHeader + 4))
        return fail(QStringLiteral("The header of a part is too large"));
    if (end < 0)
        return false;
    const QByteArray header = mUnread.mid(2, qMax(0, end - 2));
    mUnread.remove(0, end + 4);
    if (!mReceiver.beginPart(fieldsOf(header)))
        return fail(QStringLiteral("There are more parts than one request may have"));
    mIsInPart = true;
    mState = State::Body;
    return true;
}

bool MultipartReader::readBody()
{
    const int passed = passOn(mUnread.constData(), mUnread.size());
    mUnread.remove(0, passed);
    return mState == State::Delimiter;
}

/// Hands on what is of the part, up to a delimiter or what may be the beginning of one, whose rest is on the way then.
int MultipartReader::passOn(const char* bytes, int size)
{
    const int at = find(bytes, size, mDelimiter);
    const int passed = at >= 0 ? at : size - beginning(bytes, size, mDelimiter);
    if (passed > 0)
        mReceiver.takePart(bytes, passed);
    if (at >= 0)
        mState = State::Delimiter;
    return passed;
}

}  // namespace Kdd::Http
