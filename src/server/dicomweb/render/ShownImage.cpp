#include "server/dicomweb/render/ShownImage.h"

#include "server/dicomweb/render/PictureForm.h"
#include "server/dicomweb/retrieve/ImageFinder.h"

#include <QFile>
#include <QList>

#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/KxCurlClient.h>
#include <kddlib/KxDcmFileLoader.h>
#include <kddlib/KxVolumeInfo.h>
#include <kddlib/LogFile.h>
#include <kddlib/ObjectAddress.h>
#include <kddlib/PathName.h>
#include <kddlib/PreviewGenerator.h>
#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{
namespace
{

// Longer values stay in the file until they are asked for: of many frames one is read [bytes].
constexpr unsigned long kLongestInMemory = 65536;

QByteArray textOf(DcmDataset& dataset, const DcmTagKey& key)
{
    OFString text;
    dataset.findAndGetOFString(key, text);
    return QByteArray(text.c_str()).trimmed();
}

bool isSame(DcmDataset& dataset, const ImageOrigin& origin)
{
    return textOf(dataset, DCM_StudyInstanceUID) == origin.studyInstanceUID &&
           textOf(dataset, DCM_SOPInstanceUID) == origin.sopInstanceUID;
}

bool hasPixels(DcmDataset& dataset)
{
    return dataset.tagExists(DCM_PixelData) || dataset.tagExists(DCM_FloatPixelData) ||
           dataset.tagExists(DCM_DoubleFloatPixelData);
}

/// Has the dataset show what the tag file shows. Corrections concern attributes outside of sequences; what stands in
/// sequences, tables of grey values among it, stays with its long values, which the tag file leaves out.
void correct(DcmDataset& dataset, const TagMap& shown)
{
    DcmDataset attributes;
    shown.insertInto(attributes);
    while (DcmElement* element = attributes.remove(0UL)) {
        if (element->ident() == EVR_SQ || dataset.insert(element, OFTrue).bad())
            delete element;
    }
}

}  // namespace

ShownImage::ShownImage() = default;
ShownImage::~ShownImage() = default;

DcmDataset& ShownImage::dataset() const
{
    return *mFile->getDataset();
}

Verdict ShownImage::open(const ServedStudy& study, const QByteArray& key)
{
    ImageOrigin origin;
    std::unique_ptr<TagMap> shown;
    const Verdict known = takeImage(study, key, origin, &shown);
    if (known.bad())
        return known;
    mPath = pathText(origin.path);
    Result unopened;  // the loader tells the reason; what has no state here lies behind a URL
    mState = Http::OpenFile::open(origin.path, unopened);
    mFile = std::make_unique<KxDcmFileLoader>(KxDcmFileLoader::Mode::BoundedLocal);
    const OFCondition condition =
        mFile->loadFile(OFFilename(origin.path.constData()), EXS_Unknown, EGL_noChange, kLongestInMemory);
    if (condition.bad()) {
        LogFile::errorf("%s: %s", shownAddress(origin.path).constData(), condition.text());
        const bool isGone = !KxCurlClient::isUrl(origin.path.constData()) && !QFile::exists(mPath);
        return {isGone ? 410 : 500, QStringLiteral("The instance's DICOM file cannot be read")};
    }
    if (!isSame(dataset(), origin)) {
        LogFile::errorf("%s holds another image than %s by now", shownAddress(origin.path).constData(),
                        key.constData());
        return {410, QStringLiteral("The instance's DICOM file holds another one by now")};
    }
    correct(dataset(), *shown);
    return {};
}

int ShownImage::frames() const
{
    if (!hasPixels(dataset()))
        return 0;
    Sint32 number = 1;
    dataset().findAndGetSint32(DCM_NumberOfFrames, number);
    return qMax<Sint32>(number, 1);
}

/// Long values of a local file are read by its name when they are asked for, which may be another file's by then.
Verdict ShownImage::checkUnchanged() const
{
    if (mState == nullptr)
        return {};
    Result result;
    const auto now = Http::OpenFile::open(pathBytes(mPath), result);
    if (now != nullptr && now->identity() == mState->identity())
        return {};
    LogFile::errorf("%s was changed while it was read", qUtf8Printable(mPath));
    return {503, QStringLiteral("The instance's DICOM file is being changed; ask again")};
}

Verdict ShownImage::draw(int frame, const RenderRequest& rendering, QImage& picture) const
{
    const Verdict drawn = drawAsRead(frame, rendering, picture);
    const Verdict unchanged = checkUnchanged();
    return unchanged.bad() ? unchanged : drawn;
}

Verdict ShownImage::drawAsRead(int frame, const RenderRequest& rendering, QImage& picture) const
{
    if (frames() == 0)
        return {404, QStringLiteral("The instance has no pixels")};
    if (frame != FrameView::kRepresentative && (frame < 0 || frame >= frames()))
        return {404, QStringLiteral("There is no frame %1 among %2").arg(qint64(frame) + 1).arg(frames())};
    FrameView view;
    view.frame = frame;
    view.window = rendering.window;
    // A part of the picture may fill the viewport, so that it is needed as it is stored.
    if (rendering.region.isWhole() && !rendering.viewport.isEmpty()) {
        view.width = rendering.viewport.width();
        view.height = rendering.viewport.height();
    }
    Result result;
    const auto info = KxVolumeInfo::readVolumeInfo(dataset(), view, mPath, result);
    // Of the size that it was read in; -1 fits it into nothing but square pixels.
    const QImage read = info != nullptr ? PreviewGenerator::convertToQImage(info.get(), -1, -1) : QImage();
    if (read.isNull()) {
        LogFile::warnf("No picture of %s: %s", qUtf8Printable(mPath), qUtf8Printable(result.text()));
        return {406, QStringLiteral("The instance's pixels cannot be shown")};
    }
    picture = fitInto(read, rendering);
    if (picture.isNull())
        return {400, QStringLiteral("The region of the viewport lies outside of the picture")};
    return {};
}

}  // namespace Kdd::DicomWeb
