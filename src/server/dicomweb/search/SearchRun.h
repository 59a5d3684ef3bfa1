#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/FoundAnswers.h"
#include "server/dicomweb/search/SearchPlan.h"

#include <QSet>

namespace Kdd::DicomWeb
{

/// Does one search over one connection.
class SearchRun
{
public:
    /// All of them must outlive the object.
    SearchRun(const SearchRequest& request, const SearchPlan& plan, Kxg::StudySearch& search,
              StudyShelf& shelf)
        : mRequest(request)
        , mPlan(plan)
        , mSearch(search)
        , mShelf(shelf)
    {
    }

    /// Puts what is found on the page that is asked for into `answers`. A failure is the database's.
    Result run(FoundAnswers& answers);

    /// Nothing was looked for, because too much would have to be looked at: why, for the client.
    const QString& tooBroad() const { return mTooBroad; }

    /// Others held a tag file all the time: what was found is not all.
    bool isHeldUp() const { return mIsHeldUp; }

    /// How many tag files would have had to be looked at and cannot be read.
    int unread() const { return mUnread.size(); }

    /// How many more the search would find behind the page; counted up to a bound.
    int remaining() const { return mRemaining; }
    bool isRemainingCut() const { return mIsRemainingCut; }

private:
    template <typename Found, typename Find, typename Count, typename Holds>
    Result runListed(FoundAnswers& answers, const Find& find, const Count& count, const Holds& holds);
    Result runStudies(FoundAnswers& answers);
    Result runSeries(FoundAnswers& answers);
    Result runPatients(FoundAnswers& answers);
    Result lookThroughPatients(FoundAnswers& answers);
    Result runImages(FoundAnswers& answers);

    Result findStudies(const Kxg::SearchQuery& query, std::vector<Kxg::FoundStudy>& found, int* behind);
    Result findSeries(const Kxg::SearchQuery& query, std::vector<Kxg::FoundSeries>& found,
                      int* behind = nullptr);

    bool holds(const Kxg::FoundStudy& study) const;
    bool holds(const Kxg::FoundSeries& series) const;
    bool holdsImage(const QByteArray& studyUID, const QByteArray& seriesUID);
    std::shared_ptr<const ServedStudy> obtain(const QByteArray& studyUID);
    void noteRemaining(int remaining, int most);

    int addImages(const Kxg::FoundSeries& series, int skipped, int wanted, FoundAnswers& answers);
    bool takeImages(const std::vector<Kxg::FoundSeries>& page, int& skipped, FoundAnswers& answers);

    const SearchRequest& mRequest;
    const SearchPlan& mPlan;
    Kxg::StudySearch& mSearch;
    StudyShelf& mShelf;
    QString mTooBroad;
    bool mIsHeldUp = false;
    QSet<QByteArray> mUnread;  // studies
    int mRemaining = 0;
    bool mIsRemainingCut = false;
};

}  // namespace Kdd::DicomWeb
