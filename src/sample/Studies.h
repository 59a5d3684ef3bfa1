#pragma once

#include <QString>

#include <functional>

namespace Kdd
{

class Result;

struct SampleOptions
{
    int images = 400;   // how many files in all; at least those of one set of studies, 23, are written
    unsigned seed = 1;  // another seed gives other patients' data, values and UIDs
};

/// What has been written, up to the failure if there was one.
struct SampleSummary
{
    int studies = 0;
    int series = 0;
    int images = 0;    // files, presentation states and reports among them
    qint64 bytes = 0;  // of all files together
};

/// Writes a day's work of a small hospital below `folder`, which is made when it is not there: CT, MR,
/// ultrasound, mammography, radiographs and secondary captures of patients with names in six character sets.
///
/// The files are named `<study>/<series>/<instance>.dcm`, for example `CT-1/2/IM0001.dcm`. More than a
/// thousand images make further sets of studies (`CT-2`...) rather than longer series.
///
/// The same options give the same bytes on every call. The same seed with another number of images gives the
/// same objects under the same UIDs, only more or fewer of them; so a larger call plays the images that
/// arrive later.
///
/// A file appears under its name only when it is complete; a file of that name is replaced, others are left
/// alone. The first failure ends the call; it says what could not be written and why, and `summary` what was written
/// before. `progress`, which may be empty, is told after each file.
Result writeSampleStudies(const QString& folder, const SampleOptions& options,
                          const std::function<void(int done, int total)>& progress, SampleSummary& summary);

}  // namespace Kdd
