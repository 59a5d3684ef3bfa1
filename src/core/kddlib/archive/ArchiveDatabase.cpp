#include "kddlib/archive/ArchiveDatabase.h"

#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"

namespace Kdd
{

namespace
{

/// The largest studies take some minutes [ms].
constexpr int kPatience = 10 * 60 * 1000;

}  // namespace

std::unique_ptr<Kxg::Catalogue> openCatalogue()
{
    Result result;
    std::unique_ptr<Kxg::Catalogue> catalogue = Kxg::Catalogue::open(Kxg::DatabaseServer(), result);
    succeeded(result);
    return catalogue;
}

bool succeeded(const Result& result)
{
    if (result.bad())
        LogFile::errorf("%s", qUtf8Printable(result.text()));
    return result.good();
}

Result claimStudy(Kxg::Catalogue& catalogue, const QByteArray& studyUID,
                  std::unique_ptr<Kxg::StudyClaim>& claim)
{
    Result result = catalogue.claim(studyUID, kPatience, claim);
    // No fault and no claim: somebody else has it still.
    if (result.good() && claim == nullptr)
        result = Result::failure(QStringLiteral("Study %1 is being worked on by another process")
                                     .arg(QString::fromUtf8(studyUID)));
    return result;
}

}  // namespace Kdd
