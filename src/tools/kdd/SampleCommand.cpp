#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/sample/SampleStudies.h"

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
    if (!summary.failure.isEmpty()) {
        LogFile::errorf("%s", qUtf8Printable(summary.failure));
        return Outcome::Failed;
    }
    if (options.json) {
        printJson({{QStringLiteral("studies"), summary.studies},
                   {QStringLiteral("series"), summary.series},
                   {QStringLiteral("images"), summary.images},
                   {QStringLiteral("bytes"), summary.bytes}});
    } else if (!options.quiet) {
        std::printf("%d studies, %d series, %d images, %s in %s\n", summary.studies, summary.series,
                    summary.images, qUtf8Printable(humanBytes(summary.bytes)),
                    qUtf8Printable(request.folder));
    }
    return Outcome::Done;
}

}  // namespace Kdd
