#include "server/browser/StudyAnswer.h"

#include "server/browser/AttributeTree.h"
#include "server/browser/Difference.h"
#include "server/browser/PageAnswer.h"
#include "server/browser/ShownValue.h"

#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>
#include <kddlib/Volume.h>

namespace Kdd::Browser
{
namespace
{

Http::Response notFound(const char* what)
{
    return Http::failure(404, QStringLiteral("The study has no such %1").arg(QLatin1String(what)));
}

/// Of several names only one leads to an object: keys that are no UIDs go by their digests.
TagMap* findBy(const QMap<QByteArray, TagMap*>& nodes, const QByteArray& name)
{
    if (TagMap* found = nodes.value(name, nullptr))
        return publicKey(name) == name ? found : nullptr;
    for (auto it = nodes.begin(); it != nodes.end(); ++it)
        if (publicKey(it.key()) == name)
            return it.value();
    return nullptr;
}

Http::Response picture(const Http::Request& request, const QByteArray& jpeg, const QByteArray& version)
{
    return jpeg.isEmpty() ? notFound("picture") : pictureAnswer(request, jpeg, '"' + version + '"');
}

/// A number of a request; `fallback` when there is none, or it is none.
int numberIn(const Http::Request& request, const char* parameter, int fallback)
{
    bool isNumber = false;
    const int number = request.parameter(parameter).toInt(&isNumber);
    return isNumber && number >= 0 ? number : fallback;
}

Http::Response volumePicture(const Http::Request& request, const TagMap& series, const QByteArray& version,
                             const QByteArray& index)
{
    for (const Volume* volume : series.volumes())
        if (QByteArray::number(volume->volumeIndex()) == index)
            return picture(request, volume->previewData(), version);
    return notFound("volume");
}

}  // namespace

Http::Response differenceAnswer(const Http::Request& request, const TagFile& file)
{
    const TagMap* a = findBy(file.imagesByUID(), request.parameter("a"));
    const TagMap* b = findBy(file.imagesByUID(), request.parameter("b"));
    if (a == nullptr || b == nullptr)
        return notFound("image");
    QJsonObject answer = differenceOf(*a, *b);
    answer.insert(QStringLiteral("a"), imageJson(*a));
    answer.insert(QStringLiteral("b"), imageJson(*b));
    return jsonAnswer(request, answer);
}

Http::Response studyPreview(const Http::Request& request, const TagFile& file, const QByteArray& version)
{
    const QByteArray jpeg = file.study()->findPreviewData(nullptr);
    return jpeg.isEmpty() ? pageAnswer(request, "no-picture.svg") : picture(request, jpeg, version);
}

Http::Response seriesAnswer(const Http::Request& request, const TagFile& file, const QByteArray& version,
                            const QVector<QByteArray>& path)
{
    TagMap* series = findBy(file.seriesByUID(), path[0]);
    if (series == nullptr)
        return notFound("series");
    if (path.size() == 2 && path[1] == "preview")
        return picture(request, series->findPreviewData(nullptr), version);
    if (path.size() == 2 && path[1] == "images")
        return jsonAnswer(request, imagesJson(*series, numberIn(request, "offset", 0),
                                              numberIn(request, "limit", kMaxListedImages)));
    if (path.size() == 4 && path[1] == "volumes" && path[3] == "preview")
        return volumePicture(request, *series, version, path[2]);
    return notFound("part of a series");
}

Http::Response imageAnswer(const Http::Request& request, const TagFile& file, const QByteArray& version,
                           const QVector<QByteArray>& path)
{
    TagMap* image = findBy(file.imagesByUID(), path[0]);
    if (image == nullptr)
        return notFound("image");
    if (path[1] == "preview")
        return picture(request, image->findPreviewData(nullptr), version);
    if (path[1] != "attributes")
        return notFound("part of an image");
    QJsonObject answer = imageJson(*image);
    const QJsonObject tree = attributeTree(*image);
    for (auto it = tree.begin(); it != tree.end(); ++it)
        answer.insert(it.key(), it.value());
    return jsonAnswer(request, answer);
}

}  // namespace Kdd::Browser
