#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QString>

#include <memory>

namespace Kdd
{

class TagMap;

/// A file that was not taken, and why.
struct RefusedFile
{
    QByteArray path;
    QString reason;
};

/// What became of one file that was offered. Used by one thread at a time, also by another one than read it.
struct KDD_EXPORT DicomInput
{
    enum class Kind {
        Image,     ///< `map` holds it
        Volume,    ///< a volume file
        Other,     ///< neither, which is no fault
        Unusable,  ///< cannot be read, or would not be found again
    };

    Kind kind = Kind::Other;
    QByteArray path;
    Kxg::FileStamp stamp;         ///< as it was before it was read
    QString reason;               ///< why it is neither image nor volume
    std::unique_ptr<TagMap> map;  ///< of an image, parentless
    QByteArray studyUID;
    QByteArray seriesUID;
    QString leftOut;  ///< of an image that is damaged: what it lacks
    qint64 fileBytes = 0;
    qint64 headerBytes = 0;  ///< the file without its pixel data

    DicomInput();
    DicomInput(DicomInput&& other) noexcept;
    DicomInput& operator=(DicomInput&& other) noexcept;
    ~DicomInput();
};

/// What to do with damaged DICOM files: refuse them, or take what is sound (`readDamagedDicomFile`).
enum class Damage { Refused, Tolerated };

/// Reads one file: of an image its attributes, of a volume file its header. Media directories (DICOMDIR) count as not
/// DICOM: they describe files, not patients. An object that names no study or series is unusable. May be called on
/// several threads at once.
KDD_EXPORT DicomInput readDicomInput(const QByteArray& path, Damage damage);

}  // namespace Kdd
