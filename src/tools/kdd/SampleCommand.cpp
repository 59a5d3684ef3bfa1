#include "sample/Studies.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/SampleVolumes.h"

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct SampleRequest
{
    QString folder;
    int images = 400;
    unsigned seed = 1;
};

Outcome runSample(const GlobalOptions& options, const SampleRequest& request)
{
    SampleSummary summary;
    Result result;
    // The line of the progress is wiped before anything else is written.
    {
        Progress progress("Writing", !options.quiet);
        result = writeSampleStudies(
            request.folder, {request.images, request.seed},
            [&](int done, int total) { progress.show(done, total); }, summary);
    }
    int volumes = 0;
    // Stacked from the files just written, as an archive would do it.
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

}  // namespace

void declareSample(CommandSet& commands)
{
    const CommandText text = {"sample", kTrying, "Write synthetic studies",
                              "A small hospital day: CT, MR, ultrasound, mammograms, X-ray and documents, "
                              "with several character sets. The same number and seed give the same studies.",
                              "kdd sample day --images 600\n"
                              "kdd sample other-day --seed 2"};
    const auto request = std::make_shared<SampleRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runSample(options, *request); });
    arguments.path({"DIR", kFolder, "Folder to write to", true}, request->folder);
    arguments.number("--images", 1, 10000000, request->images, "About how many images in all");
    arguments.number("--seed", request->seed, "Another seed gives other studies");
}

}  // namespace Kdd
