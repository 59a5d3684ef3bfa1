#include "SearchFixture.h"

using namespace Kxg;

namespace
{

using StudySearchTest = SearchTest;

INSTANTIATE_TEST_SUITE_P(Engines, StudySearchTest, kBothEngines, engineName);

TEST_P(StudySearchTest, NothingInAValueIsPartOfAStatement)
{
    const char* const kOdd = "'; \\' ? %s :1 $1 \"x\" {}";
    build("1", aStudy("A", "20240101", kOdd, {"CT"}));
    build("2", aStudy("B", "20240101", "P2", {"CT"}));
    EXPECT_EQ(find({oneOf(SearchColumn::PatientID, {kOdd})}), "1");
    EXPECT_EQ(find({oneOf(SearchColumn::PatientID, {"?", "P2"}), like(SearchColumn::PatientName, "b")}), "2");
    EXPECT_EQ(find({like(SearchColumn::PatientID, "*\\' *")}), "1");
}

/// Of letters that no compression makes short.
TEST_P(StudySearchTest, ValuesBeyondAllBoundsKeepNoStudyOut)
{
    QByteArray text;
    for (quint32 i = 1; text.size() < 8000; i = i * 1664525 + 1013904223)
        text += QByteArray::number(i, 36);
    StudySearchRecord study = aStudy(("Doe^" + text).constData(), "20240101", text.constData(), {"CT", "CT"});
    study.accessionNumber = study.studyID = text;
    study.series[0].uid = "1.1";
    study.series[1].uid = "1.2";
    study.series[0].requests = {{text, text}};
    study.series[1].modality = text;
    build("1", study);
    EXPECT_EQ(find({like(SearchColumn::PatientName, "doe")}), "1");
    EXPECT_EQ(find({like(SearchColumn::PatientID, text.right(9).prepend('*').constData())}), "1");
    EXPECT_EQ(find({}, {{SearchColumn::PatientName, false}}), "1");
}

TEST_P(StudySearchTest, TellsHowTheEngineGoesAboutASearch)
{
    build("1", aStudy("M\'üller?^Eva", "20240101", "P1", {"CT"}));
    SearchQuery query;
    query.terms = {like(SearchColumn::PatientName, "*M\'üller*")};
    QByteArray plan;
    EXPECT_EQ(search().explainStudies(query, plan).text().toStdString(), "");
    EXPECT_TRUE(plan.contains(GetParam() == Engine::Sqlite ? "study_parts" : "study_search"))
        << plan.toStdString();
}

TEST_P(StudySearchTest, FindsNothingBeyondItsLimits)
{
    const QByteArray north = R"(00080080{"Value":["North"],"vr":"LO"})";
    const QByteArray south = R"(00080080{"Value":["South"],"vr":"LO"})";
    const QByteArray lines[][2] = {{north, north}, {north, ""}, {north, south}, {"", ""}, {south, south}};
    for (int i = 0; i < 5; ++i) {
        const QByteArray uid = QByteArray::number(i);
        StudySearchRecord study = aStudy("A", "20240101", ("P" + uid).constData(), {"CT", "SR"});
        study.attributes = i == 3 ? QByteArray(R"(00100020{"Value":["P\n00080080"],"vr":"LO"})") + '\n' : "";
        for (std::size_t s = 0; s < 2; ++s)
            study.series[s].attributes = lines[i][s].isEmpty() ? QByteArray() : lines[i][s] + '\n';
        build(uid.constData(), study);
    }
    using Of = StudyLimit::Of;
    const std::tuple<std::vector<StudyLimit>, const char*> kLimits[] = {
        {{{Of::Series, "00080080", {north}}}, "0 1"},
        {{{Of::Series, "00080080", {"00080080{\"Value\":[\"x\"],\"vr\":\"LO\"}", north, south}}}, "0 1 2 4"},
        {{{Of::Study, "00100020", {R"(00100020{"Value":["P\n00080080"],"vr":"LO"})"}}}, "3"},
        {{{Of::Uid, "0020000D", {"1", "4", "7"}}}, "1 4"},
        {{{Of::Uid, "0020000D", {"1", "4"}}, {Of::Series, "00080080", {north}}}, "1"},
        {{{Of::Uid, "0020000D", {}}}, ""},
        {{{Of::Series, "00080080", {"%"}}}, ""},
    };
    for (const auto& [all, studies] : kLimits) {
        search().limitTo(std::make_shared<StudyLimits>(StudyLimits{all}));
        const std::string expected = studies;
        EXPECT_EQ(find({}), expected);
        EXPECT_EQ(find({oneOf(SearchColumn::ModalitiesInStudy, {"CT"})}), expected);
        EXPECT_EQ(find({oneOf(SearchColumn::Modality, {"SR"})}), expected);
        std::vector<FoundPatient> patients;
        std::vector<FoundSeries> series;
        EXPECT_TRUE(search().patients({}, patients).good() && search().series({}, series).good());
        EXPECT_EQ(patients.size(), (expected.size() + 1) / 2);
        EXPECT_EQ(series.size(), 2 * patients.size());
        std::string seen;
        for (const char uid : expected)
            seen += uid == ' ' ? "" : std::to_string(uid - '0' + 1) + 'A' + uid + ' ';
        EXPECT_EQ(changes(), seen);
    }
    search().limitTo(nullptr);
    EXPECT_EQ(find({}), "0 1 2 3 4");
}

TEST_P(StudySearchTest, MarksLeaveOutNothingThatIsWithinLimits)
{
    StudyLimit limit{StudyLimit::Of::Series, "00080080", {}};
    StudySearchRecord few = aStudy("A", "20240101", "P1", {"CT"});
    StudySearchRecord many = aStudy("A", "20240101", "P2", std::vector<const char*>(50, "CT"));
    for (std::size_t i = 0; i < many.series.size(); ++i) {
        limit.values << "00080080{\"Value\":[\"" + QByteArray::number(static_cast<int>(i)) +
                            "\"],\"vr\":\"LO\"}";
        many.series[i].attributes = limit.values.last() + '\n';
    }
    few.series[0].attributes = limit.values.last() + '\n';
    build("1", few);
    build("2", many);
    search().limitTo(std::make_shared<StudyLimits>(StudyLimits{{limit}}));
    const auto found = [&](const char* change, const char* expected) {
        for (const char* table : {"study_search", "study_modality"})
            execute((QByteArray("UPDATE ") + table + " SET marks = " + change).constData());
        EXPECT_EQ(find({}), expected) << change;
        EXPECT_EQ(find({oneOf(SearchColumn::ModalitiesInStudy, {"CT"})}), expected) << change;
    };
    found("marks", "1 2");
    found("'*'", "1 2");  // as of an earlier release
    ASSERT_TRUE(search().prepare().good());
    found("marks", "1 2");
    found("'other' WHERE marks = '*'", "1");  // the one with many has none
    found("'other'", "");
}

TEST_P(StudySearchTest, PagesFollowEachOtherInEveryOrder)
{
    for (int i = 0; i < 9; ++i)
        build(QByteArray::number(i).constData(), aStudy(i % 2 ? "Same^Name" : "", i % 3 ? "20240101" : "",
                                                        QByteArray::number(i % 4).constData(), {"CT"}));
    const std::vector<SearchOrder> orders[] = {
        {},
        {{SearchColumn::PatientName, false}},
        {{SearchColumn::PatientName, true}},
        {{SearchColumn::PatientID, false}, {SearchColumn::StudyDate, false}}};
    for (const auto& order : orders) {
        const std::string all = find({}, order);
        EXPECT_EQ(all.size(), 17u);
        EXPECT_EQ(find({}, order, 4, 0) + ' ' + find({}, order, 4, 4) + ' ' + find({}, order, 4, 8), all);
    }
}

TEST_P(StudySearchTest, WhatIsBehindAPageIsCountedAlong)
{
    for (const char* uid : {"1", "2", "3", "4", "5"})
        build(uid, aStudy("A", "20240101", uid, {"CT"}));
    const std::tuple<int, int, int, std::size_t, int> kPages[] = {
        {0, 2, 9, 2, 3}, {1, 2, 1, 2, 1}, {3, 2, 9, 2, 0}, {0, 0, 9, 0, 5}};
    for (const auto& [offset, limit, counted, found, behind] : kPages) {
        const SearchQuery query = {{}, {}, offset, limit, counted};
        std::vector<FoundStudy> studies;
        std::vector<FoundSeries> series;
        int left[] = {-1, -1};
        ASSERT_TRUE(search().studies(query, studies, &left[0]).good());
        ASSERT_TRUE(search().series(query, series, &left[1]).good());
        EXPECT_EQ(std::tuple(studies.size(), series.size(), left[0], left[1]),
                  std::tuple(found, found, behind, behind))
            << offset;
    }
}

TEST_P(StudySearchTest, WhatIsRegisteredOnlyIsFound)
{
    DicomFileRecord file = dicom("/d/a", "1.2", "1.2.1", "x");
    file.patientName = "Doe^John";
    file.modality = "US";
    file.studyTime = "1030";
    add({file});
    EXPECT_EQ(find({like(SearchColumn::PatientName, "doe")}), "1.2");
    EXPECT_EQ(find({oneOf(SearchColumn::SOPInstanceUID, {"x"})}), "1.2");
    // A correction may bring the images elsewhere before anything is built.
    correct({{"1.2", "x", "2", "2.1", "x", "changes"}});
    EXPECT_EQ(find({}), "2");
    ASSERT_TRUE(catalogue().removeStudy("2").good());
    EXPECT_EQ(find({}), "");
}

TEST_P(StudySearchTest, RegisteringMoreLeavesWhatIsBuiltAsItIsShown)
{
    build("1", aStudy("Shown", "20240101", "P1", {"CT"}));
    add({dicom("/d/more", "1", "1.9", "y")});
    EXPECT_EQ(find({like(SearchColumn::PatientName, "shown")}), "1");
}

TEST_P(StudySearchTest, OnlyOneRefreshesWhatSeveralFoundOld)
{
    build("1", aStudy("Old", "20240101", "P1", {"CT"}));
    std::vector<FoundStudy> found;
    ASSERT_TRUE(search().studies({}, found).good());
    BuiltStudy present;
    present.tagFile = {9, "new"};
    present.tagFile.modified = 9;
    present.search = aStudy("New", "20240101", "P1", {"CT"});
    bool isDone = false;
    ASSERT_TRUE(search().refresh(found.at(0), present, isDone).good());
    EXPECT_TRUE(isDone);
    present.search = aStudy("Late", "20240101", "P1", {"CT"});
    ASSERT_TRUE(search().refresh(found.at(0), present, isDone).good());
    EXPECT_FALSE(isDone);
    EXPECT_EQ(find({like(SearchColumn::PatientName, "new")}), "1");
    EXPECT_EQ(find({like(SearchColumn::PatientName, "old")}), "");
    EXPECT_EQ(changes(1), "2C1 ");
}

TEST_P(StudySearchTest, PatientsAreListedOnce)
{
    build("1", aStudy("Doe^John", "20240101", "P1", {"CT"}));
    build("2", aStudy("Doe^John", "20240201", "P1", {"CT"}));
    build("3", aStudy("Doe^John", "20240201", "P2", {"MR"}));
    std::vector<FoundPatient> found;
    ASSERT_EQ(search().patients({}, found).text().toStdString(), "");
    ASSERT_EQ(found.size(), 2u);
    EXPECT_EQ(found[0].studies, 2);
}

}  // namespace
