#pragma once

#include "kddlib/tagfile/qa/BuildCorrections.h"
#include "kddlib/volumes/VolumeInfo.h"

namespace Kdd
{

class TagFile;

/// A volume file names its images as they were when it was made. Finds what corrections have made of them since.
class CorrectedVolumes
{
public:
    /// Both must outlive the object; the file holds all images that the study has.
    CorrectedVolumes(const TagFile& file, const BuildCorrections& corrections)
        : mFile(file)
        , mCorrections(corrections)
    {
    }

    enum class Fate {
        Whole,    ///< as far as its images are known at all, they stand in one series here
        Divided,  ///< a correction moved some of its images elsewhere
        Gone,     ///< and all of them
    };

    /// Names the images in `info` as they are known now, those that stand elsewhere by nothing.
    Fate update(VolumeInfo& info, bool isForeign) const;

    /// The series of the first image that is held; empty when none is.
    QByteArray seriesOf(const VolumeInfo& info) const;

private:
    struct Place
    {
        QByteArray key;
        bool isElsewhere = false;
        bool isCorrected = false;
    };

    Place placeOf(const QByteArray& uid, bool isForeign) const;

    const TagFile& mFile;
    const BuildCorrections& mCorrections;
};

}  // namespace Kdd
