#include "kddlib/net/dicom/DicomParse.h"

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
    condition = options.reader
                    ? options.reader(stream, options.maxReadLength)
                    : file.read(stream, options.syntax, options.groupLength, options.maxReadLength);
    file.transferEnd();
    return condition;
}

}  // namespace Kdd
