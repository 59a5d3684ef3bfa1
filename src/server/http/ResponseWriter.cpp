#include "server/http/ResponseWriter.h"

#include <kddlib/LogFile.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <exception>

namespace Kdd::Http
{
namespace
{

/// After so many bytes others have their turn, so that a fast client of a large file does not keep a thread.
constexpr qint64 kTurn = 4 * 1024 * 1024;  // [bytes]

/// What is read of a file at once where it cannot be sent from there.
constexpr qint64 kReadBlock = 64 * 1024;  // [bytes]

/// A body up to here goes with the head in one packet or two; copying it costs less than another call.
constexpr int kSmallBody = 16 * 1024;  // [bytes]

const char* phraseOf(int status)
{
    switch (status) {
    case 200:
        return "OK";
    case 202:
        return "Accepted";
    case 204:
        return "No Content";
    case 206:
        return "Partial Content";
    case 301:
        return "Moved Permanently";
    case 302:
        return "Found";
    case 303:
        return "See Other";
    case 304:
        return "Not Modified";
    case 307:
        return "Temporary Redirect";
    case 308:
        return "Permanent Redirect";
    case 400:
        return "Bad Request";
    case 401:
        return "Unauthorized";
    case 403:
        return "Forbidden";
    case 404:
        return "Not Found";
    case 405:
        return "Method Not Allowed";
    case 406:
        return "Not Acceptable";
    case 408:
        return "Request Timeout";
    case 409:
        return "Conflict";
    case 410:
        return "Gone";
    case 412:
        return "Precondition Failed";
    case 413:
        return "Payload Too Large";
    case 415:
        return "Unsupported Media Type";
    case 416:
        return "Range Not Satisfiable";
    case 421:
        return "Misdirected Request";
    case 431:
        return "Request Header Fields Too Large";
    case 500:
        return "Internal Server Error";
    case 501:
        return "Not Implemented";
    case 503:
        return "Service Unavailable";
    case 505:
        return "HTTP Version Not Supported";
    default:
        return "";
    }
}

/// The time of now as answers tell it, made once a second by each thread.
const QByteArray& dateText()
{
    thread_local std::time_t made = 0;
    thread_local QByteArray text;
    const std::time_t now = std::time(nullptr);
    if (now == made)
        return text;
    static const char* const kDays[] = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
    static const char* const kMonths[] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                          "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
    std::tm parts = {};
    ::gmtime_r(&now, &parts);
    char bytes[64];
    // Not by strftime, which speaks the language of the locale.
    const int size = std::snprintf(bytes, sizeof bytes, "%s, %02d %s %04d %02d:%02d:%02d GMT",
                                   kDays[parts.tm_wday], parts.tm_mday, kMonths[parts.tm_mon],
                                   parts.tm_year + 1900, parts.tm_hour, parts.tm_min, parts.tm_sec);
    text = QByteArray(bytes, std::min(size, static_cast<int>(sizeof bytes) - 1));
    made = now;
    return text;
}

bool isToken(const QByteArray& text)
{
    return !text.isEmpty() && std::all_of(text.begin(), text.end(), [](char each) {
        return (each >= 'a' && each <= 'z') || (each >= 'A' && each <= 'Z') || (each >= '0' && each <= '9') ||
               (each != '\0' && std::strchr("!#$%&'*+-.^_`|~", each) != nullptr);
    });
}

/// Whether it stays in its line: values can come from images.
bool isHeaderValue(const QByteArray& text)
{
    return std::none_of(text.begin(), text.end(), [](char each) {
        return (static_cast<unsigned char>(each) < ' ' && each != '\t') || each == '\x7f';
    });
}

bool mayHaveBody(int status)
{
    return status >= 200 && status != 204 && status != 304;
}

qint64 knownLength(const std::vector<BodyPart>& body)
{
    qint64 length = 0;
    for (const BodyPart& part : body) {
        if (const auto* bytes = std::get_if<QByteArray>(&part))
            length += bytes->size();
        else if (const auto* range = std::get_if<FileRange>(&part))
            length += range->length;
        else
            return -1;
    }
    return length;
}

}  // namespace

ResponseWriter::ResponseWriter(Response response, const ResponseForm& form)
    : mResponse(std::move(response))
    , mKeepsConnection(form.keepsConnection)
{
    QString fault;
    if (!isSound(fault)) {
        LogFile::errorf("An answer cannot be sent: %s", qUtf8Printable(fault));
        mResponse = failure(500, QStringLiteral("The answer cannot be given"));
    }
    chooseFraming(form);
    composeHead(form);
    if (form.isHead || !mayHaveBody(mResponse.status))
        mResponse.body.clear();
    auto* const first = mResponse.body.empty() ? nullptr : std::get_if<QByteArray>(&mResponse.body[0]);
    if (first != nullptr && first->size() <= kSmallBody && mFraming != Framing::Chunks) {
        mBlock += *first;
        ++mPart;
    }
}

bool ResponseWriter::isSound(QString& fault) const
{
    for (const Field& field : mResponse.headers) {
        if (isToken(field.name) && isHeaderValue(field.value))
            continue;
        fault = QStringLiteral("the header %1 is none").arg(QString::fromUtf8(field.name));
        return false;
    }
    for (const BodyPart& part : mResponse.body) {
        const auto* const range = std::get_if<FileRange>(&part);
        if (range == nullptr)
            continue;
        if (range->file == nullptr || range->offset < 0 || range->length < 0 ||
            range->offset > range->file->size() || range->length > range->file->size() - range->offset) {
            fault = QStringLiteral("%1 bytes from %2 on are not in the file")
                        .arg(range->length)
                        .arg(range->offset);
            return false;
        }
    }
    return true;
}

void ResponseWriter::chooseFraming(const ResponseForm& form)
{
    const bool isKnown = knownLength(mResponse.body) >= 0;
    mFraming = !mayHaveBody(mResponse.status) ? Framing::None
               : isKnown                      ? Framing::Length
               : form.isOldVersion            ? Framing::UntilClose
                                              : Framing::Chunks;
    if (mFraming == Framing::UntilClose)
        mKeepsConnection = false;
}

void ResponseWriter::composeHead(const ResponseForm& form)
{
    QByteArray& head = mBlock;
    head += "HTTP/1.1 " + QByteArray::number(mResponse.status) + ' ' + phraseOf(mResponse.status) + "\r\n";
    const auto add = [&head](const QByteArray& name, const QByteArray& value) {
        head += name;
        head += ": ";
        head += value;
        head += "\r\n";
    };
    for (const Field& field : mResponse.headers)
        add(field.name, field.value);
    if (mFraming == Framing::Length)
        add("Content-Length", QByteArray::number(knownLength(mResponse.body)));
    else if (mFraming == Framing::Chunks)
        add("Transfer-Encoding", "chunked");
    if (!mKeepsConnection)
        add("Connection", "close");
    else if (form.isOldVersion)
        add("Connection", "keep-alive");
    if (!form.id.isEmpty())
        add("X-Request-Id", form.id);
    add("Date", dateText());
    // What is said to be a text is never run as a script.
    add("X-Content-Type-Options", "nosniff");
    head += "\r\n";
}

ResponseWriter::Step ResponseWriter::broken(const QString& fault)
{
    mFault = fault;
    mKeepsConnection = false;
    return Step::Broken;
}

/// Makes the next bytes ready, or a range that the transport sends itself. False, with `mFault` set, when they cannot be
/// had.
bool ResponseWriter::prepare(Transport& transport)
{
    mBlock.resize(0);
    mBlockSent = 0;
    BodyPart& part = mResponse.body[mPart];
    bool isReady = true;
    if (auto* const range = std::get_if<FileRange>(&part)) {
        isReady = prepareFile(transport, *range);
    } else if (auto* const producer = std::get_if<std::unique_ptr<Producer>>(&part)) {
        isReady = prepareBlock(**producer);
    } else {
        mBlock = std::get<QByteArray>(part);
        ++mPart;
    }
    if (mFraming == Framing::Chunks)
        frame();
    return isReady;
}

void ResponseWriter::frame()
{
    if (!mBlock.isEmpty())
        mBlock.prepend(QByteArray::number(mBlock.size(), 16) + "\r\n").append("\r\n");
    if (isAtEnd())
        mBlock += "0\r\n\r\n";
}

bool ResponseWriter::prepareBlock(Producer& producer)
{
    Result made;
    try {
        made = producer.next(mBlock);
    } catch (const std::exception& fault) {
        made = Result::failure(QString::fromLocal8Bit(fault.what()));
    }
    mFault = made.text();
    if (made.good() && mBlock.isEmpty())
        ++mPart;
    return made.good();
}

bool ResponseWriter::prepareFile(Transport& transport, FileRange& range)
{
    // Its last byte is read, which tells of a change: without it the answer does not come to its end.
    mHeldBack = range.file->refusesChanges() ? 1 : 0;
    mSendsFile = range.length > mHeldBack && transport.sendsFiles() && mFraming != Framing::Chunks;
    if (mSendsFile)
        return true;
    const qint64 size = std::min(range.length, kReadBlock);
    const Result result = range.file->read(range.offset, size, mBlock);
    mFault = result.text();
    advance(range, size);
    return result.good();
}

void ResponseWriter::advance(FileRange& range, qint64 sent)
{
    range.offset += sent;
    range.length -= sent;
    mSendsFile = mSendsFile && range.length > mHeldBack;
    if (range.length == 0)
        ++mPart;
}

Transport::Outcome ResponseWriter::sendPrepared(Transport& transport)
{
    qint64 count = 0;
    Transport::Outcome outcome{};
    if (mSendsFile) {
        auto& range = std::get<FileRange>(mResponse.body[mPart]);
        outcome = transport.sendFile(*range.file, range.offset, range.length - mHeldBack, count);
        advance(range, count);
    } else {
        const auto more = isAtEnd() ? Transport::More::No : Transport::More::Yes;
        outcome = transport.write(mBlock.constData() + mBlockSent, mBlock.size() - mBlockSent, more, count);
        mBlockSent += count;
    }
    mBytesSent += count;
    return outcome;
}

ResponseWriter::Step ResponseWriter::send(Transport& transport)
{
    const qint64 turnEnds = mBytesSent + kTurn;
    while (mBytesSent < turnEnds) {
        while (mBlockSent == mBlock.size() && !mSendsFile) {
            if (isAtEnd())
                return Step::Sent;
            if (!prepare(transport))
                return broken(mFault);
        }
        switch (sendPrepared(transport)) {
        case Transport::Outcome::Done:
            break;
        case Transport::Outcome::WantsRead:
            return Step::WantsRead;
        case Transport::Outcome::WantsWrite:
            return Step::WantsWrite;
        case Transport::Outcome::Ended:
            return broken(QStringLiteral("the file was cut short"));
        case Transport::Outcome::Failed:
            return broken({});
        }
    }
    return Step::Yields;
}

}  // namespace Kdd::Http
