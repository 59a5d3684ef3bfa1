#include "tools/kdd/StudyBuild.h"

#include "kddlib/TagFileGenerator.h"
#include "kddlib/tagfile/TagFile.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Database.h"

namespace Kdd
{

namespace
{

/// The largest studies take some minutes [ms].
constexpr int kPatience = 10 * 60 * 1000;

}  // namespace

bool buildStudy(Kxg::StudyClaim& claim, bool optimize, TagFile& file)
{
    return buildStudy(claim, optimize, file, TagFile());
}

bool buildStudy(Kxg::StudyClaim& claim, bool optimize, TagFile& file, const TagFile& loaded)
{
    const QByteArray& studyUID = claim.studyInstanceUID();
    TagFileGenerator generator(nullptr, optimize);
    if (!generator.createTagFile(file, claim.studyId(), studyUID.constData(), loaded)) {
        LogFile::errorf("The tag file of study %s is not built: %s", studyUID.constData(),
                        file.isEmpty() ? "none of its files could be read" : qUtf8Printable(file.failure()));
        return false;
    }
    return succeeded(claim.finish());
}

std::unique_ptr<Kxg::StudyClaim> claimStudy(Kxg::Catalogue& database, const QByteArray& studyUID)
{
    std::unique_ptr<Kxg::StudyClaim> claim;
    if (succeeded(database.claim(studyUID, kPatience, claim)) && claim == nullptr)
        LogFile::errorf("Study %s is being worked on by another process", studyUID.constData());
    return claim;
}

}  // namespace Kdd
