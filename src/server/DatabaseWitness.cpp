#include "server/DatabaseWitness.h"

#include <kddlib/LogFile.h>

#include <vector>

namespace Kdd
{

bool DatabaseWitness::isDamaged(const QByteArray& studyUID, const Kxg::TagFileStamp& read)
{
    std::vector<Kxg::FoundStudy> found;
    const Result result = mDatabase.ask(nullptr, [&](Kxg::StudySearch& search) {
        Kxg::SearchQuery query;
        query.limit = 1;
        query.terms.push_back({Kxg::SearchColumn::StudyUID, {studyUID}, {}, {}, {}, {}, {}});
        return search.studies(query, found);
    });
    if (result.bad() || found.empty() || !found[0].isBuilt)
        return false;
    const Kxg::TagFileStamp& written = found[0].tagFile;
    const bool isUntouched =
        written.modified != 0 && read.fileSize == written.fileSize && read.modified == written.modified;
    if (!isUntouched || read.digest == written.digest)
        return false;
    LogFile::errorf(
        "The tag file of study %s is damaged and not served: its bytes have changed, its size and "
        "time have not",
        studyUID.constData());
    return true;
}

}  // namespace Kdd
