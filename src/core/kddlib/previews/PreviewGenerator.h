#pragma once

#include "platform/base/Export.h"
#include "platform/base/TypedData2D.h"

#include <QByteArray>
#include <QImage>
#include <QString>

class DcmDataset;

namespace Kdd
{

class KxVolumeInfo;
class OrlanMesh;

/// Makes previews: small pictures of eight bits per channel, and their JPEG bytes. Every failure is a null picture or
/// empty bytes; why an image has none is logged once, by whoever asked for it. On any thread.
class KDD_EXPORT PreviewGenerator
{
public:
    /// A representative frame of an image, fitted into `width` x `height` [pixels]. `path` is where the dataset was
    /// loaded from. The dataset is only read; values that are not in memory are read from its file. `reason`, if not
    /// null, receives why there is no picture.
    static QImage createPreviewImage(DcmDataset* dataset, unsigned long width, unsigned long height,
                                     const QString& path, QString* reason = nullptr);

    /// A slice of a volume file; null without mesh or path.
    static QImage createPreviewImage(OrlanMesh* mesh, const char* path, unsigned long width,
                                     unsigned long height, int slice);

    /// A frame shown the way the volume is shown, at the configured preview size; null without frame.
    static QImage createPreviewImage(OrlanMesh* mesh, const TypedData2D& frame);

    /// A representative frame of a video file; empty when there is no such regular file or it cannot be decoded.
    static TypedData2D createPreviewImage(const QString& path, int width, int height);

    /// Maps the whole range of values to black to white, makes pixels square and fits the picture into the size.
    static QImage convertToQImage(const KxVolumeInfo* info, int width, int height);

    /// JPEG at the library's default quality.
    static QByteArray createPreviewData(const QImage& image);

private:
    static QImage convertToQImage(const KxVolumeInfo* info, float center, float width);
};

}  // namespace Kdd
