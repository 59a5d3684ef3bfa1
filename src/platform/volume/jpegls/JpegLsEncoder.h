#pragma once

class DcmCodec;

namespace Kdd
{

/// DCMTK's lossless encoder, which cannot be made by those that load it late: its class is known by a table of its library,
/// and they see functions only. On any thread.
const DcmCodec& jpegLsEncoder();

}  // namespace Kdd
