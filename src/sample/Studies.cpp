#include "sample/Studies.h"

#include "platform/base/Result.h"
#include "sample/Fault.h"
#include "sample/Folder.h"
#include "sample/Kinds.h"
#include "sample/Random.h"
#include "sample/Study.h"

#include <QHash>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdict.h>

#include <algorithm>

namespace Kdd
{

namespace
{

// Beyond it there are further sets of studies and not longer series.
constexpr int kLargestSet = 1000;      // [images]
constexpr int kOpening = 7 * 60 * 60;  // [s] after midnight
constexpr int kClosing = 17 * 60 * 60;

/// One study of every set of studies.
struct Kind
{
    const char* name;
    SampleCharset patient;
    const char* description;
    int fewest;  // files
    int share;   // of what the fixed files of a set leave [percent]
    void (*write)(const SampleStudy& study, SampleFolder& folder);
};

// The patient of the CT comes for a radiograph, too.
const Kind kKinds[] = {
    {"CT", SampleCharset::Latin1, "CT chest", 7, 70, writeCtStudy},
    {"MR", SampleCharset::Cyrillic, "MR head", 5, 30, writeMrStudy},
    {"US", SampleCharset::Japanese, "Abdomen", 2, 0, writeUltrasoundStudy},
    {"MG", SampleCharset::Greek, "Mammogram both sides", 4, 0, writeMammogramStudy},
    // Two studies of the kind, hence the numbers in their names.
    {"DX", SampleCharset::Utf8, "Chest in two planes", 2, 0, writeRadiographStudy},
    {"DX", SampleCharset::Latin1, "Chest in two planes", 2, 0, writeRadiographStudy},
    {"SC", SampleCharset::Ascii, "Documents", 1, 0, writeCaptureStudy},
};

struct PlannedStudy
{
    const Kind* kind;
    SampleStudy study;
};

struct Plan
{
    QVector<PlannedStudy> studies;
    QHash<QString, int> numbers;  // of the studies of each kind, for their names
    int files = 0;
};

// What a set has to share out when each study has its fixed files.
int restOf(int images)
{
    for (const Kind& kind : kKinds)
        images -= kind.fewest;
    return std::max(0, images);
}

SampleStudy newStudy(const Kind& kind, int set, unsigned seed, int number)
{
    SampleStudy study;
    study.seed = seed;
    study.directory = QStringLiteral("%1-%2").arg(QLatin1String(kind.name)).arg(number);
    study.patient = samplePatient(seed, set, kind.patient);
    study.description = kind.description;
    // Drawn by the study's own name, so that another number of images does not move it.
    study.startSecond = SampleRandom(study.name("start")).between(kOpening, kClosing);
    return study;
}

void planSet(Plan& plan, int set, int images, unsigned seed)
{
    const int first = plan.studies.size();
    const int rest = restOf(images);
    // What rounding leaves goes to the first study, so that the sum is right.
    int left = rest;
    for (const Kind& kind : kKinds) {
        const int share = rest * kind.share / 100;
        SampleStudy study = newStudy(kind, set, seed, ++plan.numbers[QLatin1String(kind.name)]);
        study.images = kind.fewest + share;
        left -= share;
        plan.files += study.images;
        plan.studies.append({&kind, study});
    }
    plan.studies[first].study.images += left;
    plan.files += left;
}

Plan planStudies(const SampleOptions& options)
{
    Plan plan;
    // As few sets as hold all images, and these as even as whole numbers allow.
    const int sets = (options.images - 1) / kLargestSet + 1;
    for (int set = 1; set <= sets; ++set)
        planSet(plan, set, options.images / sets + (set <= options.images % sets ? 1 : 0), options.seed);
    return plan;
}

void checkOptions(const SampleOptions& options)
{
    if (options.images < 1) {
        throw SampleFault(
            QStringLiteral("The number of images must be at least 1, not %1").arg(options.images));
    }
    dcmDataDict.rdlock();  // loads it
    dcmDataDict.rdunlock();
    if (!dcmDataDict.isDictionaryLoaded())
        throw SampleFault(QStringLiteral("The DICOM data dictionary cannot be read; check DCMDICTPATH"));
}

}  // namespace

Result writeSampleStudies(const QString& folder, const SampleOptions& options,
                          const std::function<void(int done, int total)>& progress, SampleSummary& summary)
{
    SampleFolder files(folder, progress);
    Result result;
    try {
        checkOptions(options);
        const Plan plan = planStudies(options);
        files.expect(plan.files);
        for (const PlannedStudy& planned : plan.studies)
            planned.kind->write(planned.study, files);
    } catch (const SampleFault& fault) {
        result = Result::failure(fault.sentence());
    }
    // Also after a fault: what has been written lies there.
    summary = files.summary();
    return result;
}

}  // namespace Kdd
