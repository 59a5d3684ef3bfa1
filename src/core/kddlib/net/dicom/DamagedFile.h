#pragma once

#include "platform/base/Export.h"

#include <QString>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/ofstd/ofcond.h>

class DcmFileFormat;

namespace Kdd
{

/// Reads what is sound of a DICOM file that `readDicomFile` refuses, and tells what is not in `leftOut`, "(0040,0275)"
/// for instance, or all from some byte on.
///
/// Where an element of the dataset ends is found out without trusting what it holds; every one that DCMTK's parser takes
/// when it stands alone is taken as it is, none is changed. Left out are elements damaged inside and all that follows
/// one that does not end within the file. Of compressed Pixel Data that is cut off the whole fragments are taken;
/// uncompressed Pixel Data in a file that declares compression is taken if it has just the size of the frames, and the
/// dataset is then an uncompressed one.
///
/// The file must have its prefix and its meta header, and what is read must name study, series and instance; else, and
/// for deflated files and those larger than 1 GiB, the condition is the one that `readDicomFile` gives. All values are
/// in memory, and the meta header is not kept. May be used on several threads at once; no setting of DCMTK is touched,
/// for those count for all threads.
KDD_EXPORT OFCondition readDamagedDicomFile(const char* path, DcmFileFormat& file, QString& leftOut);

/// `strict`, by which reading the file failed, unless the image database has the file as one that was taken although it
/// is damaged and that has not changed since: then the file is read as above, with a warning.
KDD_EXPORT OFCondition readAsRegistered(const char* path, DcmFileFormat& file, const OFCondition& strict);

}  // namespace Kdd
