#include "platform/volume/ffmpeg/VideoModule.h"

#include "platform/base/Export.h"
#include "platform/volume/ffmpeg/FrameScaler.h"
#include "platform/volume/ffmpeg/FrameSearch.h"
#include "platform/volume/ffmpeg/MediaInput.h"

#include <cstdio>
#include <exception>
#include <string>

namespace Kdd
{
namespace
{

std::string decode(VideoRequest& request)
{
    // What the decoders think of damaged input is said once, by the caller, with the name of the file.
    av_log_set_level(AV_LOG_QUIET);
    MediaInput input(request);
    std::string reason = input.open();
    if (!reason.empty())
        return reason;
    FrameSearch search(input);
    reason = search.find(request.fraction);
    if (!reason.empty())
        return reason;
    // What the container says of the pixels' shape goes before what the codec says.
    const AVRational ofContainer = input.stream().sample_aspect_ratio;
    const AVRational aspect = ofContainer.num > 0 ? ofContainer : search.frame().sample_aspect_ratio;
    return scaleToTarget(search.frame(), aspect, request) ? std::string() : "its pixels cannot be converted";
}

}  // namespace
}  // namespace Kdd

extern "C" KDD_EXPORT std::int32_t kddDecodeVideoFrame(Kdd::VideoRequest* request);

std::int32_t kddDecodeVideoFrame(Kdd::VideoRequest* request)
{
    // A structure of another version: nothing but its first number can be relied upon.
    if (request->version != Kdd::kVideoModuleVersion)
        return 0;
    std::string reason;
    try {
        reason = Kdd::decode(*request);
    } catch (const std::exception& fault) {
        reason = fault.what();
    }
    std::snprintf(static_cast<char*>(request->reason), sizeof request->reason, "%s", reason.c_str());
    return reason.empty() ? 1 : 0;
}
