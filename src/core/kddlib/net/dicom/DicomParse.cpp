#include "kddlib/net/dicom/DicomParse.h"

#include <stdexcept>

namespace Kdd
{

OFCondition parseStream(DcmInputStream& stream, DcmFileFormat& file, const ParseOptions& options)
{
    // Of a file that could not be opened; what `file` held before stays then.
    OFCondition condition = stream.status();
    if (condition.bad())
        return condition;
    // From here on what `file` held is gone, also when reading fails.
    file.clear();
    file.setReadMode(options.mode);
    file.transferInit();
    try {
        condition = options.reader
                        ? options.reader(stream, options.maxReadLength)
                        : file.read(stream, options.syntax, options.groupLength, options.maxReadLength);
    } catch (const std::out_of_range&) {
        // Where a length is damaged, the parser may correct a text before its beginning.
        condition = EC_CorruptedData;
    }
    file.transferEnd();
    return condition;
}

}  // namespace Kdd
