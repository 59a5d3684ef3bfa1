#pragma once

#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QList>
#include <QString>
#include <QStringList>

#include <memory>

namespace Kdd
{

class TagMap;

/// What became of one file that was offered.
struct DicomInput
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
/// DICOM: they describe files, not patients. May be called on several threads at once.
DicomInput readDicomInput(const QByteArray& path, Damage damage);

/// The files at and below the paths, absolute and sorted within each folder. Paths that do not exist and folders that
/// cannot be entered are put into `faults` with the reason. Paths are bytes: a name that is no text in the present
/// locale is a file like any other.
QList<QByteArray> filesBelow(const QList<QByteArray>& paths, QStringList& faults);

/// The path as `filesBelow` gives it.
QByteArray absolutePath(const QByteArray& path);

}  // namespace Kdd
