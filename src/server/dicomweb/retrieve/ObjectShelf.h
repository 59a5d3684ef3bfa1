#pragma once

#include "server/dicomweb/Verdict.h"
#include "server/dicomweb/retrieve/StoredObject.h"
#include "server/http/CacheCount.h"

#include <QCache>

#include <kddlib/CorrectedDataset.h>

#include <mutex>

namespace Kdd::DicomWeb
{

/// A DICOM file that is open, and where its frames lie.
struct FoundObject
{
    std::shared_ptr<StoredObject> bytes;
    FrameIndex index;
    QByteArray identity;  ///< which file in which state; empty where that cannot be told
};

/// Opens the DICOM files of images and remembers where their frames lie, and what those of unusual form were converted
/// to. May be used on any thread.
class ObjectShelf
{
public:
    /// `capacity` bounds what is remembered [bytes].
    explicit ObjectShelf(int capacity);

    /// The file of an image. Refuses, 410 when it is gone or holds another image by now, 500 when it cannot be read; the
    /// log has the path and the reason.
    Verdict open(const ImageOrigin& origin, FoundObject& found);

    /// How often a file was remembered.
    const Http::CacheCount& count() const { return mCount; }

private:
    struct Remembered
    {
        FrameIndex index;
        QByteArray converted;  // null when the file is used as it is
    };

    Result find(const QByteArray& path, FoundObject& found);
    Result examine(const QByteArray& path, FoundObject& found, Remembered& seen);

    Http::CacheCount mCount;
    std::mutex mMutex;
    QCache<QByteArray, Remembered> mSeen;  // by path and identity
};

}  // namespace Kdd::DicomWeb
