#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Commands.h"

#include <QFile>
#include <QStandardPaths>

#include <dcmtk/config/osconfig.h>

#include <CLI/CLI.hpp>
#include <dcmtk/oflog/oflog.h>
#include <kddlib/BuildInfo.h>
#include <kddlib/ExResource.h>
#include <kddlib/Kxg.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>
#include <kddlib/TagFile.h>

#include <algorithm>
#include <cstdio>
#include <exception>
#include <functional>
#include <map>
#include <stdexcept>

namespace Kdd
{

namespace
{

struct StoreOptions
{
    std::string store;
    std::string database;
    std::string meta;
    TagFile::CompressionMode compression = TagFile::CompressionMode::Zlib;
};

/// A result that could not be written is none.
Outcome whenWritten(Outcome outcome)
{
    if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0)
        return outcome;
    LogFile::errorf("Standard output cannot be written");
    return Outcome::Failed;
}

/// The command chosen, ready to run once the global options are in force.
using Command = std::function<Outcome()>;

const std::map<std::string, TagFile::CompressionMode> kCompressionNames = {
    {"none", TagFile::CompressionMode::None},
    {"zlib", TagFile::CompressionMode::Zlib},
    {"lzma", TagFile::CompressionMode::Lzma},
};

QByteArray bytes(const std::string& text)
{
    return {text.data(), static_cast<int>(text.size())};
}

/// Where a name would lead to another file the command is refused.
QString path(const std::string& text)
{
    if (!isPlainText(bytes(text)))
        throw std::invalid_argument("The name " + text + " is no text in the encoding of the locale");
    return QFile::decodeName(bytes(text));
}

void addGlobalOptions(CLI::App& app, GlobalOptions& global, StoreOptions& store)
{
    app.add_option("--store", store.store, "Folder of everything that is kept")->envname("KDD_STORE");
    app.add_option("--database", store.database,
                   "Image database: sqlite:FILE or postgresql://... (default: kdd.sqlite inside the store)")
        ->envname("KDD_DATABASE");
    app.add_option("--meta", store.meta, "Folder of the tag files (default: meta inside the store)")
        ->envname("KDD_META_FOLDER");
    app.add_option("--compression", store.compression, "How tag files are written: none, zlib or lzma")
        ->transform(CLI::CheckedTransformer(kCompressionNames, CLI::ignore_case))
        ->envname("KDD_COMPRESSION");
    app.add_flag("--flush", global.flush, "Flush every write to disk, against power loss")
        ->envname("KDD_FLUSH");
    app.add_flag("--json", global.json, "Machine-readable result on standard output");
    app.add_flag("--quiet", global.quiet, "No progress, only errors");
    app.add_flag("--verbose", global.verbose, "Name what is passed over, and how long things take");
    app.set_version_flag("--version", BuildInfo::text());
}

/// The folder named, else the user's own.
QString storeFolder(const StoreOptions& store)
{
    return store.store.empty() ? QStandardPaths::writableLocation(QStandardPaths::GenericDataLocation) +
                                     QStringLiteral("/kdd")
                               : pathText(bytes(store.store));
}

/// The first that is not empty.
QByteArray firstOf(const QList<QByteArray>& texts)
{
    return *std::find_if(texts.begin(), texts.end() - 1,
                         [](const QByteArray& text) { return !text.isEmpty(); });
}

void applyLogging(const GlobalOptions& global)
{
    LogFile::setLevel(global.quiet     ? LogFile::Level::Errors
                      : global.verbose ? LogFile::Level::Timing
                                       : LogFile::Level::Warnings);
    // Each command tells itself why a transfer failed, and of what.
    if (!global.verbose)
        LogFile::dropTraces("CURL");
    // DCMTK's own lines do not name the file; what matters of them is told with it.
    OFLog::configure(global.verbose ? OFLogger::WARN_LOG_LEVEL : OFLogger::OFF_LOG_LEVEL);
}

void applyStore(GlobalOptions& global, const StoreOptions& store)
{
    global.store = storeFolder(store);
    const QByteArray root = pathBytes(global.store);
    const QByteArray meta = firstOf({bytes(store.meta), ExResource::metaFolder(), root + "/meta"});
    Kxg::SetDatabaseServer(
        firstOf({bytes(store.database), ExResource::databaseAddress(), "sqlite:" + root + "/kdd.sqlite"}));
    TagFile::setMetaFolder(meta.constData());
    TagFile::setCompressionMode(store.compression);
    if (global.flush)
        TagFile::setDurability(TagFile::Durability::PowerLoss);
}

/// The options of a node below a study; the strings live as long as the application.
struct NodeArguments
{
    std::string study;
    std::string series;
    std::string image;

    void addTo(CLI::App& command)
    {
        command.add_option("UID", study, "Study Instance UID, or a unique beginning of it")->required();
        command.add_option("--series", series, "Series Instance UID");
        command.add_option("--image", image, "SOP Instance UID");
    }

