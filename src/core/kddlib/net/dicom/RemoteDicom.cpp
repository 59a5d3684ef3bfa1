#include "kddlib/net/dicom/RemoteDicom.h"

#include "kddlib/net/dicom/DicomParse.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/net/dicom/RemoteFileStream.h"
#include "kddlib/net/http/ObjectAddress.h"

#include <utility>

namespace Kdd
{

OFCondition conditionOf(const Result& fault)
{
    return fault.good() ? EC_Normal
                        : makeOFCondition(OFM_dcmdata, OFCondition(EC_InvalidStream).code(), OF_error,
                                          fault.text().toLocal8Bit().constData());
}

OFCondition readRemoteDicom(const std::shared_ptr<RemoteFile>& file, DcmFileFormat& format)
{
    DepthLimited<RemoteFileStream> stream(file);
    const OFCondition condition = parseDicom(stream, format, {});
    // The parser may take for the end of the object that no more of it came.
    return file->fault().bad() ? conditionOf(file->fault()) : condition;
}

OFCondition loadDicomHeader(const QByteArray& name, DcmFileFormat& format, qint64 first)
{
    if (!isObjectAddress(name))
        return loadDicomFile(name.constData(), format);
    Result result;
    const std::shared_ptr<RemoteFile> file = RemoteFile::open(name, first, result);
    return file != nullptr ? readRemoteDicom(file, format) : conditionOf(result);
}

RemoteHeaders::RemoteHeaders(QList<QByteArray> urls, qint64 first)
    : mUrls(std::move(urls))
    , mWork(
          mUrls.size(), kRemoteFilesAtOnce,
          [this, first](int i) {
              LoadedHeader loaded{std::make_unique<DcmFileFormat>(), {}};
              loaded.condition = loadDicomHeader(mUrls.at(i), *loaded.format, first);
              return loaded;
          },
          ThreadShare::Of::Waiting)
{
}

}  // namespace Kdd
