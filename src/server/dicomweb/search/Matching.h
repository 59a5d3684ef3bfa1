#pragma once

#include "server/dicomweb/search/AttributeSource.h"
#include "server/dicomweb/search/SearchRequest.h"

namespace Kdd::DicomWeb
{

using Conditions = std::vector<const SearchCondition*>;

/// Whether all hold, as the request says that dates and times are meant: together or each for itself, and in its zone
/// if it names one.
bool holdAll(const Conditions& conditions, const AttributeSource& source, const SearchRequest& request);

/// Whether the condition lets everything pass, as "*" does.
bool isUniversal(const SearchCondition& condition);

bool hasWildcard(const QString& text);

/// Whether texts of this VR are compared by wildcards.
bool takesWildcards(DcmEVR vr);

/// A range of dates, times or moments, either end of which may be open.
struct ValueRange
{
    QByteArray from;
    QByteArray to;
    bool isRange = false;  ///< else one value, whose precision makes the ends
};

/// Of a DA or TM value in the form of Kxg::searchDate and Kxg::searchTime. False when it is none.
bool parseRange(DcmEVR vr, const QString& text, ValueRange& range);

/// The attribute of the time that belongs to a date; false when there is none.
bool timeOfDate(const DcmTagKey& date, DcmTagKey& time);

}  // namespace Kdd::DicomWeb
