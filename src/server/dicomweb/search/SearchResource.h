#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"

namespace Kdd::DicomWeb
{

/// Searches for patients, studies, series and instances.
///
/// Studies and series are answered from the database alone. A row whose tag file has changed is refreshed before it
/// answers. Instances, and attributes that the database does not have, are looked up in tag files.
class SearchResource : public Resource
{
public:
    /// Both must outlive the object.
    SearchResource(const ThreadSearch& database, StudyShelf& shelf)
        : mDatabase(database)
        , mShelf(shelf)
    {
    }

    bool owns(const ResourcePath& path) const override;

    /// 200 with a list, which may be empty; 400 for what cannot be understood, 413 for what would look at too much, 503
    /// without database.
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

private:
    const ThreadSearch& mDatabase;
    StudyShelf& mShelf;
};

}  // namespace Kdd::DicomWeb
