#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QString>

#include <functional>
#include <vector>

namespace Kxg
{
class Catalogue;
struct FileDigest;
}  // namespace Kxg

namespace Kdd
{

class TagFileProof;

/// Proves the files of a study by the digests that the catalogue has of them: of the tag file all bytes, previews included;
/// of DICOM and volume files those of which a digest was taken. Each fault is told. Used by the thread of its catalogue.
class KDD_EXPORT StudyProof
{
public:
    struct Rules
    {
        bool heals = false;               ///< a tag file that is not the one written last is built anew
        bool records = false;             ///< files without a digest get one
        int patienceMs = 10 * 60 * 1000;  ///< for whoever works on a study of which something is wrong [ms]

        /// Told of bytes that were read, and of 0 between files; may take its time. False: it is to end.
        std::function<bool(qint64 count)> taken;
    };

    struct Findings
    {
        int tagFiles = 0;       ///< proven, or found to be faulty
        int files = 0;          ///< likewise; a volume file without a digest by its own checksums
        int faults = 0;         ///< of all of these
        int tagFileFaults = 0;  ///< of these, tag files
        int healed = 0;         ///< of these, tag files that are built anew
        int recorded = 0;
        int undigested = 0;  ///< files that go on without a digest
        qint64 bytes = 0;
    };

    /// `report` receives a line for each fault, and a second one where it is healed or could not be. The catalogue must
    /// outlive the object.
    StudyProof(Kxg::Catalogue& catalogue, Rules rules, std::function<void(const QString&)> report);
    ~StudyProof();
    StudyProof(const StudyProof&) = delete;
    StudyProof& operator=(const StudyProof&) = delete;

    /// Failure: that of the database.
    Result checkTagFile(const QByteArray& studyUID);

    /// The DICOM and volume files whose paths come after `position`, in their order; `position` follows. False in `isDone`:
    /// it was told to end before. Failure: that of the database.
    Result checkFiles(const QByteArray& studyUID, QByteArray& position, bool& isDone);

    const Findings& findings() const { return mFindings; }

private:
    enum class Verdict { Sound, Undigested, Faulty, Cancelled };

    bool take(qint64 bytes);
    void heal(TagFileProof& proof);
    Verdict check(const Kxg::FileDigest& file);
    Verdict checkUndigested(const Kxg::FileDigest& file);
    Verdict checkVolume(const QByteArray& path);
    Result settle(Kxg::FileDigest file, Verdict& verdict);
    Result record();

    Kxg::Catalogue& mCatalogue;
    const Rules mRules;
    const std::function<void(const QString&)> mReport;
    Findings mFindings;
    QString mFault;
    std::vector<Kxg::FileDigest> mDigested;  // and not kept yet
};

}  // namespace Kdd
