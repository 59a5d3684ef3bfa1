#pragma once

#include "platform/base/Export.h"

namespace Kdd
{

/// Where the libraries run that decode pictures, videos and volume files, which a hostile file may bring down.
enum class DecoderPlace {
    Inside,  ///< in this process: nothing is started, and a fault of theirs is a fault of the process
    Apart  ///< in processes of their own, kdd-decoder, which get bytes and give pixels and can do nothing else
};

/// What holds where the setting KDD_DECODER does not say it; `Inside` unless this was called. Made once at start, before
/// there are several threads.
///
/// With `Apart` kdd-decoder has to lie in the folder of the library's modules: without it nothing is decoded, and the
/// reason names it. The processes are started when they are first needed, as many as threads decode at a time and no more
/// than there are processors; they are children of this process, get none of its descriptors and none of its environment,
/// and end with it. No signal handler is set; whoever waits for all children of the process may see them end.
KDD_EXPORT void setDecoderPlace(DecoderPlace place);

/// What holds.
KDD_EXPORT DecoderPlace decoderPlace();

}  // namespace Kdd
