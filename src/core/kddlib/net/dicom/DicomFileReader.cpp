#include "kddlib/net/dicom/DicomFileReader.h"

#include "kddlib/net/dicom/DicomParse.h"
#include "kddlib/net/dicom/LocalFileStream.h"

#include <dcmtk/dcmdata/dcistrmb.h>

namespace Kdd
{

OFCondition readDicomFile(const char* path, DcmFileFormat& file)
{
    DepthLimited<LocalFileStream> stream(path);
    return parseDicom(stream, file, {});
}

OFCondition readDicomBuffer(const QByteArray& bytes, DcmFileFormat& file)
{
    DepthLimited<DcmInputBufferStream> stream;
    stream.setBuffer(bytes.constData(), bytes.size());
    stream.setEos();
    return parseDicom(stream, file, {});
}

}  // namespace Kdd
