#pragma once

#include "server/dicomweb/search/Matching.h"

namespace Kdd::DicomWeb
{

/// How a search is answered: what the database finds by index, and what is looked at once more.
struct SearchPlan
{
    Kxg::SearchQuery query;

    /// What the query does not decide, by where it is looked up. The request must outlive it.
    Conditions onStudy;
    Conditions onSeries;
    Conditions onImages;

    /// Something that is indexed narrows the search.
    bool isNarrowed = false;

    bool isExact() const { return onStudy.empty() && onSeries.empty() && onImages.empty(); }

    /// False, with one line for the client, when a value cannot be understood.
    static bool make(const SearchRequest& request, SearchPlan& plan, QString& reason);
};

}  // namespace Kdd::DicomWeb
