#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/database/Catalogue.h"
#include "platform/database/StudyLimits.h"

#include <QByteArray>
#include <QVector>

#include <memory>
#include <vector>

namespace Kxg
{

/// What a search may ask of, by index.
enum class SearchColumn {
    StudyUID,
    StudyDate,
    StudyTime,
    AccessionNumber,
    ModalitiesInStudy,
    ReferringPhysician,
    PatientName,
    PatientID,
    PatientBirthDate,
    PatientSex,
    StudyID,
    StudyDescription,
    SeriesUID,  ///< this and what follows of a series
    Modality,
    SeriesNumber,
    SeriesDescription,
    PerformedDate,
    PerformedTime,
    ScheduledStep,
    RequestedProcedure,
    SOPInstanceUID,  ///< of an image that the series has
};

/// One condition. What is set of it holds together.
struct SearchTerm
{
    SearchColumn column = SearchColumn::StudyUID;
    QVector<QByteArray> values;    ///< one of these
    QVector<QByteArray> patterns;  ///< all of these (SearchText.h)
    QByteArray from;               ///< a date or time, with what follows; empty: open
    QByteArray to;
    QByteArray fromTime;  ///< of a StudyDate: together with `from` and `to` a moment
    QByteArray toTime;
};

struct SearchOrder
{
    SearchColumn column = SearchColumn::StudyDate;
    bool isDescending = true;
};

struct SearchQuery
{
    std::vector<SearchTerm> terms;   ///< all hold; those of a series for one and the same
    std::vector<SearchOrder> order;  ///< none: newest first
    int offset = 0;
    int limit = 100;
    int counted =
        0;  ///< so many behind the page are counted along, which is cheaper than to ask for their number
};

struct FoundStudy
{
    int id = 0;
    QByteArray uid;
    bool isBuilt = false;   ///< else it is what registration knows of it
    TagFileStamp tagFile;   ///< that it was taken from, without the size of what counts
    QByteArray modalities;  ///< separated by "\"
    int series = 0;
    int instances = 0;
    QByteArray attributes;  ///< as in StudySearchRecord
};

struct FoundSeries
{
    FoundStudy study;
    QByteArray uid;
    int instances = 0;
    QByteArray attributes;
};

struct FoundPatient
{
    int studies = 0;        ///< of those that were looked for
    QByteArray attributes;  ///< of the newest of them
};

enum class ChangeKind { Arrived = 1, Corrected = 2, Moved = 3, Deleted = 4 };

/// Something that happened to a study and can be seen by now.
struct StudyChangeNote
{
    ChangeKind kind = ChangeKind::Arrived;
    QByteArray studyInstanceUID;
    QByteArray movedFrom;  ///< of a move: where the images stood; it is told of both studies
    QByteArray movedTo;
    int instances = 0;    ///< that the study has now
    qint64 position = 0;  ///< 1 and up, without gaps
    qint64 at = 0;        ///< [ms] since the epoch
};

/// Searches over the studies that an image database knows. One object is one connection and belongs to the thread that
/// opened it. Every failure tells why: the database and what it said.
class KDD_EXPORT StudySearch
{
public:
    /// One that does not exist is a failure.
    static std::unique_ptr<StudySearch> open(const QByteArray& address, Kdd::Result& result);

    ~StudySearch();
    StudySearch(const StudySearch&) = delete;
    StudySearch& operator=(const StudySearch&) = delete;

    /// From here on whatever is asked finds studies within these limits alone; null: all.
    void limitTo(std::shared_ptr<const StudyLimits> limits);

    /// `behind`, where it is not null, is set to how many of the studies behind the page were counted.
    Kdd::Result studies(const SearchQuery& query, std::vector<FoundStudy>& found, int* behind = nullptr);

    /// The same of series, in the order of their studies, then by number and UID.
    Kdd::Result series(const SearchQuery& query, std::vector<FoundSeries>& found, int* behind = nullptr);

    /// By name and identifier; only studies decide what is found.
    Kdd::Result patients(const SearchQuery& query, std::vector<FoundPatient>& found);

    /// How many studies, or series, the query would give without offset and limit; counted up to `most`.
    Kdd::Result countStudies(const SearchQuery& query, int most, int& count);
    Kdd::Result countSeries(const SearchQuery& query, int most, int& count);

    /// At most `limit` changes after a position, in order. `last` is the position up to which was looked: whoever goes on
    /// from there misses none. Of a move the study that is beyond the limits is not named.
    Kdd::Result changes(qint64 position, int limit, std::vector<StudyChangeNote>& changes, qint64& last);

    /// By what the tag file of the study is known, but for the former ones.
    Kdd::Result tagFileProofs(const QByteArray& studyUID, TagFileProofs& proofs);

    /// Takes over what the study's tag file shows now, unless somebody else did so since `former` was read. `isDone` tells
    /// whether the rows were changed.
    Kdd::Result refresh(const FoundStudy& former, const BuiltStudy& present, bool& isDone);

    /// At most `limit` UIDs after `after` of studies that have a tag file which searches know nothing of, in order.
    Kdd::Result unknownStudies(const QByteArray& after, int limit, QVector<QByteArray>& studyUIDs);

    /// Gives studies without rows those of what registration knows, and the database the index that was not to be had when
    /// it was made.
    Kdd::Result prepare();

    /// How the engine goes about the search for studies, for whoever wants to know why it takes long.
    Kdd::Result explainStudies(const SearchQuery& query, QByteArray& plan);

private:
    struct KDD_LOCAL Private;
    explicit StudySearch(std::unique_ptr<Private> made);
    std::unique_ptr<Private> d;
};

}  // namespace Kxg
