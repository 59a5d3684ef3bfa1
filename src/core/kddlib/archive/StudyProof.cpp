#include "kddlib/archive/StudyProof.h"

#include "kddlib/archive/ContentDigest.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/archive/TagFileProof.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"
#include "platform/volumefile/OrlanMesh.h"

#include <algorithm>
#include <utility>

namespace Kdd
{

namespace
{

/// Digests kept at a time, so that a writer's turn is short.
constexpr std::size_t kBatch = 1000;

bool isSame(const Kxg::FileDigest& one, const Kxg::FileDigest& other)
{
    return one.path == other.path && one.stamp == other.stamp && one.digest == other.digest;
}

}  // namespace

StudyProof::StudyProof(Kxg::Catalogue& catalogue, Rules rules, std::function<void(const QString&)> report)
    : mCatalogue(catalogue)
    , mRules(std::move(rules))
    , mReport(std::move(report))
{
}

StudyProof::~StudyProof() = default;

bool StudyProof::take(qint64 bytes)
{
    mFindings.bytes += bytes;
    return !mRules.taken || mRules.taken(bytes);
}

// ---- tag files

Result StudyProof::checkTagFile(const QByteArray& studyUID)
{
    qint64 size = 0;
    {
        TagFileProof proof(mCatalogue, studyUID);
        Result result = proof.run(mRules.patienceMs);
        if (result.bad() || proof.state() == TagFileProof::State::Unproven)
            return result;
        size = proof.fileSize();
        ++mFindings.tagFiles;
        if (proof.isFault()) {
            ++mFindings.faults;
            ++mFindings.tagFileFaults;
            mReport(mRules.heals ? proof.fault()
                                 : proof.fault() + QStringLiteral("; \"kdd build --all\" builds it anew"));
        }
        if (proof.isFault() && mRules.heals)
            heal(proof);
    }
    // When nobody waits for the study's claim any more.
    take(size);
    return {};
}

void StudyProof::heal(TagFileProof& proof)
{
    Kxg::StudyClaim* claim = proof.claim();
    if (claim == nullptr) {
        mReport(QStringLiteral("It is not built anew: the study cannot be claimed"));
        return;
    }
    const QString study = QString::fromUtf8(claim->studyInstanceUID());
    const CompletedStudy built = StudyCompletion(mCatalogue).build(*claim);
    mFindings.healed += built.result.good() ? 1 : 0;
    mReport(built.result.good() ? QStringLiteral("The tag file of study %1 is built anew").arg(study)
                                : built.result.text());
}

// ---- DICOM and volume files

Result StudyProof::checkFiles(const QByteArray& studyUID, QByteArray& position, bool& isDone)
{
    isDone = false;
    std::vector<Kxg::FileDigest> files;
    Result result = mCatalogue.fileDigests(studyUID, files);
    for (const Kxg::FileDigest& file : files) {
        if (file.path <= position)
            continue;
        Verdict verdict = check(file);
        if (verdict == Verdict::Cancelled)
            break;
        if (verdict == Verdict::Faulty)
            result = settle(file, verdict);
        if (verdict == Verdict::Faulty) {
            ++mFindings.faults;
            mReport(mFault);
        }
        mFindings.files += verdict == Verdict::Undigested ? 0 : 1;
        mFindings.undigested += verdict == Verdict::Undigested ? 1 : 0;
        if (result.good() && mDigested.size() >= kBatch)
            result = record();
        position = file.path;
        // After a file each time, so that whoever goes on from here comes to an end.
        if (result.bad() || !take(0))
            break;
    }
    if (result.good())
        result = record();
    isDone = result.good() && (files.empty() || position >= files.back().path);
    return result;
}

/// Of a file that is not as it should be: whether it still should be so. Others may have registered or removed it since the
/// study's files were asked for.
Result StudyProof::settle(Kxg::FileDigest file, Verdict& verdict)
{
    while (verdict == Verdict::Faulty) {
        Kxg::FileDigest present;
        Result result = mCatalogue.fileDigest(file.path, present);
        if (result.bad() || isSame(present, file))
            return result;
        verdict = present.path.isEmpty() ? Verdict::Sound : check(file = present);
    }
    return {};
}

StudyProof::Verdict StudyProof::check(const Kxg::FileDigest& file)
{
    const auto faulty = [&](const char* what) {
        mFault = QStringLiteral("File %1 %2").arg(pathText(file.path), QLatin1String(what));
        return Verdict::Faulty;
    };
    // Of an object behind a URL the server knows its bytes; only its header is held against the tag file.
    if (isObjectAddress(file.path))
        return Verdict::Undigested;
    const char* const kChanged = "was changed since it was registered; \"kdd add\" takes it as it is now";
    FileStatus status;
    if (!statusOf(file.path.constData(), status))
        return faulty("is not there, or out of reach");
    if (status.size != file.stamp.size || status.modified != file.stamp.modified)
        return faulty(kChanged);
    if (file.digest.isEmpty())
        return checkUndigested(file);
    const DigestedFile read = digestFile(file.path, [this](qint64 bytes) { return take(bytes); });
    switch (read.fault) {
    case DigestedFile::Fault::Cancelled:
        return Verdict::Cancelled;
    case DigestedFile::Fault::Absent:
        return faulty("is not there, or out of reach");
    case DigestedFile::Fault::Unreadable:
        mFault = QStringLiteral("File %1 cannot be read: %2").arg(pathText(file.path), read.reason);
        return Verdict::Faulty;
    case DigestedFile::Fault::Changing:
        return faulty(kChanged);
    case DigestedFile::Fault::None:
        break;
    }
    if (!(read.stamp == file.stamp))
        return faulty(kChanged);
    return read.digest == file.digest
               ? Verdict::Sound
               : faulty("is damaged: its bytes have changed since it was registered, its "
                        "size and time have not; bring it back from a backup");
}

StudyProof::Verdict StudyProof::checkUndigested(const Kxg::FileDigest& file)
{
    const Verdict checked = file.isVolume ? checkVolume(file.path) : Verdict::Undigested;
    // What is damaged already must not become what is expected.
    if (!mRules.records || checked == Verdict::Faulty || checked == Verdict::Cancelled)
        return checked;
    const DigestedFile read = digestFile(file.path, [this](qint64 bytes) { return take(bytes); });
    if (read.fault == DigestedFile::Fault::Cancelled)
        return Verdict::Cancelled;
    if (read.fault == DigestedFile::Fault::Unreadable) {
        mFault = QStringLiteral("File %1 cannot be read: %2").arg(pathText(file.path), read.reason);
        return Verdict::Faulty;
    }
    if (read.fault != DigestedFile::Fault::None || !(read.stamp == file.stamp))
        return checked;
    mDigested.push_back({file.path, file.stamp, read.digest, file.isVolume});
    return Verdict::Sound;
}

/// By the checksums of the file itself, which guard all that is read of it.
StudyProof::Verdict StudyProof::checkVolume(const QByteArray& path)
{
    Result result;
    const std::unique_ptr<OrlanMesh> mesh = OrlanMesh::read(path, result);
    if (mesh != nullptr) {
        for (const Lattice& lattice : mesh->lattices()) {
            const int slices = lattice.dims.size() > 2 ? lattice.dims[2] : 1;
            TypedData2D pixels;
            for (int slice = 0; slice < slices && result.good(); ++slice) {
                result = mesh->readSlice(lattice, slice, pixels);
                if (!take(qint64(lattice.dims.value(0)) * lattice.dims.value(1)))
                    return Verdict::Cancelled;
            }
        }
        QVector<quint64> counts;
        if (result.good() && mesh->hasDataSection("Histogram"))
            result = mesh->readDataSection("Histogram", counts);
    }
    if (result.good())
        return Verdict::Sound;
    mFault = QStringLiteral("Volume file %1 is damaged: %2").arg(pathText(path), result.text());
    return Verdict::Faulty;
}

Result StudyProof::record()
{
    if (mDigested.empty())
        return {};
    Result result = mCatalogue.recordDigests(mDigested);
    if (result.good())
        mFindings.recorded += static_cast<int>(mDigested.size());
    mDigested.clear();
    return result;
}

}  // namespace Kdd
