#include "kddlib/tagmodel/TagMap.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/FileScan.h"
#include "tools/kdd/Registration.h"
#include "tools/kdd/Report.h"

#include <cstdio>

namespace Kdd
{

Outcome runIndex(const GlobalOptions& options, const ScanRequest& request)
{
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    if (database == nullptr)
        return Outcome::Failed;
    FileScan scan(*database, options, request.tolerant ? Damage::Tolerated : Damage::Refused);
    Registration registration(*database);
    const bool isDone = scan.run(request.paths, [&](const DicomInput& input) {
        return registration.add(input);
    }) && registration.flush();
    const int studies = registration.requests().size();
    if (options.json) {
        printJson({{QStringLiteral("studies"), studies},
                   {QStringLiteral("images"), registration.images()},
                   {QStringLiteral("volumes"), registration.volumes()},
                   {QStringLiteral("unchanged"), scan.unchanged()},
                   {QStringLiteral("skipped"), scan.skipped()},
                   {QStringLiteral("failed"), scan.failed()}});
    } else if (!options.quiet) {
        std::printf(
            "%d images and %d volumes registered in %d studies; %d files unchanged, %d skipped, %d failed\n",
            registration.images(), registration.volumes(), studies, scan.unchanged(), scan.skipped(),
            scan.failed());
    }
    return isDone && scan.failed() == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
