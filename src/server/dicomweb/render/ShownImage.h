#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/render/RenderRequest.h"
#include "server/http/OpenFile.h"

#include <QImage>

#include <memory>

class DcmDataset;

namespace Kdd
{
class KxDcmFileLoader;
}

namespace Kdd::DicomWeb
{

/// The picture of an image: pixels from its DICOM file, and how they are to be shown as the tag file has it, corrections
/// included. Used by one thread at a time.
class ShownImage
{
public:
    ShownImage();
    ~ShownImage();

    /// Opens the file of the image that the study knows under the key. 410 when it is gone or holds another image by
    /// now, 500 when it cannot be read; the log has the path and the reason.
    Verdict open(const ServedStudy& study, const QByteArray& key);

    /// 0 when it has no pixels.
    int frames() const;

    /// The picture of a frame (0-based, or FrameView::kRepresentative), cut, turned and fitted as wanted. 404 without
    /// such a frame; 406 when its pixels cannot be shown; 503 when the file was changed meanwhile.
    Verdict draw(int frame, const RenderRequest& rendering, QImage& picture) const;

private:
    DcmDataset& dataset() const;
    Verdict checkUnchanged() const;
    Verdict drawAsRead(int frame, const RenderRequest& rendering, QImage& picture) const;

    std::shared_ptr<const Http::OpenFile> mState;
    std::unique_ptr<KxDcmFileLoader> mFile;
    QString mPath;
};

}  // namespace Kdd::DicomWeb
