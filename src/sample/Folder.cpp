#include "sample/Folder.h"

#include "sample/Fault.h"

#include <QFile>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <filesystem>
#include <utility>

namespace Kdd
{

namespace
{

using std::filesystem::path;

path nativePath(const QString& name)
{
    // By its bytes, which the standard library hands to the system as they are.
    return QFile::encodeName(name).toStdString();
}

QString shown(const path& name)
{
    return QFile::decodeName(name.c_str());
}

void makeFolder(const path& name)
{
    std::error_code error;
    std::filesystem::create_directories(name, error);
    if (error) {
        throw SampleFault(QStringLiteral("Cannot make the folder %1: %2")
                              .arg(shown(name), QString::fromStdString(error.message())));
    }
}

E_TransferSyntax syntaxOf(SampleEncoding encoding)
{
    return encoding == SampleEncoding::ImplicitWithLengths ? EXS_LittleEndianImplicit
                                                           : EXS_LittleEndianExplicit;
}

E_EncodingType lengthsOf(SampleEncoding encoding)
{
    return encoding == SampleEncoding::Explicit ? EET_UndefinedLength : EET_ExplicitLength;
}

E_GrpLenEncoding groupsOf(SampleEncoding encoding)
{
    return encoding == SampleEncoding::ImplicitWithLengths ? EGL_withGL : EGL_withoutGL;
}

/// A file that has its name only when it is complete; until then, and if it is given up, it is called
/// otherwise.
class NewFile
{
public:
    explicit NewFile(const path& name)
        : mName(name)
        , mPart(path(name) += ".part")
    {
    }
    ~NewFile()
    {
        // After the renaming there is nothing to remove.
        std::error_code ignored;
        std::filesystem::remove(mPart, ignored);
    }
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;

    void write(DcmFileFormat& object, SampleEncoding encoding) const;

private:
    [[noreturn]] void fail(const QString& reason) const
    {
        throw SampleFault(QStringLiteral("Cannot write the file %1: %2").arg(shown(mName), reason));
    }

    path mName;
    path mPart;
};

void NewFile::write(DcmFileFormat& object, SampleEncoding encoding) const
{
    const OFCondition saved =
        object.saveFile(mPart.c_str(), syntaxOf(encoding), lengthsOf(encoding), groupsOf(encoding));
    const bool isCut = saved == EC_StreamNotifyClient;
    if (saved.bad() && !isCut)
        fail(QString::fromLocal8Bit(saved.text()));
    // saveFile is content while the last bytes are in a buffer; on a full disk only the length gives that
    // away.
    std::error_code error;
    const auto size = std::filesystem::file_size(mPart, error);
    if (isCut || error || size != object.calcElementLength(syntaxOf(encoding), lengthsOf(encoding)))
        fail(QStringLiteral("not all of it could be stored; is the disk full?"));
    // In one step, so that a reader sees the former file or the new one.
    std::filesystem::rename(mPart, mName, error);
    if (error)
        fail(QString::fromStdString(error.message()));
}

}  // namespace

SampleFolder::SampleFolder(QString path, Progress progress)
    : mPath(std::move(path))
    , mProgress(std::move(progress))
{
}

void SampleFolder::save(DcmFileFormat& object, const SamplePlace& place, SampleEncoding encoding)
{
    const path folder = nativePath(mPath) / nativePath(place.study) / nativePath(place.series);
    const path file = folder / nativePath(place.file);

    makeFolder(folder);
    NewFile(file).write(object, encoding);
    count(place, object.calcElementLength(syntaxOf(encoding), lengthsOf(encoding)));
}

// Studies and series by their folders, since several files make one of each.
void SampleFolder::count(const SamplePlace& place, qint64 bytes)
{
    mStudies.insert(place.study);
    mSeries.insert(place.study + QLatin1Char('/') + place.series);
    mSummary.studies = mStudies.size();
    mSummary.series = mSeries.size();
    mSummary.bytes += bytes;
    ++mSummary.images;
    if (mProgress)
        mProgress(mSummary.images, mTotal);
}

}  // namespace Kdd
