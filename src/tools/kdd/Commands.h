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
    bool verbose = false;  ///< names everything that is passed over
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

struct SampleRequest
{
    QString folder;
    int images = 400;
    unsigned seed = 1;
};

Outcome runAdd(const GlobalOptions& options, const QList<QByteArray>& paths);
Outcome runList(const GlobalOptions& options);
Outcome runShow(const GlobalOptions& options, const ShowOptions& show);
Outcome runMetadata(const GlobalOptions& options, const NodeSelection& selection);
Outcome runStat(const GlobalOptions& options, const QByteArray& study);
Outcome runDiff(const GlobalOptions& options, const QString& left, const QString& right);
Outcome runVerify(const GlobalOptions& options, const StudySelection& selection);
Outcome runDelete(const GlobalOptions& options, const NodeSelection& selection);
Outcome runSample(const GlobalOptions& options, const SampleRequest& request);

}  // namespace Kdd
