#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"
#include "platform/volume/FrameView.h"

#include <QByteArray>
#include <QString>

#include <memory>
#include <utility>

class DcmDataset;

namespace Kdd
{

class OrlanMesh;

/// The pixels that a preview is made of, and how they are to be shown.
///
/// A value behind a shared pointer; nothing of it changes once it is made. Any thread may use it.
class KDD_EXPORT KxVolumeInfo
{
public:
    /// What one pixel consists of.
    enum ComponentCode { Grey = 1, Colour = 3, ColourAlpha = 4, SixComponents = 6 };

    /// One representative frame of a DICOM image: of several frames one in the middle third, of a video the frame at
    /// three tenths of its duration. Grey values are what the modality look-up table or rescale gives; palettes are
    /// applied; colour is RGB. The value range is the image's own window where it has a usable one (of several the
    /// first; it must show some of the pixels), else that of its VOI look-up table, which is applied then, else that
    /// of its pixels without padding. A range of fewer than 64 steps, such as that of a mask, is spread to 0..65535
    /// together with the values. Pixels are reduced to about `width` x `height`, never below it, by averaging whole
    /// blocks. `path` is where the dataset was loaded from, for messages.
    ///
    /// Null, and `result` says why, when there is nothing to show.
    static std::shared_ptr<KxVolumeInfo> readVolumeInfo(DcmDataset* dataset, int width, int height,
                                                        const QString& path, Result& result);

    /// The same of the frame that `view` names, with its window. Failure also: there is no such frame, or the image is a
    /// video, of which no frame stands alone, and one was named.
    static std::shared_ptr<KxVolumeInfo> readVolumeInfo(DcmDataset& dataset, const FrameView& view,
                                                        const QString& path, Result& result);

    /// One slice of a volume file; the window is the file's own ("WindowCenter", "WindowWidth"), else the range of the
    /// slice without padding.
    static std::shared_ptr<KxVolumeInfo> readVolumeInfo(const OrlanMesh& mesh, int width, int height,
                                                        int slice, Result& result);

    /// Pixels from elsewhere, such as a frame of a video; `mesh` may be null, else it says how they are to be shown.
    static std::shared_ptr<KxVolumeInfo> fromFrame(const OrlanMesh* mesh, const TypedData2D& frame);

    bool previewHasPixels() const { return !mPixels.isEmpty(); }
    int width() const { return mPixels.width; }
    int height() const { return mPixels.height; }
    int bytesPerPixel() const { return mPixels.bytesPerPixel(); }
    qint64 rowStride() const { return mPixels.rowStride(); }
    const char* pixels() const { return mPixels.pixels.constData(); }
    ComponentCode componentCode() const { return mComponentCode; }

    /// Never UInt32 or Float64: such pixels are turned into Float32.
    PrimitiveType primitiveType() const { return mPixels.type; }

    /// The range of values that goes from black to white.
    float lowestValue() const { return mLowest; }
    float highestValue() const { return mHighest; }

    /// Width over height of a pixel: as a preview of square pixels is W x H * this aspect.
    float pixelAspectRatio() const { return mAspect; }

    /// Whether low values are shown white.
    bool isInverted() const { return mInverted; }

    KxVolumeInfo(TypedData2D pixels, ComponentCode code, float lowest, float highest, float aspect,
                 bool inverted)
        : mPixels(std::move(pixels))
        , mComponentCode(code)
        , mLowest(lowest)
        , mHighest(highest)
        , mAspect(aspect)
        , mInverted(inverted)
    {
    }

private:
    TypedData2D mPixels;
    ComponentCode mComponentCode;
    float mLowest;
    float mHighest;
    float mAspect;
    bool mInverted;
};

}  // namespace Kdd
