#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QString>

#include <functional>
#include <memory>

namespace Kdd
{

class BuildCorrections;
struct LoadedHeader;
class TagFile;
class TagMap;
class WorkObserver;

/// What a check of tag files has found.
struct CheckFindings
{
    int studies = 0;  ///< whose tag file could be read
    int images = 0;
    int differences = 0;
    int unreadable =
        0;  ///< tag files and DICOM files that could not be read, and tag files that are not there
};

/// Holds tag files against the DICOM files they were made from, attribute by attribute, and against the catalogue: a
/// study without tag file, a tag file that is not the one written last, images and volumes too many or too few, previews
/// that are cut off, images that are not where a correction put them. Changes nothing. Used by the thread of its
/// catalogue.
class KDD_EXPORT StudyCheck
{
public:
    /// `report` receives a line for each fault. Both must outlive the object, and so must the catalogue.
    StudyCheck(Kxg::Catalogue& catalogue, WorkObserver& observer, std::function<void(const QString&)> report);
    ~StudyCheck();
    StudyCheck(const StudyCheck&) = delete;
    StudyCheck& operator=(const StudyCheck&) = delete;

    /// A study that the catalogue knows.
    void check(const QByteArray& studyUID);

    /// Every study that the catalogue knows, and every other tag file below the meta folder.
    void checkAll();

    const CheckFindings& findings() const { return mFindings; }

private:
    void fault(const QString& text);
    bool read(const QByteArray& studyUID, TagFile& file);
    void checkListing(const QByteArray& studyUID, const TagFile& file);
    void checkVolumes(const QByteArray& studyUID, const TagFile& file);
    void checkPreviews(const QByteArray& studyUID, const TagFile& file);
    void checkImages(const TagFile& file);
    void checkImage(const QByteArray& key, const TagMap& image);
    void checkLoaded(const QByteArray& key, const TagMap& image, const LoadedHeader& loaded);
    void checkUnknown(const QString& path);

    Kxg::Catalogue& mCatalogue;
    WorkObserver& mObserver;
    const std::function<void(const QString&)> mReport;
    CheckFindings mFindings;
    Kxg::StudyContents mContents;
    std::unique_ptr<BuildCorrections> mCorrections;  // of that study
};

}  // namespace Kdd
