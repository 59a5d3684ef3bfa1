#pragma once

#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "platform/base/Export.h"
#include "platform/base/Stopwatch.h"

#include <QtGlobal>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

#include <vector>

namespace Kdd
{

/// An object of the network as the source of a DCMTK input stream.
///
/// DCMTK asks after each piece how many bytes are left, holds lengths in the data against the answer, and steps back
/// over what it has only looked at. Therefore the length of the object must be known; when the server does not tell it,
/// the object is fetched into memory first, up to the bound of a response. The last bytes read are kept.
///
/// Conditions: "End-of-file reached on input operation" for bytes beyond the end, "Read/write error on IO operation"
/// when the transfer broke off, "Logical error on IO operation" without a stream, "putback failed". Used by one
/// thread at a time.
class KDD_EXPORT DownloadProducer : public DcmProducer
{
public:
    DownloadProducer();
    explicit DownloadProducer(KxCurlDownloadStream&& stream);

    OFBool good() const override { return mStatus.good(); }
    OFCondition status() const override { return mStatus; }
    OFBool eos() override { return mPosition >= mLength; }
    offile_off_t avail() override { return mLength - mPosition; }
    offile_off_t read(void* bytes, offile_off_t count) override;
    offile_off_t skip(offile_off_t count) override;

    /// Back to 4 KiB before the furthest byte read, which is more than the parser ever asks for.
    void putback(offile_off_t count) override;

    /// Begins with another object.
    void setStream(KxCurlDownloadStream&& stream);

    KxCurlDownloadStream& stream() { return mStream; }

    /// Bytes handed out so far, and of the object in all.
    qint64 bytesRead() const { return mPosition; }
    qint64 length() const { return mLength; }

    /// How long was waited for bytes [ms].
    int networkTime() const { return mNetworkTime.elapsed(); }

private:
    void fetchAll();
    qint64 fetch(char* to, qint64 count);
    bool fillWindow();
    qint64 readBeyondWindow(char* to, qint64 count);
    void keepHistory(const char* bytes, qint64 count);

    qint64 windowEnd() const { return mWindowStart + static_cast<qint64>(mWindow.size()); }

    KxCurlDownloadStream mStream;
    OFCondition mStatus;
    std::vector<char>
        mWindow;  // of the object, from mWindowStart on; all of it when the length was not known
    qint64 mWindowStart = 0;
    qint64 mPosition = 0;
    qint64 mLength = 0;
    StopwatchSum mNetworkTime;
};

}  // namespace Kdd
