#include "server/dicomweb/metadata/KeptAnswers.h"

#include <QDir>
#include <QDirIterator>
#include <QFileInfo>

#include <fcntl.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>
#include <kddlib/SystemResult.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <vector>

namespace Kdd::DicomWeb
{
namespace
{

// The folder is looked through after so much of its room was filled anew; servers do so each for themselves.
constexpr qint64 kCleanUpPart = 16;

// Times of use are told to the minute: a write for each use would cost more than the order of use is worth.
constexpr qint64 kUseStep = 60;  // [s]

// Of a server that died while it made an answer. No answer takes that long.
constexpr qint64 kAbandonedAge = 24 * 3600;  // [s]

constexpr const char* kTemporarySuffix = ".making-XXXXXX";

void noteUse(const Http::OpenFile& file)
{
    struct stat found = {};
    if (::fstat(file.descriptor(), &found) != 0 || std::time(nullptr) - found.st_mtim.tv_sec < kUseStep)
        return;
    // One that belongs to another user keeps its time; it goes earlier than need be, and is made again.
    static_cast<void>(::futimens(file.descriptor(), nullptr));
}

void warn(const QByteArray& folder)
{
    LogFile::warnf("An answer cannot be kept in %s: %s", folder.constData(),
                   qUtf8Printable(SystemResult::of(errno).text()));
}

bool writeAll(int file, const QByteArray& bytes)
{
    for (int done = 0; done < bytes.size();) {
        const ssize_t written =
            ::write(file, bytes.constData() + done, static_cast<size_t>(bytes.size() - done));
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return false;
        done += static_cast<int>(written);
    }
    return true;
}

}  // namespace

KeptAnswers::KeptAnswers(const QString& folder, qint64 capacity)
    : mFolder(pathBytes(folder))
    , mCapacity(capacity)
    // What another run left is looked through with the first answer that is kept.
    , mAdded(capacity)
{
}

/// In one of 256 folders, so that none of them gets long.
QByteArray KeptAnswers::pathOf(const QByteArray& name) const
{
    return mFolder + '/' + name.left(2) + '/' + name;
}

bool KeptAnswers::find(const QByteArray& name, Http::FileRange& answer)
{
    if (mCapacity <= 0)
        return false;
    Result result;
    // Its content never changes, but its times tell of its use.
    answer.file = Http::OpenFile::open(pathOf(name), result, Http::OpenFile::Changes::Ignored);
    // What a crash of the machine left may have a name and nothing else.
    const bool isThere = answer.file != nullptr && answer.file->size() > 0;
    ++(isThere ? mCount.hits : mCount.misses);
    if (!isThere)
        return false;
    answer.offset = 0;
    answer.length = answer.file->size();
    noteUse(*answer.file);
    return true;
}

std::unique_ptr<KeptAnswers::Draft> KeptAnswers::begin(const QByteArray& name)
{
    if (mCapacity <= 0)
        return nullptr;
    std::unique_ptr<Draft> draft(new Draft(*this, pathOf(name)));
    if (draft->mFile >= 0)
        return draft;
    warn(mFolder);
    return nullptr;
}

KeptAnswers::Draft::Draft(KeptAnswers& answers, const QByteArray& path)
    : mAnswers(answers)
    , mPath(path)
    , mTemporary(path + kTemporarySuffix)
{
    makeFolder(pathText(path.left(path.lastIndexOf('/'))));
    mFile = ::mkostemp(mTemporary.data(), O_CLOEXEC);
}

KeptAnswers::Draft::~Draft()
{
    if (mFile < 0)
        return;
    ::close(mFile);
    ::unlink(mTemporary.constData());
}

void KeptAnswers::Draft::write(const QByteArray& bytes)
{
    if (mFile < 0)
        return;
    mSize += bytes.size();
    if (writeAll(mFile, bytes))
        return;
    warn(mAnswers.mFolder);
    ::close(mFile);
    ::unlink(mTemporary.constData());
    mFile = -1;
}

void KeptAnswers::Draft::keep()
{
    if (mFile < 0)
        return;
    // On the disk before it has its name: after a loss of power a name may be all that is there otherwise.
    const bool isWhole = ::fdatasync(mFile) == 0 && ::fchmod(mFile, 0640) == 0;
    ::close(mFile);
    mFile = -1;
    if (!isWhole || ::rename(mTemporary.constData(), mPath.constData()) != 0) {
        warn(mAnswers.mFolder);
        ::unlink(mTemporary.constData());
        return;
    }
    mAnswers.added(mSize);
}

void KeptAnswers::added(qint64 size)
{
    if (mAdded.fetch_add(size) + size < mCapacity / kCleanUpPart)
        return;
    mAdded = 0;
    cleanUp();
}

void KeptAnswers::cleanUp() const
{
    struct Entry
    {
        qint64 used;  // [s]
        qint64 size;
        QByteArray path;
    };
    std::vector<Entry> entries;
    qint64 total = 0;
    const std::time_t now = std::time(nullptr);
    QDirIterator files(pathText(mFolder), QDir::Files, QDirIterator::Subdirectories);
    while (files.hasNext()) {
        const QByteArray path = pathBytes(files.next());
        struct stat found = {};
        if (::lstat(path.constData(), &found) != 0)
            continue;
        if (path.contains(".making-")) {
            if (now - found.st_mtim.tv_sec > kAbandonedAge)
                ::unlink(path.constData());
            continue;
        }
        total += found.st_size;
        entries.push_back({found.st_mtim.tv_sec, found.st_size, path});
    }
    std::sort(entries.begin(), entries.end(), [](const Entry& a, const Entry& b) { return a.used < b.used; });
    for (const Entry& entry : entries) {
        if (total <= mCapacity)
            return;
        ::unlink(entry.path.constData());
        total -= entry.size;
    }
}

}  // namespace Kdd::DicomWeb
