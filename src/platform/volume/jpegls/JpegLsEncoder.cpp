#include "platform/volume/jpegls/JpegLsEncoder.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmjpls/djcodece.h>

namespace Kdd
{

const DcmCodec& jpegLsEncoder()
{
    static const DJLSLosslessEncoder sEncoder;
    return sEncoder;
}

}  // namespace Kdd
