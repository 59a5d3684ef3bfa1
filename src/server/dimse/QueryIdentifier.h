#pragma once

#include "server/dicomweb/search/SearchRequest.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

#include <vector>

class DcmItem;

namespace Kdd::Dimse
{

/// What queries and retrievals begin at.
enum class QueryRoot { Patient, Study };

enum class QueryLevel { Patient, Study, Series, Image };

/// An attribute that an answer shows.
struct QueryKey
{
    DcmTagKey key;
    std::vector<QueryKey> items;  ///< what of the items of a sequence; none: all of them
};

/// A question as an application entity asks it by C-FIND: what is looked for, and what is shown of it.
///
/// Questions need not name the levels above theirs by unique keys, whether that was negotiated or not: what they say of
/// any level holds. A range of dates and one of times are two conditions, as they are where nothing else was negotiated.
struct QueryIdentifier
{
    QueryLevel level = QueryLevel::Study;
    std::vector<QueryKey> keys;
    DicomWeb::SearchRequest search;

    /// False, with one line for the caller, when it cannot be understood; `identifier` may be half read then.
    static bool read(DcmItem& dataset, QueryRoot root, QueryIdentifier& identifier, QString& reason);

    /// Whether answers on this level can show the attribute, where an object has it.
    bool shows(const DcmTagKey& key) const;
};

/// The level that an identifier names; false, with the reason, when it names none that the root has.
bool readLevel(DcmItem& dataset, QueryRoot root, QueryLevel& level, QString& reason);

/// The value of an attribute of an identifier, decoded; empty when it is not there.
QString identifierValue(DcmItem& dataset, const DcmTagKey& key);

}  // namespace Kdd::Dimse
