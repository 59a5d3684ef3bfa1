#include "kddlib/net/dicom/BufferedFileProducer.h"

#include <dcmtk/dcmdata/dcerror.h>

#include <cstring>

namespace Kdd
{

namespace
{

/// Most headers fit into it whole.
constexpr qint64 kWindow = 16 * 1024;

makeOFConditionConst(EC_FileChanged, OFM_dcmdata, 0x301, OF_error,
                     "The file has changed since it was opened");

}  // namespace

BufferedFileProducer::BufferedFileProducer(const char* path)
    : mWindow(std::make_unique<char[]>(kWindow))
{
    const Result opened = mFile.open(path);
    if (opened.bad())
        mStatus = makeOFCondition(OFM_dcmdata, 18, OF_error, opened.text().toLocal8Bit().constData());
}

BufferedFileProducer::BufferedFileProducer(const char* path, qint64 offset, const FileIdentity& identity)
    : BufferedFileProducer(path)
{
    mMustNotChange = true;
    mPosition = offset;
    if (good() && !(mFile.identity() == identity))
        mStatus = EC_FileChanged;
}

/// Reads at the position; at most 0 when nothing is to be had, or may be.
qint64 BufferedFileProducer::readFile(void* bytes, qint64 count)
{
    // Read first and asked afterwards: a file that is written in between is noticed, too.
    const qint64 got = mFile.readAt(mPosition, bytes, count);
    if (got <= 0)
        mStatus = EC_InvalidStream;
    else if (mMustNotChange && !mFile.isUnchanged())
        mStatus = EC_FileChanged;
    return good() ? got : 0;
}

/// Moves the window so that it begins at the position.
bool BufferedFileProducer::fillWindow()
{
    mWindowStart = mPosition;
    mWindowSize = readFile(mWindow.get(), kWindow);
    return mWindowSize > 0;
}

offile_off_t BufferedFileProducer::read(void* bytes, offile_off_t count)
{
    auto* to = static_cast<char*>(bytes);
    // No further than the file reached when it was opened, whatever a length in the data says.
    qint64 left = good() ? qMin<qint64>(count, avail()) : 0;
    const qint64 wanted = left;
    while (left > 0) {
        const bool isInWindow = mPosition >= mWindowStart && mPosition < mWindowStart + mWindowSize;
        qint64 part = 0;
        // Long values go straight to where they are wanted.
        if (!isInWindow && left >= kWindow) {
            part = readFile(to, left);
        } else if (isInWindow || fillWindow()) {
            const qint64 offset = mPosition - mWindowStart;
            part = qMin(left, mWindowSize - offset);
            std::memcpy(to, mWindow.get() + offset, static_cast<std::size_t>(part));
        }
        if (part <= 0)
            break;
        to += part;
        mPosition += part;
        left -= part;
    }
    return wanted - left;
}

offile_off_t BufferedFileProducer::skip(offile_off_t count)
{
    // Only the position moves: what lies between is never read.
    const qint64 skipped = good() ? qMax<qint64>(0, qMin<qint64>(count, avail())) : 0;
    mPosition += skipped;
    return skipped;
}

void BufferedFileProducer::putback(offile_off_t count)
{
    if (count > mPosition)
        mStatus = EC_PutbackFailed;
    else
        mPosition -= count;
}

}  // namespace Kdd
