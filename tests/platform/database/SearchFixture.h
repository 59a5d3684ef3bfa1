#pragma once

#include "DatabaseFixture.h"
#include "platform/database/SearchText.h"
#include "platform/database/StudySearch.h"

namespace Kxg
{

inline StudySearchRecord aStudy(const char* name, const char* date, const char* id,
                                std::vector<const char*> modalities)
{
    StudySearchRecord study;
    study.patientName = name;
    study.date = date;
    study.time = "100000.000000";
    study.patientID = id;
    study.attributes = "00100020{\"vr\":\"LO\"}\n";
    int number = 0;
    for (const char* modality : modalities) {
        SeriesSearchRecord series;
        series.uid = QByteArray(id) + '.' + QByteArray::number(++number);
        series.modality = modality;
        series.number = QByteArray::number(number);
        series.instances = 10;
        study.series.push_back(series);
    }
    return study;
}

inline SearchTerm oneOf(SearchColumn column, QVector<QByteArray> values)
{
    return {column, std::move(values), {}, {}, {}, {}, {}};
}

inline SearchTerm like(SearchColumn column, const char* name)
{
    const auto patternsOf = column == SearchColumn::PatientName ? namePatterns : textPatterns;
    return {column, {}, patternsOf(QString::fromUtf8(name)).patterns, {}, {}, {}, {}};
}

/// Studies as builds leave them, and what is found of them.
class SearchTest : public DatabaseTest
{
protected:
    void build(const char* uid, const StudySearchRecord& study, const char* digest = "d")
    {
        add({dicom(QByteArray("/d/") + uid, uid, QByteArray(uid) + ".1", uid)});
        finish(uid, study, digest);
    }

    void finish(const char* uid, const StudySearchRecord& study, const char* digest)
    {
        std::unique_ptr<StudyClaim> claim;
        ASSERT_EQ(catalogue().claim(uid, 0, claim, Catalogue::IfAbsent::Fail).text().toStdString(), "");
        BuiltStudy built;
        built.tagFile = {5, digest};
        built.tagFile.modified = 7;
        built.search = study;
        ASSERT_EQ(claim->finish(built).text().toStdString(), "");
    }

    StudySearch& search()
    {
        Kdd::Result result;
        if (!mSearch)
            mSearch = StudySearch::open(address(), result);
        EXPECT_EQ(result.text().toStdString(), "");
        return *mSearch;
    }

    /// The UIDs that are found, in order.
    std::string find(std::vector<SearchTerm> terms, std::vector<SearchOrder> order = {}, int limit = 100,
                     int offset = 0)
    {
        SearchQuery query;
        query.terms = std::move(terms);
        query.order = std::move(order);
        query.limit = limit;
        query.offset = offset;
        std::vector<FoundStudy> found;
        EXPECT_EQ(search().studies(query, found).text().toStdString(), "");
        int count = 0;
        EXPECT_EQ(search().countStudies(query, 1000, count).text().toStdString(), "");
        if (offset == 0 && limit == 100) {
            EXPECT_EQ(count, static_cast<int>(found.size()));
        }
        QByteArray uids;
        for (const FoundStudy& study : found)
            uids += (uids.isEmpty() ? "" : " ") + study.uid;
        return uids.toStdString();
    }

    std::string changes(qint64 after = 0)
    {
        std::vector<StudyChangeNote> noted;
        qint64 last = 0;
        EXPECT_EQ(search().changes(after, 100, noted, last).text().toStdString(), "");
        QByteArray text;
        for (const StudyChangeNote& each : noted)
            text += QByteArray::number(each.position) + "ACMD"[static_cast<int>(each.kind) - 1] +
                    each.studyInstanceUID + ' ';
        return text.toStdString();
    }

private:
    std::unique_ptr<StudySearch> mSearch;
};

}  // namespace Kxg
