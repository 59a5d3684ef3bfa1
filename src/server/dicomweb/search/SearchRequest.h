#pragma once

#include "server/dicomweb/ResourcePath.h"
#include "server/http/Request.h"

#include <QByteArray>
#include <QSet>
#include <QString>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>
#include <dcmtk/dcmdata/dcvr.h>
#include <kddlib/StudySearch.h>

#include <optional>
#include <vector>

namespace Kdd::DicomWeb
{

enum class SearchLevel { Patients, Studies, Series, Instances };

/// One attribute that is asked for by its value.
struct SearchCondition
{
    QVector<DcmTagKey> path;  ///< the attribute, or sequences and the attribute in their items
    DcmEVR vr = EVR_UNKNOWN;  ///< that the dictionary has
    QString value;            ///< as it was sent; never empty
    bool isEmpty = false;     ///< what has no value is asked for
    QVector<QString>
        list;  ///< the values of a list, any of which is wanted; of one that is none the value itself

    const DcmTagKey& key() const { return path.last(); }
    bool isInItems() const { return path.size() > 1; }
};

/// How a protocol writes values of which any is wanted, and none at all.
struct ValueForm
{
    bool hasLists = false;    ///< "\\" separates values of every attribute, not of UIDs and modalities alone
    bool findsEmpty = false;  ///< two quotes ask for what has no value
};

/// A search as it was asked for, with everything understood and bounded.
///
/// An attribute is named by its keyword or its eight hexadecimal digits, one in the items of sequences by these joined by
/// points. A value that is empty asks for nothing. Lists of UIDs are separated by "," or "\", with
/// `multiplevaluematching` all lists by "\"; modalities are a list always, for viewers send them so.
struct SearchRequest
{
    SearchLevel level = SearchLevel::Studies;
    QByteArray study;   ///< of the path; else empty
    QByteArray series;  ///< likewise

    std::vector<SearchCondition> conditions;
    QVector<DcmTagKey> fields;  ///< shown besides what always is
    bool showsAll = false;
    bool isFuzzy = false;
    int limit = 0;
    int offset = 0;
    std::vector<Kxg::SearchOrder> order;  ///< empty: newest first

    /// Dates and times are meant in this zone [minutes east of UTC]; else as they are written.
    std::optional<int> zone;

    /// A range of dates and one of the times that belong to them ask for one range of moments; else each for itself.
    bool joinsMoments = true;

    /// Whether the path is that of a search; then also the level and the UIDs of it.
    static bool takePath(const ResourcePath& path, SearchRequest& request);

    /// Takes the parameters. False, with one line for the client, when one cannot be understood: a name that is
    /// misspelt must not find everything.
    static bool parse(const QVector<Http::Field>& query, SearchRequest& request, QString& reason);

    /// Takes a condition of which path, VR and value are set; what asks for nothing is passed over. False, with one line
    /// for the client, when it cannot be understood or is one too many.
    bool require(SearchCondition condition, const ValueForm& form, QString& reason);
};

/// The attribute that a client names; false when there is none of that name.
bool resolveAttribute(const QByteArray& name, DcmTagKey& key, DcmEVR& vr);

/// Of "+0100" and the like, in minutes; nothing when it is no offset from UTC.
std::optional<int> zoneMinutes(const QByteArray& offset);

}  // namespace Kdd::DicomWeb
