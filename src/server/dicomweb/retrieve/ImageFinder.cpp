#include "server/dicomweb/retrieve/ImageFinder.h"

#include <kddlib/LogFile.h>
#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{

namespace
{

bool shows(const ServedStudy& study, const ResourcePath& path)
{
    return study.look([&](const TagFile& file) {
        return path.instance.isEmpty() ? path.series.isEmpty() || file.findSeries(path.series) != nullptr
                                       : findImage(file, path) != nullptr;
    });
}

}  // namespace

Verdict findStudy(StudyShelf& shelf, const ResourcePath& path, std::shared_ptr<const ServedStudy>& study)
{
    Presence presence = Presence::Absent;
    const auto isThere = [&] {
        presence = shelf.find(path.study, study);
        // A tag file that is no good may be made anew with what has arrived.
        return presence == Presence::Held || (study != nullptr && shows(*study, path));
    };
    if (isLackingAfter(isThere, path.study, shelf.arrivals()))
        presence = Presence::Held;
    return verdictOn(presence);
}

const TagMap* findImage(const TagFile& file, const ResourcePath& path)
{
    const TagMap* image = file.findImage(path.instance);
    return image != nullptr && image->uid(TagMap::SeriesLevel) == path.series ? image : nullptr;
}

Verdict listImages(const ServedStudy& study, const ResourcePath& path, QVector<ListedImage>& images)
{
    study.look([&](const TagFile& file) {
        const auto add = [&](const TagMap& image) {
            images.append(
                {TagFile::imageKey(image), image.uid(TagMap::SeriesLevel), image.uid(TagMap::ImageLevel)});
        };
        if (!path.instance.isEmpty()) {
            const TagMap* image = findImage(file, path);
            if (image != nullptr)
                add(*image);
            return;
        }
        for (const TagMap* series : file.seriesByUID()) {
            if (!path.series.isEmpty() && series->uid(TagMap::SeriesLevel) != path.series)
                continue;
            for (const TagMap* image : series->children())
                add(*image);
        }
    });
    if (!images.isEmpty())
        return {};
    return {404, !path.instance.isEmpty() ? QStringLiteral("There is no such instance in that series")
                 : !path.series.isEmpty() ? QStringLiteral("There is no such series in that study")
                                          : QStringLiteral("The study has no instances")};
}

Verdict takeImage(const ServedStudy& study, const QByteArray& key, ImageOrigin& origin,
                  std::unique_ptr<TagMap>* map)
{
    return study.look([&](const TagFile& file) -> Verdict {
        const TagMap* image = file.findImage(key);
        if (image == nullptr)
            return {404, QStringLiteral("There is no such instance")};
        const Result known = ImageOrigin::of(*image, origin);
        if (known.bad()) {
            LogFile::errorf("Image %s cannot be served: %s", key.constData(), qUtf8Printable(known.text()));
            return {500, QStringLiteral("It is not known where the instance's DICOM file is")};
        }
        if (map != nullptr)
            map->reset(image->clone());
        return {};
    });
}

}  // namespace Kdd::DicomWeb
