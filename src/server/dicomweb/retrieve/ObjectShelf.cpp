#include "server/dicomweb/retrieve/ObjectShelf.h"

#include "server/dicomweb/retrieve/RemoteObject.h"

#include <kddlib/FileStatus.h>
#include <kddlib/KxCurlClient.h>
#include <kddlib/LogFile.h>
#include <kddlib/ObjectAddress.h>
#include <kddlib/PathName.h>
#include <kddlib/RegularFile.h>

namespace Kdd::DicomWeb
{

namespace
{

std::shared_ptr<StoredObject> openBytes(const QByteArray& path, Result& result)
{
    if (KxCurlClient::isUrl(path.constData()))
        return RemoteObject::open(path, result);
    const auto file = Http::OpenFile::open(path, result);
    return file == nullptr ? nullptr : std::make_shared<LocalObject>(file);
}

}  // namespace

ObjectShelf::ObjectShelf(int capacity)
    : mSeen(capacity)
{
}

Verdict ObjectShelf::open(const ImageOrigin& origin, FoundObject& found)
{
    FoundObject opened;
    const Result result = find(origin.path, opened);
    if (result.bad()) {
        LogFile::errorf("%s cannot be served: %s", shownAddress(origin.path).constData(),
                        qUtf8Printable(result.text()));
        const bool isGone = !KxCurlClient::isUrl(origin.path.constData()) &&
                            presenceOf(pathText(origin.path)) == FilePresence::Absent;
        return isGone ? Verdict{410, QStringLiteral("The image's DICOM file is gone")}
                      : Verdict{500, QStringLiteral("The image's DICOM file cannot be read or is damaged")};
    }
    if (!origin.isIn(opened.index)) {
        LogFile::errorf("%s cannot be served: it holds image %s of study %s",
                        shownAddress(origin.path).constData(), opened.index.sopInstanceUID().constData(),
                        opened.index.studyInstanceUID().constData());
        return {410, QStringLiteral("The image's DICOM file holds another image by now")};
    }
    found = std::move(opened);
    return {};
}

Result ObjectShelf::find(const QByteArray& path, FoundObject& found)
{
    Result result;
    found.bytes = openBytes(path, result);
    if (found.bytes == nullptr)
        return result;
    found.identity = found.bytes->identity();
    const QByteArray key = path + '\n' + found.identity;
    const bool isRemembered = !found.identity.isEmpty() && found.bytes->isSettled();
    Remembered seen;
    bool isKnown = false;
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        const Remembered* const known = isRemembered ? mSeen.object(key) : nullptr;
        isKnown = known != nullptr;
        if (isKnown)
            seen = *known;
    }
    ++(isKnown ? mCount.hits : mCount.misses);
    if (!isKnown) {
        result = examine(path, found, seen);
        if (result.bad())
            return result;
        const std::lock_guard<std::mutex> lock(mMutex);
        if (isRemembered)
            mSeen.insert(key, new Remembered(seen),
                         static_cast<int>(key.size() + seen.index.cost() + seen.converted.size()));
    }
    found.index = seen.index;
    if (!seen.converted.isNull())
        found.bytes = std::make_shared<MemoryObject>(seen.converted, found.identity);
    return {};
}

Result ObjectShelf::examine(const QByteArray& path, FoundObject& found, Remembered& seen)
{
    if (seen.index.read(*found.bytes).good())
        return {};
    // Whatever else can be read is read as a whole, and is from then on in memory.
    Result result = readAsRegularFile(path, seen.converted);
    if (result.bad())
        return result;
    Result reopened;
    const auto again = Http::OpenFile::open(path, reopened);
    if (!found.identity.isEmpty() && again != nullptr && again->identity() != found.identity)
        return Result::failure(QStringLiteral("It changed while it was read"));
    MemoryObject memory(seen.converted, found.identity);
    return seen.index.read(memory);
}

}  // namespace Kdd::DicomWeb