    NodeSelection selection() const { return {bytes(study), bytes(series), bytes(image)}; }
};

/// Declares the subcommands and keeps what their arguments are read into.
class CommandLine
{
public:
    CommandLine(CLI::App& app, const GlobalOptions& global, Command& chosen)
        : mApp(app)
        , mGlobal(global)
        , mChosen(chosen)
    {
        declareTaking();
        declareStoring();
        declareReading();
        declareChecking();
        declareTransfers();
    }

private:
    CLI::App& declare(const char* name, const char* description, const Command& command)
    {
        CLI::App* subcommand = mApp.add_subcommand(name, description);
        subcommand->fallthrough();
        subcommand->callback([this, command] { mChosen = command; });
        return *subcommand;
    }

    QList<QByteArray> paths() const { return listOf(mPaths); }

    StudySelection studies() const { return {listOf(mStudies), mAll}; }

    static QList<QByteArray> listOf(const std::vector<std::string>& texts)
    {
        QList<QByteArray> list;
        for (const std::string& text : texts)
            list.append(bytes(text));
        return list;
    }

    void addPaths(CLI::App& command)
    {
        command.add_option("PATH", mPaths, "Files and folders")->required();
        command.add_flag(
            "--tolerant", mTolerant,
            "Of damaged DICOM files take what is sound, with a warning that says what is left out");
    }

    void addStudies(CLI::App& command)
    {
        command.add_option("UID", mStudies, "Study Instance UIDs, or unique beginnings of them");
        command.add_flag("--all", mAll, "Every study");
    }

    void declareTaking()
    {
        addPaths(declare("add", "Take the DICOM and volume files below the paths into database and tag files",
                         [this] {
                             return runAdd(mGlobal, {paths(), mTolerant});
                         }));
        addPaths(declare("index", "Register the DICOM and volume files below the paths in the database only",
                         [this] {
                             return runIndex(mGlobal, {paths(), mTolerant});
                         }));
        CLI::App& build =
            declare("build", "Build the tag files of studies that wait for it, or of those named", [this] {
                return runBuild(mGlobal, {studies(), mAgain, mSettle, !mNoOptimize, mJobs});
            });
        addStudies(build);
        build.add_flag("--again", mAgain, "With --all: also those whose files did not change");
        build.add_flag("--settle", mSettle,
                       "Also studies that images were merged into lately, without waiting");
        build.add_flag("--no-optimize", mNoOptimize, "Leave every attribute where it was found");
        build.add_option("--jobs", mJobs, "Studies built at once")->check(CLI::Range(1, 256));
        CLI::App& stack = declare("stack", "Make volume files from the series that can be stacked", [this] {
            return runStack(mGlobal, {studies(), mAgain, mIgnoresFrameOfReference});
        });
        addStudies(stack);
        stack.add_flag("--again", mAgain, "Also series that have volume files already");
        stack.add_flag(
            "--ignore-frame-of-reference", mIgnoresFrameOfReference,
            "Also stack slices that have different Frames of Reference, as anonymisers leave them");
    }

    void declareStoring()
    {
        declare("sync", "Bring a study's tag file into line with the database",
                [this] { return runSync(mGlobal, bytes(mNode.study)); })
            .add_option("UID", mNode.study, "Study Instance UID, or a unique beginning of it")
            ->required();
        mNode.addTo(declare("delete", "Delete a study's tag file, a series or an image",
                            [this] { return runDelete(mGlobal, mNode.selection()); }));
        declareCorrection();
        CLI::App& sample = declare("sample", "Write synthetic studies", [this] {
            return runSample(mGlobal, {path(mFolder), mImages, mSeed});
        });
        sample.add_option("DIR", mFolder, "Folder to write to")->required();
        sample.add_option("--images", mImages, "About how many images in all")
            ->check(CLI::Range(1, 10000000));
        sample.add_option("--seed", mSeed, "Another seed gives other studies");
    }

    void declareCorrection()
    {
        CLI::App& correction =
            declare("qa", "Correct attributes of images, or move images to another study", [this] {
                return runCorrection(mGlobal, {path(mJob), bytes(mNode.study), paths(), path(mImageList)});
            });
        correction.add_option("JOB", mJob, "XML file that says what to correct")->required();
        correction
            .add_option("--study", mNode.study,
                        "Study Instance UID, or a unique beginning of it; of a move all of the new study's")
            ->required();
        correction.add_option("--image", mPaths, "SOP Instance UIDs");
        correction.add_option("--images", mImageList, "File of SOP Instance UIDs, one on each line");
    }

