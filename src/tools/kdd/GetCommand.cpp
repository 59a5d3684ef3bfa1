#include "tools/kdd/Commands.h"
#include "tools/kdd/PartialFile.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"

#include <QFileInfo>
#include <QUrl>

#include <kddlib/KxCurlClient.h>
#include <kddlib/KxCurlDownloadStream.h>
#include <kddlib/LogFile.h>

#include <cstdio>
#include <future>
#include <memory>

namespace Kdd
{

namespace
{

struct GetRequest
{
    QByteArray url;
    QString file;  ///< or the folder; empty: the URL's own name
    int parallel = 4;
};

constexpr std::size_t kBlock = 4 * 1024 * 1024;  // [bytes]

/// Longer ranges leave connections idle at the end of an object, shorter ones spend more time on asking.
constexpr int kRange = 8 * 1024 * 1024;  // [bytes]

/// The last part of the URL's path; empty when it ends in "/".
QString nameInUrl(const QByteArray& url)
{
    // In a URL of HTTP "#" ends the path, in an object's name it is a letter.
    const bool isCloud = url.startsWith("gs:");
    const QByteArray path =
        url.split('?').first().split(isCloud ? '?' : '#').first().mid(url.indexOf(':') + 1);
    // An encoded slash must not lead into another folder.
    return QUrl::fromPercentEncoding(path.mid(path.lastIndexOf('/') + 1))
        .replace(QLatin1Char('/'), QLatin1Char('_'));
}

/// Where to write to; empty, with the reason logged, when the name is left to us and there is none.
QString targetOf(const GetRequest& request)
{
    const bool isFolder = QFileInfo(request.file).isDir();
    if (!request.file.isEmpty() && !isFolder)
        return request.file;
    const QString name = nameInUrl(request.url);
    // Nothing at all, or the name of a folder.
    if (name.isEmpty() || name == QLatin1String(".") || name == QLatin1String("..")) {
        LogFile::errorf("%s has no file name: give one with -o", request.url.constData());
        return {};
    }
    return isFolder ? request.file + QLatin1Char('/') + name : name;
}

/// One object on its way into a file.
class Fetch
{
public:
    Fetch(const GetRequest& request, const GlobalOptions& options, PartialFile& file)
        : mRequest(request)
        , mOptions(options)
        , mFile(file)
    {
    }

    /// False, with the reason logged, when not everything is in the file.
    bool run() { return begin() && copy() && isComplete(); }

    qint64 resumedAt() const { return mResumedAt; }

private:
    bool begin();
    bool goOn();
    bool beginAnew();
    bool hasContent();
    bool copy();
    bool isComplete();
    bool explain();

    PartialFile::Origin origin()
    {
        // As this response tells of it.
        return {mRequest.url, ObjectVersion::of(mStream.httpStatus()), mStream.contentLength()};
    }

