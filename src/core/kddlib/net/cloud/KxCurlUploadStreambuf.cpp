#include "kddlib/net/cloud/KxCurlUploadStreambuf.h"

#include "kddlib/net/cloud/UploadErrors.h"
#include "platform/base/LogFile.h"

#include <cstring>
#include <exception>
#include <utility>

namespace Kdd
{

KxCurlUploadStreambuf::KxCurlUploadStreambuf(std::unique_ptr<KxCurlUploadSession> session, int capacity)
    : mSession(std::move(session))
    , mCapacity(capacity)
    , mBytes(new char[static_cast<std::size_t>(capacity)])
{
    setp(mBytes.get(), mBytes.get() + mCapacity);
}

/// Once a step has failed the storage may have part of a chunk, and only this session knew how much.
template <typename Step>
bool KxCurlUploadStreambuf::guard(const char* step, Step work)
{
    if (!mError.empty())
        return false;
    try {
        work();
        return true;
    } catch (const std::exception& fault) {
        mError = explained(fault);
        if (mLogsErrors)
            LogFile::warnf("Got exception while trying to %s. Aborting.\n%s", step, fault.what());
        return false;
    }
}

/// Not copied: the session keeps nothing of it beyond the call.
QByteArray KxCurlUploadStreambuf::pending() const
{
    return QByteArray::fromRawData(pbase(), static_cast<int>(pptr() - pbase()));
}

bool KxCurlUploadStreambuf::flushWholeChunks()
{
    // The storage takes nothing but whole steps until the last chunk; the rest waits for its fellows.
    const int count = pending().size();
    const int remainder = count % KxCurlUploadSession::kGranularity;
    const int whole = count - remainder;
    if (whole > 0 && !guard("flush", [&] {
            mSession->uploadChunk(QByteArray::fromRawData(pbase(), whole),
                                  KxCurlUploadSession::Chunk::Middle);
        }))
        return false;
    std::memmove(mBytes.get(), mBytes.get() + whole, static_cast<std::size_t>(remainder));
    setp(mBytes.get(), mBytes.get() + mCapacity);
    pbump(remainder);
    return true;
}

int KxCurlUploadStreambuf::sync()
{
    return mIsOpen && mError.empty() && flushWholeChunks() ? 0 : -1;
}

KxCurlUploadStreambuf::int_type KxCurlUploadStreambuf::overflow(int_type character)
{
    if (sync() != 0)
        return traits_type::eof();
    // Less than a step is left, so that there is room again.
    if (!traits_type::eq_int_type(character, traits_type::eof()))
        sputc(traits_type::to_char_type(character));
    return traits_type::not_eof(character);
}

bool KxCurlUploadStreambuf::close()
{
    const bool isDone =
        guard("final flush", [&] { mSession->uploadChunk(pending(), KxCurlUploadSession::Chunk::Last); });
    // Closed whatever came of it: after a final chunk there is nothing that could be sent.
    abandon();
    return isDone;
}

void KxCurlUploadStreambuf::abandon()
{
    mIsOpen = false;
    setp(nullptr, nullptr);
    mBytes.reset();
}

}  // namespace Kdd