    void declareReading()
    {
        CLI::App& previews = declare("previews", "Export the previews of studies",
                                     [this] { return runPreviews(mGlobal, previewsRequest()); });
        previews.add_option("NAMES", mPaths, "The studies, and last the folder to write to")
            ->option_text("UID... DIR")
            ->required();
        previews.add_flag("--all", mAll, "Every study; then name the folder only");
        previews.add_option("--sheet", mFolder, "Also put all pictures of the folder into this one picture");
        CLI::App& list = declare("list", "List the studies", [this] {
            return runList(mGlobal, {bytes(mPatient), bytes(mDate), bytes(mModality), mWaiting});
        });
        list.add_option("--patient", mPatient,
                        "Only those whose patient's name or identifier has this in it");
        list.add_option("--date", mDate, "Only those of this date, YYYYMMDD, or of a range FROM-TO");
        list.add_option("--modality", mModality, "Only those with a series of this modality");
        list.add_flag("--waiting", mWaiting, "Only those that wait to be built");
        CLI::App& show = declare("show", "Show the attributes of a node", [this] {
            return runShow(mGlobal, {mNode.selection(), mOwn, mTree});
        });
        mNode.addTo(show);
        show.add_flag("--own", mOwn, "Only what the node itself holds, not what it inherits");
        show.add_flag("--tree", mTree, "The nodes below instead of attributes");
        mNode.addTo(declare("metadata", "Write images as DICOM JSON",
                            [this] { return runMetadata(mGlobal, mNode.selection()); }));
        declare("stat", "Show counters and sizes of a study's tag file",
                [this] { return runStat(mGlobal, bytes(mNode.study)); })
            .add_option("UID", mNode.study, "Study Instance UID, or a unique beginning of it")
            ->required();
    }

    void declareChecking()
    {
        CLI::App& diff = declare("diff", "Compare two studies or files attribute by attribute",
                                 [this] { return runDiff(mGlobal, path(mLeft), path(mRight)); });
        diff.add_option("LEFT", mLeft, "Study UID, tag file or DICOM file")->required();
        diff.add_option("RIGHT", mRight, "Study UID, tag file or DICOM file")->required();
        addStudies(declare("verify", "Hold tag files against the DICOM files they were made from",
                           [this] { return runVerify(mGlobal, studies()); }));
    }

    void declareTransfers()
    {
        CLI::App& get = declare("get", "Fetch an object over HTTP(S) or from the cloud storage", [this] {
            return runGet(mGlobal, {bytes(mUrl), path(mFile), mParallel});
        });
        get.add_option("URL", mUrl, "http://, https:// or gs://")->required();
        get.add_option("-o,--output", mFile, "File or folder to write to (default: the URL's own name)");
        get.add_option("--parallel", mParallel, "Ranges fetched at a time")->check(CLI::Range(1, 64));
        CLI::App& put = declare("put", "Upload a file to the cloud storage",
                                [this] { return runPut(mGlobal, path(mFile), bytes(mUrl)); });
        put.add_option("FILE", mFile, "What to upload")->required();
        put.add_option("URL", mUrl, "gs://BUCKET/OBJECT")->required();
    }

    PreviewsRequest previewsRequest() const
    {
        QList<QByteArray> names = paths();
        const QString folder = path(names.takeLast().toStdString());
        return {{names, mAll}, folder, path(mFolder)};
    }

    CLI::App& mApp;
    const GlobalOptions& mGlobal;
    Command& mChosen;

    std::vector<std::string> mPaths;
    NodeArguments mNode;
    std::string mJob;
    std::string mImageList;
    std::string mFolder;
    std::string mUrl;
    std::string mFile;
    int mParallel = 4;
    int mImages = 400;
    unsigned mSeed = 1;
    bool mOwn = false;
    bool mTree = false;
    std::string mPatient;
    std::string mDate;
    std::string mModality;
    bool mWaiting = false;
    std::string mLeft;
    std::string mRight;
    std::vector<std::string> mStudies;
    bool mAll = false;
    bool mAgain = false;
    bool mSettle = false;
    bool mTolerant = false;
    bool mIgnoresFrameOfReference = false;
    bool mNoOptimize = false;
    int mJobs = 1;
};

Outcome run(int argc, char** argv)
{
    CLI::App app("Tag files: the metadata cache of a medical-imaging server", "kdd");
    app.fallthrough();
    GlobalOptions global;
    StoreOptions store;
    Command chosen;
    addGlobalOptions(app, global, store);
    CommandLine commands(app, global, chosen);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& fault) {
        return app.exit(fault) == 0 ? Outcome::Done : Outcome::WrongUsage;
    }
    if (!chosen) {
        std::fprintf(stderr, "kdd: name a command; kdd --help lists them\n");
        return Outcome::WrongUsage;
    }
    applyLogging(global);
    applyStore(global, store);
    CommandProgress::catchInterrupts();
    return whenWritten(chosen());
}

}  // namespace

}  // namespace Kdd

int main(int argc, char** argv)
{
    try {
        return static_cast<int>(Kdd::run(argc, argv));
    } catch (const std::exception& fault) {
        std::fprintf(stderr, "kdd: %s\n", fault.what());
        return static_cast<int>(Kdd::Outcome::Failed);
    }
}
