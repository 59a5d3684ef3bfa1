#include "platform/volume/ffmpeg/FrameScaler.h"

#include "platform/volume/ffmpeg/AvHandles.h"
#include "platform/volume/ffmpeg/VideoModule.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace Kdd
{
namespace
{

// Beyond that, in either direction, the claim is a mistake.
constexpr double kMaxPixelAspect = 16;

// Video of this height and more is coded with the colours of high definition where it does not say which.
constexpr int kHighDefinitionHeight = 720;

struct Size
{
    int width;
    int height;
};

Size fittingSize(const AVFrame& frame, AVRational pixelAspect, const VideoRequest& request)
{
    const double claimed = pixelAspect.num > 0 && pixelAspect.den > 0 ? av_q2d(pixelAspect) : 1;
    const double aspect = claimed > kMaxPixelAspect || claimed < 1 / kMaxPixelAspect ? 1 : claimed;
    // Square pixels by giving up some of the longer side, so that nothing is enlarged.
    const double width = frame.width * std::min(aspect, 1.0);
    const double height = frame.height / std::max(aspect, 1.0);
    const double scale = std::min({1.0, request.width / width, request.height / height});
    const auto rounded = [scale](double side) {
        return std::max(1, static_cast<int>(std::lround(side * scale)));
    };
    return {rounded(width), rounded(height)};
}

void setColours(SwsContext* scaler, const AVFrame& frame)
{
    const AVPixFmtDescriptor* format = av_pix_fmt_desc_get(static_cast<AVPixelFormat>(frame.format));
    // Red, green and blue need no matrix.
    if (format == nullptr || (format->flags & AV_PIX_FMT_FLAG_RGB) != 0)
        return;
    const int unspecified = frame.height >= kHighDefinitionHeight ? SWS_CS_ITU709 : SWS_CS_ITU601;
    const int matrix =
        frame.colorspace == AVCOL_SPC_UNSPECIFIED ? unspecified : static_cast<int>(frame.colorspace);
    const int fullRange = frame.color_range == AVCOL_RANGE_JPEG ? 1 : 0;
    constexpr int kUnity = 1 << 16;
    // Matrices that it does not know become the library's default.
    sws_setColorspaceDetails(scaler, sws_getCoefficients(matrix), fullRange,
                             sws_getCoefficients(SWS_CS_DEFAULT), 1, 0, kUnity, kUnity);
}

/// The scaler writes whole vector registers, beyond the end of rows that are not padded for them.
AvHandle<AVFrame> paddedPicture(Size size)
{
    AvHandle<AVFrame> picture(av_frame_alloc());
    if (picture == nullptr)
        return nullptr;
    picture->width = size.width;
    picture->height = size.height;
    picture->format = AV_PIX_FMT_RGB24;
    return av_frame_get_buffer(picture.get(), 0) < 0 ? nullptr : std::move(picture);
}

AvHandle<AVFrame> scaled(const AVFrame& frame, Size size)
{
    // Areas are averaged, since a picture is only ever made smaller.
    const AvHandle<SwsContext> scaler(sws_getContext(
        frame.width, frame.height, static_cast<AVPixelFormat>(frame.format), size.width, size.height,
        AV_PIX_FMT_RGB24, SWS_AREA | SWS_ACCURATE_RND, nullptr, nullptr, nullptr));
    AvHandle<AVFrame> picture = paddedPicture(size);
    if (scaler == nullptr || picture == nullptr)
        return nullptr;
    setColours(scaler.get(), frame);
    const int rows = sws_scale(scaler.get(), frame.data, frame.linesize, 0, frame.height, picture->data,
                               picture->linesize);
    return rows == size.height ? std::move(picture) : nullptr;
}

}  // namespace

bool scaleToTarget(const AVFrame& frame, AVRational pixelAspect, VideoRequest& request)
{
    const Size size = fittingSize(frame, pixelAspect, request);
    const AvHandle<AVFrame> picture = scaled(frame, size);
    if (picture == nullptr)
        return false;
    unsigned char* out = request.allocate(request.target, size.width, size.height);
    if (out == nullptr)
        return false;
    const auto rowSize = static_cast<size_t>(size.width) * 3;
    // Row by row, because the picture's rows are padded and the target's are not.
    for (int row = 0; row < size.height; ++row)
        std::memcpy(out + static_cast<size_t>(row) * rowSize,
                    picture->data[0] + ptrdiff_t{row} * picture->linesize[0], rowSize);
    return true;
}

}  // namespace Kdd
