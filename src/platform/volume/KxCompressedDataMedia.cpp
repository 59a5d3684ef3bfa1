#include "platform/volume/KxCompressedDataMedia.h"

#include "platform/base/LogFile.h"
#include "platform/decoder/DecoderPlace.h"
#include "platform/decoder/DecoderPool.h"
#include "platform/os/ModuleFile.h"
#include "platform/os/PathName.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/volume/ApartVideo.h"
#include "platform/volume/ffmpeg/VideoModule.h"

#include <QFile>
#include <QStringList>

#include <dlfcn.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <new>

namespace Kdd
{
namespace
{

/// Part of a file.
class FileRange : public MediaSource
{
public:
    Result open(const QString& path, qint64 offset, qint64 size)
    {
        const Result opened = mFile.open(pathBytes(path).constData());
        if (opened.bad())
            return opened;
        if (offset < 0 || size <= 0 || offset >= mFile.size())
            return Result::failure(QStringLiteral("there are no %1 bytes at %2").arg(size).arg(offset));
        mOffset = offset;
        // What is there of a file that was cut short may be enough.
        mSize = std::min(size, mFile.size() - offset);
        return {};
    }

    qint64 size() const override { return mSize; }

    qint64 read(qint64 offset, char* out, qint64 length) override
    {
        return mFile.readAt(mOffset + offset, out, std::min(length, mSize - offset));
    }

private:
    RandomAccessFile mFile;
    qint64 mOffset = 0;
    qint64 mSize = 0;
};

/// Who says where the module is gets it from nowhere else.
QStringList videoFolders()
{
    if (qEnvironmentVariableIsSet("KDD_MODULE_FOLDER"))
        return {QFile::decodeName(qgetenv("KDD_MODULE_FOLDER"))};
    return moduleFolders();
}

struct VideoModule
{
    VideoModuleEntry entry = nullptr;
    QString reason;
};

VideoModule findModule()
{
    VideoModule module;
    void* handle = nullptr;
    const Result result =
        openModule(QStringLiteral("video module"), QLatin1String(kVideoModuleFile), videoFolders(), handle);
    module.reason = result.text();
    if (result.good())
        module.entry = reinterpret_cast<VideoModuleEntry>(::dlsym(handle, kVideoModuleEntry));
    if (result.good() && module.entry == nullptr)
        module.reason =
            QStringLiteral("The video module cannot be loaded: %1").arg(QString::fromLocal8Bit(::dlerror()));
    return module;
}

/// Looked for once: what is missing then is missing for the life of the process.
const VideoModule& videoModule()
{
    static const VideoModule sModule = findModule();
    return sModule;
}

// Nothing may be thrown through the decoders: they are C.
std::int64_t readSource(void* source, std::int64_t offset, void* out, std::int64_t length) noexcept
{
    try {
        return static_cast<MediaSource*>(source)->read(offset, static_cast<char*>(out), length);
    } catch (const std::exception& fault) {
        LogFile::warnf("Reading of a video failed: %s", fault.what());
        return -1;
    }
}

unsigned char* allocateFrame(void* target, std::int32_t width, std::int32_t height) noexcept
{
    auto& frame = *static_cast<TypedData2D*>(target);
    const qint64 size = qint64{width} * height * 3;
    if (size <= 0 || size > std::numeric_limits<int>::max() / 2)
        return nullptr;
    try {
        frame.pixels.resize(static_cast<int>(size));
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
    frame.width = width;
    frame.height = height;
    frame.components = 3;
    return reinterpret_cast<unsigned char*>(frame.pixels.data());
}

}  // namespace

Result loadVideoModule()
{
    return videoModule().entry == nullptr ? Result::failure(videoModule().reason) : Result();
}

Result decodeVideoInside(MediaSource& source, const VideoPlace& place, TypedData2D& frame)
{
    Result loaded = loadVideoModule();
    if (loaded.bad())
        return loaded;
    TypedData2D decoded;
    VideoRequest request;
    request.width = place.width;
    request.height = place.height;
    request.fraction = place.fraction;
    request.source = &source;
    request.size = source.size();
    request.read = &readSource;
    request.target = &decoded;
    request.allocate = &allocateFrame;
    if (videoModule().entry(&request) != 1) {
        // A module of another version does not touch the request.
        const QString reason = QString::fromUtf8(static_cast<const char*>(request.reason));
        return Result::failure(
            QStringLiteral("No frame can be decoded: ") +
            (reason.isEmpty() ? QStringLiteral("the video module is of another version") : reason));
    }
    frame = decoded;
    return {};
}

Result KxCompressedDataMedia::decodeRepresentativeFrame(MediaSource& source, int width, int height,
                                                        double fraction, TypedData2D& frame)
{
    if (width <= 0 || height <= 0 || std::isnan(fraction))
        return Result::failure(QStringLiteral("No frame has the size %1 x %2").arg(width).arg(height));
    const VideoPlace place = {width, height, std::clamp(fraction, 0.0, 1.0)};
    return decoderPlace() == DecoderPlace::Inside
               ? decodeVideoInside(source, place, frame)
               : decodeVideoApart(DecoderPool::ofProcess(), source, place, frame);
}

TypedData2D KxCompressedDataMedia::decodeRepresentativeFrame(const QString& path, qint64 offset, qint64 size,
                                                             int width, int height, double fraction)
{
    FileRange range;
    TypedData2D frame;
    Result result = range.open(path, offset, size);
    if (result.good())
        result = decodeRepresentativeFrame(range, width, height, fraction, frame);
    if (result.bad())
        LogFile::warnf("No preview of the video %s: %s", qUtf8Printable(path), qUtf8Printable(result.text()));
    return frame;
}

}  // namespace Kdd
