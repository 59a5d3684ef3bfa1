#pragma once

#include "kddlib/archive/DicomInput.h"
#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QHash>
#include <QList>
#include <QSet>

#include <chrono>
#include <memory>
#include <vector>

namespace Kxg
{
class Catalogue;
}

namespace Kdd
{

/// Images that arrive one by one, from many senders at a time: registers each at once, and gathers them by study, so that
/// a tag file is completed once for many of them.
///
/// One transaction registers all that wait for one. From then on the study waits in the database's queue, so that nothing
/// is lost with this object: it spares whoever completes the study the reading of the files. May be used on any thread;
/// each call brings the catalogue of its own thread.
class KDD_EXPORT ArrivedStudies
{
public:
    /// When a study that got images is due.
    struct Pace
    {
        std::chrono::milliseconds quiet{500};     ///< after the last one,
        std::chrono::milliseconds longest{3000};  ///< but not later than this after the first
    };

    ArrivedStudies();
    explicit ArrivedStudies(Pace pace);

    /// What was not completed by then waits in the database's queue.
    ~ArrivedStudies();

    /// Registers images. Success: they are registered for good, and `corrected` has the paths of those that a correction
    /// shows as something else than they say; perhaps with others that were registered at the same time.
    Result add(std::vector<DicomInput> images, Kxg::Catalogue& catalogue, QSet<QByteArray>& corrected);

    /// The same with digests of all bytes of the files, by their paths, where they are known. They are kept with the next
    /// study that is completed, so that nobody who sent an image waits for them.
    Result add(std::vector<DicomInput> images, const QHash<QByteArray, QByteArray>& digests,
               Kxg::Catalogue& catalogue, QSet<QByteArray>& corrected);

    /// Of a study that waits for a reason that is not known here; it is due at once.
    void addWaiting(const QByteArray& studyUID);

    /// Waits for a study that is due. False after `stop`.
    bool awaitDue(QByteArray& studyUID);

    /// Whatever waits in `awaitDue` returns from now on.
    void stop();

    /// What became of an attempt to complete a study.
    struct Attempt
    {
        Result result;
        /// It failed with the files of the study. Else others work on it, or the database failed.
        bool reachedFiles = false;
    };

    /// Brings into the study's tag file what has arrived by now; nothing where nothing has. Waits up to `patienceMs` [ms]
    /// for another thread that does it, and as long for another process that works on the study. What fails is due again
    /// later, after longer and longer pauses of up to an hour.
    Attempt attempt(const QByteArray& studyUID, Kxg::Catalogue& catalogue, int patienceMs);

    /// The same for whoever need not know why it failed.
    Result complete(const QByteArray& studyUID, Kxg::Catalogue& catalogue, int patienceMs);

    /// Whether something of the study is not in its tag file yet.
    bool isWaiting(const QByteArray& studyUID) const;

    /// The studies of which something is not in the tag file yet, but for those that have failed again and again: to try
    /// them is for whoever asks for one of them, and for `awaitDue`.
    QList<QByteArray> waiting() const;

private:
    struct KDD_LOCAL Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd
