#pragma once

struct AVFrame;
struct AVRational;

namespace Kdd
{

struct VideoRequest;

/// Puts `frame` into the request's target: its pixels made square and reduced to fit, red, green and blue.
/// `pixelAspect` is width over height of a pixel; anything that cannot be one counts as 1. False when the target
/// gives no room or the pixel format cannot be converted.
bool scaleToTarget(const AVFrame& frame, AVRational pixelAspect, VideoRequest& request);

}  // namespace Kdd
