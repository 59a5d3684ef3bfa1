#include "server/dicomweb/search/SearchPlan.h"

#include <QDate>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/SearchText.h>
#include <kddlib/StudyIndexing.h>

#include <algorithm>
#include <cmath>
#include <limits>

namespace Kdd::DicomWeb
{
namespace
{

using Kxg::SearchColumn;

enum class Kind { Uid, Code, Identifier, Text, Name, Date, Time, Number };

struct IndexedAttribute
{
    DcmTagKey key;
    SearchColumn column;
    Kind kind;
};

const IndexedAttribute kIndexed[] = {
    {DCM_StudyInstanceUID, SearchColumn::StudyUID, Kind::Uid},
    {DCM_StudyDate, SearchColumn::StudyDate, Kind::Date},
    {DCM_StudyTime, SearchColumn::StudyTime, Kind::Time},
    {DCM_AccessionNumber, SearchColumn::AccessionNumber, Kind::Identifier},
    {DCM_ModalitiesInStudy, SearchColumn::ModalitiesInStudy, Kind::Code},
    {DCM_ReferringPhysicianName, SearchColumn::ReferringPhysician, Kind::Name},
    {DCM_PatientName, SearchColumn::PatientName, Kind::Name},
    {DCM_PatientID, SearchColumn::PatientID, Kind::Identifier},
    {DCM_PatientBirthDate, SearchColumn::PatientBirthDate, Kind::Date},
    {DCM_PatientSex, SearchColumn::PatientSex, Kind::Code},
    {DCM_StudyID, SearchColumn::StudyID, Kind::Identifier},
    {DCM_StudyDescription, SearchColumn::StudyDescription, Kind::Text},
    {DCM_SeriesInstanceUID, SearchColumn::SeriesUID, Kind::Uid},
    {DCM_Modality, SearchColumn::Modality, Kind::Code},
    {DCM_SeriesNumber, SearchColumn::SeriesNumber, Kind::Number},
    {DCM_SeriesDescription, SearchColumn::SeriesDescription, Kind::Text},
    {DCM_PerformedProcedureStepStartDate, SearchColumn::PerformedDate, Kind::Date},
    {DCM_PerformedProcedureStepStartTime, SearchColumn::PerformedTime, Kind::Time},
    {DCM_SOPInstanceUID, SearchColumn::SOPInstanceUID, Kind::Uid},
};

const IndexedAttribute kIndexedRequests[] = {
    {DCM_ScheduledProcedureStepID, SearchColumn::ScheduledStep, Kind::Identifier},
    {DCM_RequestedProcedureID, SearchColumn::RequestedProcedure, Kind::Identifier},
};

const IndexedAttribute* findIndexed(const SearchCondition& condition)
{
    const auto find = [&](const auto& table) -> const IndexedAttribute* {
        const auto* found =
            std::find_if(std::begin(table), std::end(table),
                         [&](const IndexedAttribute& each) { return each.key == condition.key(); });
        return found == std::end(table) ? nullptr : found;
    };
    if (!condition.isInItems())
        return find(kIndexed);
    const bool isRequest =
        condition.path.size() == 2 && condition.path.front() == DCM_RequestAttributesSequence;
    return isRequest ? find(kIndexedRequests) : nullptr;
}

class Planner
{
public:
    Planner(const SearchRequest& request, SearchPlan& plan, QString& reason)
        : mRequest(request)
        , mPlan(plan)
        , mReason(reason)
    {
    }

    bool run()
    {
        mPlan.query.order = mRequest.order;
        restrict(SearchColumn::StudyUID, mRequest.study);
        restrict(SearchColumn::SeriesUID, mRequest.series);
        return std::all_of(mRequest.conditions.begin(), mRequest.conditions.end(),
                           [this](const SearchCondition& each) { return isUniversal(each) || take(each); });
    }

private:
    void restrict(SearchColumn column, const QByteArray& uid)
    {
        if (uid.isEmpty())
            return;
        Kxg::SearchTerm term;
        term.column = column;
        term.values.append(uid);
        add(term);
    }

