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

std::unique_ptr<Kxg::StudyClaim> claimStudy(Kxg::Catalogue& catalogue, const QByteArray& studyUID)
{
    std::unique_ptr<Kxg::StudyClaim> claim;
    if (succeeded(catalogue.claim(studyUID, kPatience, claim)) && claim == nullptr)
        LogFile::errorf("Study %s is being worked on by another process", studyUID.constData());
    return claim;
}

}  // namespace Kdd
