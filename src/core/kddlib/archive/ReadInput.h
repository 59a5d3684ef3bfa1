#pragma once

#include "kddlib/items/PlainFiles.h"

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/ofstd/ofcond.h>

class DcmFileFormat;

namespace Kdd
{

class OrlanMesh;
class Result;
enum class Damage;
struct DicomInput;

/// Turns what was read of the file at the path into what `readDicomInput` makes of it. False, with `input` as it was,
/// when that one has to tell what the file is.
bool takePlain(const QByteArray& path, PlainRead read, DicomInput& input);

/// Says in `input` what a file is that the parser read with `condition`; `hasPrefix`: it has the mark of DICOM files.
void takeParsed(DicomInput& input, bool hasPrefix, const OFCondition& condition, DcmFileFormat& format);

/// Says in `input` what a volume file is; `mesh` is null when it cannot be read, as `result` says.
void takeVolume(DicomInput& input, const OrlanMesh* mesh, const Result& result);

/// What `readDicomInput` makes of a file of whatever form, by DCMTK's parser.
DicomInput parseInput(const QByteArray& path, Damage damage);

}  // namespace Kdd
