#pragma once

#include <QByteArray>
#include <QList>
#include <QString>

namespace Kdd
{

/// What every command is told.
struct GlobalOptions
{
    bool json = false;     ///< one machine-readable result on standard output
    bool quiet = false;    ///< no progress, only errors
    bool flush = false;    ///< written files are on disk before they count as written
    bool verbose = false;  ///< names everything that is passed over
    QString store;         ///< the folder of everything that is kept

    /// Folder of the volume files that are made here.
    QString volumeFolder() const { return store + QStringLiteral("/volumes"); }
};

/// How a command ends; the numbers are the exit codes.
enum class Outcome {
    Done = 0,
    Failed = 1,  ///< something asked for was not done, or a fault was found
    WrongUsage = 2,
};

/// A node of a study: the study, one of its series or one of its images.
struct NodeSelection
{
    QByteArray study;  ///< UID or a unique beginning of it
    QByteArray series;
    QByteArray image;
};

struct ShowOptions
{
    NodeSelection node;
    bool own = false;   ///< the node's own entries instead of the merged view
    bool tree = false;  ///< one line for each node instead of attributes
};

struct StudySelection
{
    QList<QByteArray> studies;
    bool all = false;
};

struct BuildRequest
{
    StudySelection selection;  ///< neither studies nor all: what waits to be built
    bool again = false;        ///< with all: also what has a tag file that nothing changed since
    bool settle = false;       ///< also what was merged and would wait for its time
    bool optimize = true;
    int jobs = 1;
};

struct PreviewsRequest
{
    StudySelection selection;
    QString folder;
    QString sheet;  ///< file of the contact sheet; empty for none
};

struct ScanRequest
{
    QList<QByteArray> paths;
    bool tolerant = false;  ///< of damaged DICOM files take what is sound
};

struct StackRequest
{
    StudySelection selection;
    bool again = false;  ///< also series that have volume files already
    bool ignoresFrameOfReference = false;
};

/// Which studies are listed; an empty text lets all pass.
struct ListRequest
{
    QByteArray patient;   ///< part of the name or identifier, whatever the case
    QByteArray date;      ///< YYYYMMDD, or a range FROM-TO with either end left out
    QByteArray modality;  ///< one that the study has
    bool waiting = false;
};

struct GetRequest
{
    QByteArray url;
    QString file;  ///< or the folder; empty: the URL's own name
    int parallel = 1;
};

struct SampleRequest
{
    QString folder;
    int images = 400;
    unsigned seed = 1;
};

struct CorrectionRequest
{
    QString job;  ///< file of the job's XML
    QByteArray study;
    QList<QByteArray> images;
    QString imageList;  ///< file that names further images, one on each line; empty for none
};

Outcome runAdd(const GlobalOptions& options, const ScanRequest& request);
Outcome runIndex(const GlobalOptions& options, const ScanRequest& request);
Outcome runBuild(const GlobalOptions& options, const BuildRequest& request);
Outcome runSync(const GlobalOptions& options, const QByteArray& study);
Outcome runCorrection(const GlobalOptions& options, const CorrectionRequest& request);
Outcome runStack(const GlobalOptions& options, const StackRequest& request);
Outcome runPreviews(const GlobalOptions& options, const PreviewsRequest& request);
Outcome runList(const GlobalOptions& options, const ListRequest& request);
Outcome runShow(const GlobalOptions& options, const ShowOptions& show);
Outcome runMetadata(const GlobalOptions& options, const NodeSelection& selection);
Outcome runStat(const GlobalOptions& options, const QByteArray& study);
Outcome runDiff(const GlobalOptions& options, const QString& left, const QString& right);
Outcome runVerify(const GlobalOptions& options, const StudySelection& selection);
Outcome runDelete(const GlobalOptions& options, const NodeSelection& selection);
Outcome runGet(const GlobalOptions& options, const GetRequest& request);
Outcome runPut(const GlobalOptions& options, const QString& path, const QByteArray& url);
Outcome runSample(const GlobalOptions& options, const SampleRequest& request);

}  // namespace Kdd
