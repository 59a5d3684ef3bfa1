#include "server/dicomweb/render/PictureForm.h"

#include <QBuffer>

#include <algorithm>
#include <cmath>

namespace Kdd::DicomWeb
{
namespace
{

const QByteArray kJpeg("image/jpeg");
const QByteArray kPng("image/png");
const QByteArray kMultipart("multipart/related");

/// The pixels from `from` over `length` on that there are; none when the length is 0 and `from` lies outside.
void clip(double from, double length, int size, int& first, int& count)
{
    const double end = length == 0 ? size : from + std::abs(length);
    first = static_cast<int>(std::min<double>(from, size));
    count = static_cast<int>(std::ceil(std::min<double>(end, size))) - first;
}

}  // namespace

Verdict PictureForm::choose(const Http::AcceptHeader& accept, PictureForm& form)
{
    const QVector<Http::MediaType> offers = {
        {kJpeg, ""}, {kPng, ""}, {kMultipart, kJpeg}, {kMultipart, kPng}};
    const int chosen = accept.choose(offers);
    if (chosen < 0)
        return {406, QStringLiteral(
                         "Pictures are given as image/jpeg and image/png, alone or in multipart/related")};
    form.isMultipart = offers[chosen].name == kMultipart;
    form.mediaType = form.isMultipart ? offers[chosen].parts : offers[chosen].name;
    return {};
}

QImage fitInto(const QImage& picture, const RenderRequest& rendering)
{
    SourceRegion region = rendering.region;
    if (region.isRelative)
        region = {region.x * picture.width(), region.y * picture.height(), region.width * picture.width(),
                  region.height * picture.height(), false};
    int x = 0;
    int y = 0;
    int width = 0;
    int height = 0;
    clip(region.x, region.width, picture.width(), x, width);
    clip(region.y, region.height, picture.height(), y, height);
    if (width < 1 || height < 1)
        return {};
    QImage shown = picture;
    if (width != picture.width() || height != picture.height())
        shown = picture.copy(x, y, width, height);
    if (region.width < 0 || region.height < 0)
        shown = shown.mirrored(region.width < 0, region.height < 0);
    if (rendering.viewport.isEmpty() || shown.size() == rendering.viewport)
        return shown;
    // A line of pixels would vanish where the other side is reduced a lot.
    const QSize size = shown.size().scaled(rendering.viewport, Qt::KeepAspectRatio).expandedTo(QSize(1, 1));
    return shown.scaled(size, Qt::IgnoreAspectRatio, Qt::SmoothTransformation);
}

QByteArray encode(const QImage& picture, const QByteArray& mediaType, int quality)
{
    QBuffer buffer;
    buffer.open(QIODevice::WriteOnly);
    const bool isJpeg = mediaType == kJpeg;
    // Of a PNG the quality is how long it is packed; nothing is lost in any case.
    const bool isWritten = picture.save(&buffer, isJpeg ? "JPEG" : "PNG", isJpeg ? quality : -1);
    return isWritten ? buffer.data() : QByteArray();
}

}  // namespace Kdd::DicomWeb
