#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"
#include "server/dimse/ServiceProvider.h"

namespace Kdd::Dimse
{

/// Answers C-FIND, of the models that begin at the patient and at the study, by the search that answers over HTTP too.
///
/// DCMTK has classes for such a provider, above a database that they ask for one answer after the other. They accept
/// associations themselves, one at a time or in processes of their own, and retrieve by sending files as they lie, without
/// corrections. So only its messages are used.
class FindProvider : public ServiceProvider
{
public:
    /// Both must outlive the object. `mostAnswers` bounds what one question gets.
    FindProvider(const DicomWeb::ThreadSearch& database, DicomWeb::StudyShelf& shelf, int mostAnswers)
        : mDatabase(database)
        , mShelf(shelf)
        , mMostAnswers(mostAnswers)
    {
    }

    bool provides(const QByteArray& sopClass) const override;
    std::optional<Right> right() const override { return Right::Query; }
    bool handle(const Command& command, Association& association) override;

private:
    const DicomWeb::ThreadSearch& mDatabase;
    DicomWeb::StudyShelf& mShelf;
    const int mMostAnswers;
};

}  // namespace Kdd::Dimse
