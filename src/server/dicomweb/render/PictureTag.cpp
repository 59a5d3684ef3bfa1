#include "server/dicomweb/render/PictureTag.h"

#include "server/dicomweb/retrieve/BulkValue.h"

#include <kddlib/BuildInfo.h>

namespace Kdd::DicomWeb
{

namespace
{

/// The release too: another one may draw in another way.
QByteArray tagOf(const ServedStudy& study, const PictureTag& picture, const QByteArray& file)
{
    return etagOf(study.version() + '\n' + picture.image + '\n' + file,
                  picture.what + '\n' + BuildInfo::text());
}

}  // namespace

QByteArray PictureTag::ofStored(const ServedStudy& study) const
{
    return tagOf(study, *this, {});
}

Verdict PictureTag::ofDrawn(const ServedStudy& study, ObjectShelf& objects, QByteArray& tag) const
{
    ImageOrigin origin;
    FoundObject object;
    tag.clear();
    Verdict verdict = takeImage(study, image, origin, nullptr);
    if (verdict.good())
        verdict = objects.open(origin, object);
    if (verdict.good() && !object.identity.isEmpty())
        tag = tagOf(study, *this, origin.path + '\n' + object.identity);
    // What is damaged for us may be shown all the same.
    return verdict.status == 410 ? verdict : Verdict();
}

}  // namespace Kdd::DicomWeb
