#pragma once

#include "platform/base/Export.h"
#include "platform/base/Geometry.h"

#include <QByteArray>
#include <QString>

namespace Kdd
{

/// What holds for all tag files of the process, made once at start, before there are several threads, and not locked. Programs set and ask it by way of
/// `TagFile`; it stands apart because the parts that a tag file is made of go by it, too.
class KDD_EXPORT TagFileSettings
{
public:
    enum class CompressionMode { None = 0, Zlib = 1, Lzma = 2 };

    /// What a write must survive.
    enum class Durability {
        Process,    ///< the death of the process; the operating system writes to disk when it sees fit
        PowerLoss,  ///< flushed to disk before the write returns
    };

    /// Bits of `setDebugOptions`: tell how long corrections take, measure the size before optimisation.
    static constexpr unsigned int kTimings = 1;
    static constexpr unsigned int kMeasureUnoptimised = 2;

    static CompressionMode compressionMode() { return sCompressionMode; }
    static void setCompressionMode(CompressionMode mode) { sCompressionMode = mode; }

    /// Width and height that previews fit into [pixels].
    static Vec2i previewSize() { return sPreviewSize; }
    static void setPreviewSize(const Vec2i& size) { sPreviewSize = size; }

    static void setDebugOptions(unsigned int options) { sDebugOptions = options; }

    /// Whether any of the bits is set.
    static bool debugOption(unsigned int bits) { return (sDebugOptions & bits) != 0; }

    static Durability durability() { return sDurability; }
    static void setDurability(Durability durability) { sDurability = durability; }

    /// By what tag files are known among other files.
    static constexpr char kSuffix[] = ".tc";

    /// The folder above all tag files; ends in "/". Until one is set it is what the site's settings say, else the image
    /// database, else "./". May be asked for on any thread.
    static const char* metaFolder();
    static void setMetaFolder(const char* path);

    /// Where the study's file lies: two folder levels and a name made from the MD5 of the UID, under the meta folder.
    static QString cacheFilePathForStudy(const char* studyUID);

private:
    static CompressionMode sCompressionMode;
    static Vec2i sPreviewSize;
    static unsigned int sDebugOptions;
    static QByteArray sMetaFolder;
    static Durability sDurability;
};

}  // namespace Kdd