    void add(const Kxg::SearchTerm& term)
    {
        mPlan.isNarrowed = true;
        mPlan.query.terms.push_back(term);
    }

    /// To be looked at where its value is known.
    void keep(const SearchCondition& condition)
    {
        const DcmTagKey& key = condition.path.front();
        if (StudyIndexing::isStudyAttribute(key) && !isOfSeries(key))
            mPlan.onStudy.push_back(&condition);
        else if (mRequest.level != SearchLevel::Studies && StudyIndexing::isSeriesAttribute(key))
            mPlan.onSeries.push_back(&condition);
        else
            mPlan.onImages.push_back(&condition);
    }

    static bool isOfSeries(const DcmTagKey& key) { return key == DCM_SpecificCharacterSet; }

    bool take(const SearchCondition& condition)
    {
        if (!check(condition))
            return false;
        const IndexedAttribute* indexed = findIndexed(condition);
        if (indexed == nullptr || condition.isEmpty) {
            keep(condition);
            return true;
        }
        Kxg::SearchTerm term;
        term.column = indexed->column;
        const bool isExact = express(condition, *indexed, term);
        if (!isExact)
            keep(condition);
        if (!term.values.isEmpty() || !term.patterns.isEmpty() || !term.from.isEmpty() || !term.to.isEmpty())
            add(term);
        return true;
    }

    bool check(const SearchCondition& condition)
    {
        if (condition.vr != EVR_DA && condition.vr != EVR_TM)
            return true;
        for (const QString& value : condition.list) {
            ValueRange range;
            if (!condition.isEmpty && !parseRange(condition.vr, value, range)) {
                mReason = QStringLiteral("\"%1\" is no %2, and no range of them")
                              .arg(value.left(40), condition.vr == EVR_DA ? QStringLiteral("date YYYYMMDD")
                                                                          : QStringLiteral("time HHMMSS"));
                return false;
            }
        }
        return true;
    }

    /// Whether the term says all that the condition does; else it finds more.
    bool express(const SearchCondition& condition, const IndexedAttribute& indexed, Kxg::SearchTerm& term)
    {
        switch (indexed.kind) {
        case Kind::Date:
            return expressDate(condition, term);
        case Kind::Time:
            return expressTime(condition, term);
        case Kind::Name:
            return expressName(condition, term);
        case Kind::Number:
            return expressNumbers(condition, term);
        case Kind::Uid:
            setValues(condition, term);
            // Of images the database knows in which series they are.
            return mRequest.level != SearchLevel::Instances || condition.key() != DCM_SOPInstanceUID;
        default:
            break;
        }
        const bool isWild = std::any_of(condition.list.begin(), condition.list.end(), hasWildcard);
        if (!isWild && indexed.kind != Kind::Text) {
            setValues(condition, term);
            return true;
        }
        // Several patterns of which one holds are no question to the index.
        if (condition.list.size() > 1 || condition.isInItems())
            return false;
        const QString& value = condition.list.front();
        if (indexed.kind == Kind::Code) {
            QByteArray pattern = value.toUtf8();
            pattern.replace('?', '*');
            term.patterns.append(pattern);
            return !value.contains(QLatin1Char('?'));
        }
        const Kxg::SearchPatterns patterns = Kxg::textPatterns(value);
        term.patterns = patterns.patterns;
        return isWild && patterns.isExact;
    }

    static void setValues(const SearchCondition& condition, Kxg::SearchTerm& term)
    {
        for (const QString& value : condition.list)
            term.values.append(value.trimmed().toUtf8());
    }