    const GetRequest& mRequest;
    const GlobalOptions& mOptions;
    PartialFile& mFile;
    KxCurlDownloadStream mStream{nullptr};
    qint64 mResumedAt = 0;
    qint64 mDone = 0;
    qint64 mLength = 0;  // 0: not known
};

/// Whether bytes of the object, or its end, are next. A transfer may have broken off already and still have some.
bool Fetch::hasContent()
{
    const KxHttpStatus& status = mStream.httpStatus();
    return status.ok() || (status.code / 100 == 2 && mStream.peek() != std::istream::traits_type::eof());
}

bool Fetch::begin()
{
    // A part that cannot be continued is no fault: the object is then fetched anew.
    if (!goOn() && !beginAnew())
        return false;
    mDone = mResumedAt;
    // Of the whole object, also when only the rest of it comes.
    mLength = mStream.contentLength();
    return true;
}

/// False when there is nothing to go on with, or the server does not have that any more.
bool Fetch::goOn()
{
    const PartialFile::Origin known = mFile.origin();
    const qint64 size = mFile.size();
    // A part that is complete leaves nothing to ask for, so nothing could tell whether it still is the same
    // object.
    if (!known.isRecognisable() || known.url != mRequest.url || size == 0 || size >= known.length)
        return false;
    mStream = KxCurlClient::instance().readFollowing(mRequest.url.toStdString(), size);
    // Halves of two versions would make a file that there never was.
    const bool isSame = hasContent() && origin().version == known.version && origin().length == known.length;
    if (isSame && mFile.goToEnd())
        mResumedAt = size;
    return mResumedAt > 0;
}

bool Fetch::beginAnew()
{
    mStream = KxCurlClient::instance().readFollowing(mRequest.url.toStdString());
    // A page that tells of an error never gets into the file, and what was fetched before stays.
    return hasContent() ? mFile.startOver(origin()) : explain();
}

bool Fetch::explain()
{
    LogFile::errorf("%s cannot be fetched: %s", mRequest.url.constData(),
                    mStream.httpStatus().reason().c_str());
    return false;
}

/// One block is written while the next one arrives, so that neither the servers nor the disk have to wait.
bool Fetch::copy()
{
    Progress progress("Fetching", !mOptions.quiet, Progress::Unit::Bytes);
    const std::unique_ptr<char[]> blocks[] = {std::make_unique<char[]>(kBlock),
                                              std::make_unique<char[]>(kBlock)};
    std::future<bool> writing;
    for (int turn = 0;; turn = 1 - turn) {
        const char* const block = blocks[turn].get();
        const qint64 count = mStream.read(blocks[turn].get(), kBlock).gcount();
        // The other block is filled next, so what was in it has to be written by now.
        if (writing.valid() && !writing.get())
            return false;
        if (count == 0)
            return true;
        writing = std::async(std::launch::async, [=] { return mFile.append(block, count); });
        mDone += count;
        progress.show(mDone, mLength);
    }
}

bool Fetch::isComplete()
{
    // The stream ends alike for a whole object and for one that broke off; only the status tells.
    if (!mStream.httpStatus().ok())
        return explain();
    // A transfer may end too early without any error.
    if (mLength > 0 && mDone != mLength) {
        LogFile::errorf("%s cannot be fetched: %lld of %lld bytes came", mRequest.url.constData(),
                        static_cast<long long>(mDone), static_cast<long long>(mLength));
        return false;
    }
    return true;
}

void report(const GlobalOptions& options, const GetRequest& request, const QString& target, qint64 bytes,
            qint64 resumedAt)
{
    if (options.json) {
        printJson({{QStringLiteral("url"), QString::fromUtf8(request.url)},
                   {QStringLiteral("file"), target},
                   {QStringLiteral("bytes"), bytes},
                   {QStringLiteral("resumedAt"), resumedAt}});
        return;
    }
    QString line = target + QStringLiteral(": ") + humanBytes(bytes);
    if (resumedAt > 0)
        line += QStringLiteral(", of which ") + humanBytes(resumedAt) + QStringLiteral(" were there");
    if (!options.quiet)
        std::printf("%s\n", qUtf8Printable(line));
}

Outcome runGet(const GlobalOptions& options, const GetRequest& request)
{
    if (!KxCurlClient::isUrl(request.url.constData())) {
        LogFile::errorf("%s is no address: it begins with http://, https:// or gs://",
                        request.url.constData());
        return Outcome::WrongUsage;
    }
    const QString target = targetOf(request);
    if (target.isEmpty())
        return Outcome::WrongUsage;
    PartialFile file(target);
    // Locked before anything is asked for, so that two processes do not fetch the same file.
    if (!file.open())
        return Outcome::Failed;
    // Settings of the whole process, which fetches nothing else.
    KxCurlClient::instance().setNumConcurrentRequestsPerFile(request.parallel);
    KxCurlClient::instance().setChunkSizeForPartialRequests(kRange);
    Fetch fetch(request, options, file);
    if (!fetch.run()) {
        file.removeIfEmpty();
        // Only of a part that a later run recognises there is something to tell.
        if (file.origin().isRecognisable())
            LogFile::warnf("%s is kept: the same command goes on from there", qUtf8Printable(file.path()));
        return Outcome::Failed;
    }
    const qint64 bytes = file.size();
    if (!file.publish(options.flush))
        return Outcome::Failed;
    report(options, request, target, bytes, fetch.resumedAt());
    return Outcome::Done;
}

}  // namespace

void declareGet(CommandSet& commands)
{
    const CommandText text = {"get", kTransfers, "Fetch an object over HTTP(S) or from the cloud storage",
                              "The file bears its name only when it is complete. A run that breaks off "
                              "leaves FILE.part, and the same command goes on from there.",
                              "kdd get https://host/a.dcm --parallel 8\n"
                              "kdd get gs://bucket/a.dcm -o copies"};
    const auto request = std::make_shared<GetRequest>();
    ArgumentList arguments =
        commands.declare(text, [request](const GlobalOptions& options) { return runGet(options, *request); });
    arguments.text({"URL", kUrl, "http://, https:// or gs://", true}, request->url);
    arguments.path({"-o,--output", kPath, "File or folder to write to (default: the URL's own name)"},
                   request->file);
    arguments.number("--parallel", 1, 64, request->parallel, "Ranges fetched at a time");
}

}  // namespace Kdd
