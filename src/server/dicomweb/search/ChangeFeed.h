#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/search/ThreadSearch.h"

namespace Kdd::DicomWeb
{

/// `changefeed?after=N&limit=M`: what happened to studies, in order, for whoever keeps something in line with the
/// archive. He asks after the position that he saw last, and misses nothing.
class ChangeFeed : public Resource
{
public:
    /// The database must outlive the object.
    explicit ChangeFeed(const ThreadSearch& database)
        : mDatabase(database)
    {
    }

    bool owns(const ResourcePath& path) const override;

    /// 200 with {"changes": [...], "last": N}, 400 for parameters that are none, 503 without database.
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

private:
    const ThreadSearch& mDatabase;
};

}  // namespace Kdd::DicomWeb
