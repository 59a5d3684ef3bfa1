#include "sample/Studies.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/SampleVolumes.h"

#include <cstdio>

namespace Kdd
{

Outcome runSample(const GlobalOptions& options, const SampleRequest& request)
{
    SampleSummary summary;
    {
        Progress progress("Writing", !options.quiet);
        summary = writeSampleStudies(request.folder, {request.images, request.seed},
                                     [&](int done, int total) { progress.show(done, total); });
    }
    int volumes = 0;
    Result result = summary.result;
    if (result.good())
        result = writeSampleVolumes(request.folder, volumes, summary.bytes);
    if (!succeeded(result))
        return Outcome::Failed;
    if (options.json) {
        printJson({{QStringLiteral("studies"), summary.studies},
                   {QStringLiteral("series"), summary.series},
                   {QStringLiteral("images"), summary.images},
                   {QStringLiteral("volumes"), volumes},
                   {QStringLiteral("bytes"), summary.bytes}});
    } else if (!options.quiet) {
        std::printf("%d studies, %d series, %d images, %d volumes, %s in %s\n", summary.studies,
                    summary.series, summary.images, volumes, qUtf8Printable(humanBytes(summary.bytes)),
                    qUtf8Printable(request.folder));
    }
    return Outcome::Done;
}

}  // namespace Kdd
