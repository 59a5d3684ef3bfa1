#include "tools/kdd/GlobalArguments.h"

#include <QStandardPaths>

#include <dcmtk/config/osconfig.h>

#include <CLI/CLI.hpp>
#include <dcmtk/oflog/oflog.h>
#include <kddlib/BuildInfo.h>
#include <kddlib/DecoderPlace.h>
#include <kddlib/ExResource.h>
#include <kddlib/Kxg.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>

#include <algorithm>
#include <map>

namespace Kdd
{

namespace
{

const std::map<std::string, TagFile::CompressionMode> kCompressionNames = {
    {"none", TagFile::CompressionMode::None},
    {"zlib", TagFile::CompressionMode::Zlib},
    {"lzma", TagFile::CompressionMode::Lzma},
};

/// The first that is not empty.
QByteArray firstOf(const QList<QByteArray>& texts)
{
    // The last one is taken in any case.
    return *std::find_if(texts.begin(), texts.end() - 1,
                         [](const QByteArray& text) { return !text.isEmpty(); });
}

}  // namespace

void GlobalArguments::addTo(CLI::App& app)
{
    app.add_option("--store", mStore, "Folder of everything that is kept")
        ->type_name(kFolder)
        ->envname("KDD_STORE");
    app.add_option("--database", mDatabase,
                   "Image database: sqlite:FILE or postgresql://... (default: kdd.sqlite inside the store)")
        ->type_name("ADDRESS")
        ->envname("KDD_DATABASE");
    app.add_option("--meta", mMeta, "Folder of the tag files (default: meta inside the store)")
        ->type_name(kFolder)
        ->envname("KDD_META_FOLDER");
    // Without a description of its own the transformer stays out of what the help says.
    CLI::CheckedTransformer names(kCompressionNames, CLI::ignore_case);
    names.description("");
    app.add_option("--compression", mCompression, "How tag files are written: none, zlib or lzma")
        ->transform(names)
        ->type_name("none|zlib|lzma")
        ->envname("KDD_COMPRESSION");
    app.add_flag("--flush", mOptions.flush, "Flush every write to disk, against power loss")
        ->envname("KDD_FLUSH");
    app.add_flag("--json", mOptions.json, "Machine-readable result on standard output");
    app.add_flag("--quiet", mOptions.quiet, "No progress, only errors");
    app.add_flag("--verbose", mOptions.verbose, "Name what is passed over, and how long things take");
    app.set_version_flag("--version", BuildInfo::text());
}

const GlobalOptions& GlobalArguments::apply()
{
    // First, so that whatever is logged from here on is written as it was asked for.
    applyLogging();
    applyStore();
    // What files hold came from anywhere.
    setDecoderPlace(DecoderPlace::Apart);
    return mOptions;
}

/// The folder named, else the user's own.
QString GlobalArguments::storeFolder() const
{
    return mStore.empty() ? QStandardPaths::writableLocation(QStandardPaths::GenericDataLocation) +
                                QStringLiteral("/kdd")
                          : pathText(QByteArray::fromStdString(mStore));
}

void GlobalArguments::applyLogging() const
{
    LogFile::setLevel(mOptions.quiet     ? LogFile::Level::Errors
                      : mOptions.verbose ? LogFile::Level::Timing
                                         : LogFile::Level::Warnings);
    // Each command tells itself why a transfer failed, and of what.
    if (!mOptions.verbose)
        LogFile::dropTraces("CURL");
    // DCMTK's own lines do not name the file; what matters of them is told with it.
    OFLog::configure(mOptions.verbose ? OFLogger::WARN_LOG_LEVEL : OFLogger::OFF_LOG_LEVEL);
}

void GlobalArguments::applyStore()
{
    // Set for the whole process before there is a second thread.
    mOptions.store = storeFolder();
    const QByteArray root = pathBytes(mOptions.store);
    // What the command line says goes before the site's settings, and these before a place in the store.
    const QByteArray meta =
        firstOf({QByteArray::fromStdString(mMeta), ExResource::metaFolder(), root + "/meta"});
    Kxg::SetDatabaseServer(firstOf({QByteArray::fromStdString(mDatabase), ExResource::databaseAddress(),
                                    "sqlite:" + root + "/kdd.sqlite"}));
    TagFile::setMetaFolder(meta.constData());
    TagFile::setCompressionMode(mCompression);
    if (mOptions.flush)
        TagFile::setDurability(TagFile::Durability::PowerLoss);
}

}  // namespace Kdd
