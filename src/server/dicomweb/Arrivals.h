#pragma once

#include <QByteArray>

namespace Kdd::DicomWeb
{

/// What became of images that have arrived.
enum class Arrived {
    Nothing,  ///< none wait
    Brought,  ///< the tag file may show more now
    Held,     ///< others work on the study, or the database cannot be asked: they can be brought in soon
    Stuck,    ///< nor soon: a file of the study cannot be read or written
};

/// Whether what is not found may be there all the same.
inline bool isLacking(Arrived arrived)
{
    return arrived == Arrived::Held || arrived == Arrived::Stuck;
}

/// What is known of studies and not in their tag files yet: mostly images that have arrived. Called on several threads at
/// the same time.
class Arrivals
{
public:
    virtual ~Arrivals() = default;

    /// Brings in what has arrived of the study, whichever server took it.
    virtual Arrived bringIn(const QByteArray& studyUID) = 0;

    /// Brings in what this server has taken: of the study, or of all studies when that is empty.
    virtual void bringInOwn(const QByteArray& studyUID) = 0;

    /// Whether an image is registered and to be shown in the study; not where nobody can tell.
    virtual bool isRegistered(const QByteArray& studyUID, const QByteArray& sopInstanceUID) = 0;

    /// Takes over a study whose tag file does not show yet what the database was told: from now on it counts among what this
    /// server has taken.
    virtual void takeOver(const QByteArray& studyUID) = 0;
};

/// Looks for something of a study by `look()`, which gives whether it is there. What is not may have arrived a moment ago: that
/// is brought in then, and looked for once more, also where none waited, for another thread may have brought it in since the
/// first look. `arrivals` null: nothing arrives here. True when it is not known what is there.
template <typename Look>
bool isLackingAfter(const Look& look, const QByteArray& studyUID, Arrivals* arrivals)
{
    if (look() || arrivals == nullptr)
        return false;
    const bool isLackingNow = isLacking(arrivals->bringIn(studyUID));
    if (!isLackingNow)
        look();
    return isLackingNow;
}

}  // namespace Kdd::DicomWeb
