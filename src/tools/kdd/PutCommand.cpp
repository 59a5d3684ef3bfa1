#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"

#include <QFile>

#include <kddlib/KxCurlClient.h>
#include <kddlib/KxCurlUploadStream.h>
#include <kddlib/LogFile.h>
#include <kddlib/UploadErrors.h>

#include <cstdio>
#include <memory>
#include <stdexcept>

namespace Kdd
{

namespace
{

struct PutRequest
{
    QString file;
    QByteArray url;
};

constexpr int kBlockSize = 1024 * 1024;  // [bytes]

/// A file that cannot be read to its end leaves no object: half a file must not look like a file.
Result send(QFile& file, KxCurlUploadStream& stream, Progress& progress)
{
    QByteArray block(kBlockSize, '\0');
    qint64 count = 0;
    while (stream.good() && (count = file.read(block.data(), block.size())) > 0) {
        stream.write(block.constData(), count);
        progress.show(file.pos(), file.size());
    }
    if (count < 0) {
        stream.abandon();
        return Result::failure(file.errorString());
    }
    // Only closing tells whether the object is there.
    stream.close();
    return stream.good() ? Result() : Result::failure(QString::fromStdString(stream.error()));
}

Result upload(QFile& file, const QByteArray& url, Progress& progress)
{
    try {
        KxCurlUploadStream stream = KxCurlClient::instance().write(url.toStdString());
        // Told once, by the caller, with the names of file and object.
        stream.leaveErrorsToCaller();
        return send(file, stream, progress);
    } catch (const std::invalid_argument&) {
        // Wrong usage, which ends the command with another exit code.
        throw;
    } catch (const std::exception& fault) {
        return Result::failure(QString::fromStdString(explained(fault)));
    }
}

Outcome runPut(const GlobalOptions& options, const QString& path, const QByteArray& url)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly)) {
        LogFile::errorf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(file.errorString()));
        return Outcome::Failed;
    }
    Result result;
    try {
        // Gone, and its line wiped, before a result or a fault is told.
        Progress progress("Uploading", !options.quiet, Progress::Unit::Bytes);
        result = upload(file, url, progress);
    } catch (const std::invalid_argument& fault) {
        LogFile::errorf("%s", fault.what());
        return Outcome::WrongUsage;
    }
    if (!succeeded(
            result.within(QStringLiteral("%1 was not uploaded to %2").arg(path, QString::fromUtf8(url)))))
        return Outcome::Failed;
    if (options.json)
        printJson({{QStringLiteral("bytes"), file.pos()}, {QStringLiteral("url"), QString::fromUtf8(url)}});
    else if (!options.quiet)
        std::printf("%s: %s\n", url.constData(), qUtf8Printable(humanBytes(file.pos())));
    return Outcome::Done;
}

}  // namespace

void declarePut(CommandSet& commands)
{
    const CommandText text = {"put", kTransfers, "Upload a file to the cloud storage",
                              "The object is there when all of it is. An upload that breaks off is resumed; "
                              "when it fails there is no object.",
                              "kdd put scan.dcm gs://bucket/scan.dcm"};
    const auto request = std::make_shared<PutRequest>();
    ArgumentList arguments = commands.declare(text, [request](const GlobalOptions& options) {
        return runPut(options, request->file, request->url);
    });
    arguments.path({"FILE", kFile, "What to upload", true}, request->file);
    arguments.text({"URL", kUrl, "gs://BUCKET/OBJECT", true}, request->url);
}

}  // namespace Kdd
