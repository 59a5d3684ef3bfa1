#pragma once

#include "platform/base/OrderedWork.h"

#include <QByteArray>
#include <QList>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <memory>

namespace Kdd
{

class RemoteFile;
class Result;

/// Requests that are under way at a time, each over a connection of its own. At 20 ms to the server and one request for
/// each image that is 800 images in a second; more would keep one core busy with themselves.
constexpr int kRemoteFilesAtOnce = 16;

/// What is fetched of an image to begin with: most headers fit into it whole [bytes].
constexpr qint64 kRemoteHead = 16 * 1024;

/// The same where its pixels will be asked for: small pictures come with it.
constexpr qint64 kRemotePicture = 1024 * 1024;

/// As `readDicomFile` for a file behind a URL: values longer than 4096 bytes stay there until they are asked for, which
/// fails when the object is another one by then.
OFCondition readRemoteDicom(const std::shared_ptr<RemoteFile>& file, DcmFileFormat& format);

/// Why a file could not be opened or read, in DCMTK's terms.
OFCondition conditionOf(const Result& fault);

/// As `loadDicomFile`, but of an object behind a URL no more is fetched than its header; `first` is how much to begin
/// with. For whoever does not look at every value.
OFCondition loadDicomHeader(const QByteArray& name, DcmFileFormat& format, qint64 first = kRemoteHead);

/// A header that was loaded, or why not.
struct LoadedHeader
{
    std::unique_ptr<DcmFileFormat> format;
    OFCondition condition;
};

/// Loads the headers of objects behind URLs many at once, ahead of being asked for. Used by one thread.
class RemoteHeaders
{
public:
    /// `first` as for `loadDicomHeader`.
    RemoteHeaders(QList<QByteArray> urls, qint64 first);

    /// The next one; to be called once for each URL, in their order.
    LoadedHeader next() { return mWork.next(); }

private:
    const QList<QByteArray> mUrls;
    OrderedWork<LoadedHeader> mWork;  // last, because its threads use the rest
};

}  // namespace Kdd
