#include "kddlib/StudySources.h"
#include "kddlib/TagFileGenerator.h"
#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/previews/PreviewGenerator.h"
#include "kddlib/previews/QuadrantNavigation.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/base/LogFile.h"
#include "platform/late/LateLibrary.h"
#include "platform/os/PathName.h"
#include "platform/volumefile/OrlanMesh.h"

namespace Kdd
{

namespace
{

const char* const kModality = "G0008-0060";
const char* const kMammography = "MG";

}  // namespace

/// Of the images chosen those that are held.
void TagFileGenerator::addPreviews(TagFile& tagFile, const QList<QByteArray>& chosen,
                                   const StudySources& sources)
{
    const StopwatchSum::Running running(mPreviewWatch);
    QList<TagMap*> images;
    QList<QByteArray> urls;
    for (const QByteArray& sopUID : chosen) {
        TagMap* image = tagFile.findImage(sopUID);
        if (image == nullptr)
            continue;
        const QByteArray path = filePathOf(*image);
        // Its file could not be read before, so the preview that it brought along is the best there is.
        if (sources.kept.contains(path) && image->findElement(kPreview) != nullptr)
            continue;
        images.append(image);
        if (isObjectAddress(path))
            urls.append(path);
    }
    RemoteHeaders ahead(urls, kRemotePicture);
    for (TagMap* image : qAsConst(images)) {
        const QByteArray path = filePathOf(*image);
        if (isObjectAddress(path))
            addPreview(tagFile, *image, path, ahead.next());
        else if (DcmDataset* dataset = sources.datasets.find(path))
            tagFile.addPreview(image, dataset, pathText(path));
        else
            tagFile.addPreview(image, path);
    }
}

/// Of many frames behind a URL the one that is shown is fetched.
void TagFileGenerator::addPreview(TagFile& tagFile, TagMap& image, const QByteArray& url,
                                  const LoadedHeader& loaded)
{
    const QByteArray shown = shownAddress(url);
    if (loaded.condition.good())
        tagFile.addPreview(&image, loaded.format->getDataset(), pathText(shown));
    else
        LogFile::warnf("Could not create preview image for DICOM file: %s (%s)", shown.constData(),
                       loaded.condition.text());
}

/// Of the middle slice. Of a mammogram the same picture tells where the breast lies.
void TagFileGenerator::addPreview(OrlanMesh& mesh, const char* path, VolumeInfo& info)
{
    const StopwatchSum::Running running(mPreviewWatch);
    if (const Result loaded = loadLate(LateLibrary::Pictures); loaded.bad())
        return LogFile::warnf("Could not create preview image of %s: %s", path,
                              qUtf8Printable(loaded.text()));
    const Vec2i size = TagFile::previewSize();
    const QImage image = PreviewGenerator::createPreviewImage(
        &mesh, path, static_cast<unsigned long>(size.x), static_cast<unsigned long>(size.y), info.dims.z / 2);
    if (image.isNull())
        return;
    info.preview = PreviewGenerator::createPreviewData(image);
    if (dicomValue(mesh, kModality) == kMammography)
        info.quadrantData = QuadrantNavigation::computeImageBoxAndCenter(
            image, QuadrantNavigation::checkOrientation(mesh.parameters().bundle("DICOM")));
}

}  // namespace Kdd