    static bool expressNumbers(const SearchCondition& condition, Kxg::SearchTerm& term)
    {
        for (const QString& value : condition.list) {
            bool isNumber = false;
            const double number = value.trimmed().toDouble(&isNumber);
            // What is no whole number of an IS value is no series' number.
            constexpr double kGreatest = std::numeric_limits<int>::max();
            if (isNumber && std::abs(number) <= kGreatest && number == static_cast<int>(number))
                term.values.append(QByteArray::number(static_cast<int>(number)));
        }
        if (term.values.isEmpty())
            term.values.append("none");
        return true;
    }

    static bool expressName(const SearchCondition& condition, Kxg::SearchTerm& term)
    {
        if (condition.list.size() > 1)
            return false;
        const Kxg::SearchPatterns patterns = Kxg::namePatterns(condition.list.front());
        term.patterns = patterns.patterns;
        return patterns.isExact;
    }

    const SearchCondition* findOther(const DcmTagKey& key) const
    {
        const auto found = std::find_if(
            mRequest.conditions.begin(), mRequest.conditions.end(), [&](const SearchCondition& each) {
                return each.path.size() == 1 && each.key() == key && !each.isEmpty;
            });
        return found == mRequest.conditions.end() ? nullptr : &*found;
    }

    static bool isRange(const SearchCondition* condition, DcmEVR vr, ValueRange& range)
    {
        return condition != nullptr && condition->list.size() == 1 &&
               parseRange(vr, condition->list.front(), range) && range.isRange;
    }

    static bool hasZone(const DcmTagKey& key)
    {
        DcmTagKey time;
        return timeOfDate(key, time) || key == DCM_StudyTime || key == DCM_PerformedProcedureStepStartTime;
    }

    bool expressDate(const SearchCondition& condition, Kxg::SearchTerm& term)
    {
        ValueRange dates;
        ValueRange times;
        if (condition.list.size() > 1)
            return false;
        parseRange(EVR_DA, condition.list.front(), dates);
        term.from = dates.from;
        term.to = dates.to;
        if (mRequest.zone && hasZone(condition.key())) {
            // Elsewhere it may be the day before or after.
            term.from = shifted(dates.from, -1);
            term.to = shifted(dates.to, 1);
            return false;
        }
        DcmTagKey time;
        if (!mRequest.joinsMoments || !dates.isRange || !timeOfDate(condition.key(), time) ||
            !isRange(findOther(time), EVR_TM, times))
            return true;
        if (condition.key() != DCM_StudyDate)
            return false;
        if (!dates.from.isEmpty())
            term.fromTime = times.from;
        if (!dates.to.isEmpty())
            term.toTime = times.to;
        return true;
    }

    bool expressTime(const SearchCondition& condition, Kxg::SearchTerm& term)
    {
        const DcmTagKey date =
            condition.key() == DCM_StudyTime ? DCM_StudyDate : DCM_PerformedProcedureStepStartDate;
        ValueRange times;
        ValueRange dates;
        if (condition.list.size() > 1 || mRequest.zone)
            return false;
        parseRange(EVR_TM, condition.list.front(), times);
        // Together with a range of dates it is the ends of a range of moments.
        if (mRequest.joinsMoments && times.isRange && isRange(findOther(date), EVR_DA, dates))
            return condition.key() == DCM_StudyTime;
        term.from = times.from;
        term.to = times.to;
        return true;
    }

    static QByteArray shifted(const QByteArray& date, int days)
    {
        const QDate day = QDate::fromString(QString::fromLatin1(date), QStringLiteral("yyyyMMdd"));
        return day.isValid() ? day.addDays(days).toString(QStringLiteral("yyyyMMdd")).toLatin1() : date;
    }

    const SearchRequest& mRequest;
    SearchPlan& mPlan;
    QString& mReason;
};

}  // namespace

bool SearchPlan::make(const SearchRequest& request, SearchPlan& plan, QString& reason)
{
    return Planner(request, plan, reason).run();
}

}  // namespace Kdd::DicomWeb
