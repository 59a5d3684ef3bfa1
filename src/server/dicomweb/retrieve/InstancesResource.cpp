#include "server/dicomweb/retrieve/InstancesResource.h"

#include "server/dicomweb/retrieve/EntriesProducer.h"
#include "server/dicomweb/retrieve/InstanceParts.h"
#include "server/http/MultipartWriter.h"
#include "server/http/ZipStream.h"

namespace Kdd::DicomWeb
{

namespace
{

QByteArray contentType(const QByteArray& syntaxUID)
{
    return "application/dicom; transfer-syntax=" + syntaxUID;
}

/// A part of a name in an archive. UIDs in old files can hold anything, and "..", of which nothing may come.
QByteArray nameOf(const QByteArray& uid, int number)
{
    const bool isName = isUID(uid) && !uid.startsWith('.');
    return isName ? uid : "object-" + QByteArray::number(number);
}

std::unique_ptr<Http::Packing> packingOf(const InstanceForm& form)
{
    if (form.packing == InstanceForm::Packing::Zip)
        return std::make_unique<Http::ZipStream>();
    return std::make_unique<Http::MultipartWriter>("application/dicom");
}

/// Takes those out that cannot be given. The verdict is bad when none is left.
Verdict keepGivable(const ServedStudy& study, const InstanceForm& form, ObjectShelf& objects,
                    QVector<ListedImage>& images)
{
    Verdict first;
    QVector<ListedImage> kept;
    for (const ListedImage& image : qAsConst(images)) {
        const Verdict verdict = checkInstance(study, image, form, objects);
        if (verdict.good())
            kept.append(image);
        else if (first.good())
            first = verdict;
    }
    images = kept;
    return kept.isEmpty() ? first : Verdict();
}

Http::Response one(const ServedStudy& study, const ListedImage& image, const InstanceForm& form,
                   ObjectShelf& objects)
{
    Http::Response response;
    MadeInstance made;
    if (form.packing == InstanceForm::Packing::Single) {
        const Verdict verdict = makeInstance(study, image, form, objects, response.body, made);
        response.addHeader("Content-Type", contentType(made.syntaxUID));
        return verdict.good() ? std::move(response) : verdict.response();
    }
    Http::MultipartWriter packing("application/dicom");
    response.body.emplace_back();
    const Verdict verdict = makeInstance(study, image, form, objects, response.body, made);
    if (verdict.bad())
        return verdict.response();
    response.body.front() = packing.begin({}, contentType(made.syntaxUID));
    response.body.emplace_back(packing.end() + packing.finish());
    response.addHeader("Content-Type", packing.mediaType());
    return response;
}

Http::Response several(const std::shared_ptr<const ServedStudy>& study, const QVector<ListedImage>& images,
                       const InstanceForm& form, const std::shared_ptr<ObjectShelf>& objects,
                       const QByteArray& studyUID)
{
    const bool isZip = form.packing == InstanceForm::Packing::Zip;
    const auto make = [=](int number, std::vector<Entry>& entries) {
        const ListedImage& image = images.at(number);
        Entry entry;
        MadeInstance made;
        const Verdict verdict = makeInstance(*study, image, form, *objects, entry.body, made);
        entry.mediaType = contentType(made.syntaxUID);
        if (isZip)
            entry.name = nameOf(studyUID, 0) + '/' + nameOf(image.seriesUID, 0) + '/' +
                         nameOf(image.sopUID, number + 1) + ".dcm";
        if (verdict.good())
            entries.push_back(std::move(entry));
        return verdict;
    };
    std::unique_ptr<Http::Packing> packing = packingOf(form);
    Http::Response response;
    response.addHeader("Content-Type", packing->mediaType());
    if (isZip)
        response.addHeader("Content-Disposition", "attachment; filename=\"" + nameOf(studyUID, 0) + ".zip\"");
    response.body.emplace_back(std::make_unique<EntriesProducer>(images.size(), make, std::move(packing)));
    return response;
}

}  // namespace

bool InstancesResource::owns(const ResourcePath& path) const
{
    return path.resource.isEmpty() && path.rest.isEmpty() && !path.study.isEmpty();
}

Http::Response InstancesResource::answer(const Http::Request& request, const ResourcePath& path)
{
    std::shared_ptr<const ServedStudy> study;
    QVector<ListedImage> images;
    InstanceForm form;
    if (!chooseInstanceForm(Http::AcceptHeader::of(request), !path.instance.isEmpty(), form))
        return Http::failure(
            406, QStringLiteral("Instances can be given as multipart/related of application/dicom, as "
                                "application/zip, and one alone as application/dicom"));
    Verdict verdict = findStudy(*mStudies, path, study);
    if (verdict.good())
        verdict = listImages(*study, path, images);
    if (verdict.bad())
        return verdict.response();
    if (!path.instance.isEmpty() && form.packing != InstanceForm::Packing::Zip)
        return one(*study, images.first(), form, *mObjects);

    const int all = images.size();
    verdict = keepGivable(*study, form, *mObjects, images);
    if (verdict.bad())
        return verdict.response();
    Http::Response response = several(study, images, form, mObjects, path.study);
    if (images.size() < all) {
        response.status = 206;
        response.addHeader("Warning", "299 kdd \"" + QByteArray::number(all - images.size()) + " of " +
                                          QByteArray::number(all) +
                                          " instances cannot be given in this form\"");
    }
    return response;
}

}  // namespace Kdd::DicomWeb
