#pragma once

#include "server/dicomweb/search/AnswerObject.h"
#include "server/dicomweb/search/SearchRequest.h"

namespace Kdd
{
class TagMap;
}

namespace Kdd::DicomWeb
{

/// Makes the objects of an answer: of each level what is always shown, what matched, and the fields asked for.
class FoundAnswers
{
public:
    /// `root` is the address of the service, as the client has it. Both must outlive the object.
    FoundAnswers(const SearchRequest& request, const QByteArray& root);

    void add(const Kxg::FoundPatient& patient);
    void add(const Kxg::FoundStudy& study);
    void add(const Kxg::FoundSeries& series);
    void add(const Kxg::FoundSeries& series, const TagMap& image);

    int count() const { return static_cast<int>(mEnds.size()); }

    /// A JSON array.
    QByteArray json() const { return '[' + mJson + ']'; }

    /// One object of it, by its number from 0 on.
    QByteArray object(int index) const;

private:
    void begin(AnswerObject& object, const QByteArray& address) const;
    void addStudy(AnswerObject& object, const Kxg::FoundStudy& study) const;
    void addSeries(AnswerObject& object, const Kxg::FoundSeries& series) const;
    void finish(AnswerObject& object);
    QByteArray addressOf(const Kxg::FoundStudy& study) const;

    const SearchRequest& mRequest;
    const QByteArray& mRoot;
    // Sorted: what is asked for besides, and what is shown of each level.
    std::vector<AttributeNumber> mFields;
    std::vector<AttributeNumber> mOfStudy;
    std::vector<AttributeNumber> mOfSeries;
    std::vector<AttributeNumber> mOfPatient;
    std::vector<DcmTagKey> mImageKeys;
    QByteArray mJson;
    std::vector<int> mEnds;  // of the objects in the text
};

}  // namespace Kdd::DicomWeb
