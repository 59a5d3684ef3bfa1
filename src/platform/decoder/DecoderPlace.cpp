#include "platform/decoder/DecoderPlace.h"

#include "platform/base/LogFile.h"
#include "platform/resources/ExResource.h"

#include <atomic>
#include <mutex>

namespace Kdd
{
namespace
{

std::atomic<DecoderPlace> place = DecoderPlace::Inside;

}  // namespace

void setDecoderPlace(DecoderPlace wanted)
{
    place = wanted;
}

DecoderPlace decoderPlace()
{
    const QByteArray setting = ExResource::decoder();
    if (setting.isEmpty())
        return place;
    if (setting == "inside")
        return DecoderPlace::Inside;
    static std::once_flag sOnce;
    if (setting != "apart")
        std::call_once(sOnce, [&] {
            LogFile::warnf("KDD_DECODER is \"%s\" and is taken for \"apart\"", setting.constData());
        });
    // A slip errs on the safe side.
    return DecoderPlace::Apart;
}

}  // namespace Kdd
