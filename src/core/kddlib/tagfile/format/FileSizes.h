#pragma once

namespace Kdd
{

/// What a study takes in its file, as it was written or read last.
struct FileSizes
{
    int volumes = 0;
    int blobs = 0;             ///< previews, which stand behind the compressed body
    int blobBytes = 0;         ///< [bytes]
    int storedSize = 0;        ///< [bytes]
    int uncompressedSize = 0;  ///< [bytes]
    int missingBlobs = 0;      ///< of those that the file read last promised, cut off at its end
};

}  // namespace Kdd
