#include "SearchedArchive.h"

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

class SearchAnswers : public SearchedArchive
{
protected:
    static DatasetBuilder image(const char* sop, const char* study, const char* series)
    {
        return anImage(sop).inStudy(study).inSeries(series);
    }

    void storeTwoStudies() const
    {
        for (const char* sop : {"1.1.1.1", "1.1.1.2", "1.1.1.3"})
            store(sop, image(sop, "1.1", "1.1.1")
                           .with(DCM_SpecificCharacterSet, "ISO_IR 100")
                           .with(DCM_PatientName, "M\xfcller^Eva")
                           .with(DCM_PatientID, "P1")
                           .with(DCM_StudyDate, "20240101")
                           .with(DCM_StudyTime, "233000")
                           .with(DCM_TimezoneOffsetFromUTC, "+0100")
                           .with(DCM_StudyDescription, "Head CT")
                           .with(DCM_Modality, "CT")
                           .with(DCM_SeriesNumber, "2")
                           .with(DCM_BodyPartExamined, "HEAD")
                           .with(DCM_InstanceNumber, QByteArray(sop).right(1).constData())
                           .withItem(DCM_RequestAttributesSequence,
                                     anItem()
                                         .with(DCM_ScheduledProcedureStepID, "STEP1")
                                         .with(DCM_RequestedProcedureID, "RP1"))
                           .withItem(DCM_RequestAttributesSequence,
                                     anItem().with(DCM_ScheduledProcedureStepID, "STEP2")));
        store("1.1.2.1", image("1.1.2.1", "1.1", "1.1.2")
                             .with(DCM_PatientName, "Muller^Eva")
                             .with(DCM_Modality, "SR")
                             .with(DCM_SeriesNumber, "1"));
        store(
            "z.2.1.1",
            image("2.1.1", "2", "2.1").without(DCM_Modality).without(DCM_PatientName).without(DCM_StudyDate));
        add();
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, SearchAnswers, testing::Values(Engine::Sqlite, Engine::Postgres),
                         engineName);

TEST_P(SearchAnswers, HaveWhatViewersNeed)
{
    storeTwoStudies();
    const QJsonArray studies = list("studies");
    ASSERT_EQ(studies.size(), 2);
    const QJsonObject study = studies.at(0).toObject();
    for (const char* key : {"00080020", "00080030", "00080050", "00080061", "00080090", "00081030",
                            "00081190", "00080056", "00080201", "00100010", "00100020", "00100030",
                            "00100040", "0020000D", "00200010", "00201206", "00201208"})
        EXPECT_TRUE(study.contains(QLatin1String(key))) << key;
    EXPECT_EQ(textOf(study, "00100010"), QStringLiteral("Müller^Eva"));
    EXPECT_EQ(
        study.value(QLatin1String("00080061")).toObject().value(QLatin1String("Value")).toArray().size(), 2);
    EXPECT_EQ(textOf(study, "00201206"), QLatin1String("2"));
    EXPECT_EQ(textOf(study, "00201208"), QLatin1String("4"));
    EXPECT_EQ(textOf(study, "00081190"), QLatin1String("http://host/dicom-web/studies/1.1"));
    EXPECT_FALSE(study.contains(QLatin1String("00100021")));
    // A list without value breaks viewers.
    EXPECT_FALSE(studies.at(1).toObject().contains(QLatin1String("00080061")));
    EXPECT_EQ(textOf(studies.at(1).toObject(), "0020000D"), QLatin1String("2"));
}

TEST_P(SearchAnswers, GoDownTheLevels)
{
    storeTwoStudies();
    EXPECT_EQ(values("studies/1.1/series", "0020000E"), "1.1.2 1.1.1");  // by number
    EXPECT_EQ(values("studies/1.1/series", "00201209"), "1 3");
    EXPECT_EQ(values("studies/1.1/series?Modality=CT", "00081190"),
              "http://host/dicom-web/studies/1.1/series/1.1.1");
    EXPECT_FALSE(list("studies/1.1/series").at(0).toObject().contains(QLatin1String("00100010")));
    EXPECT_EQ(values("series?Modality=CT", "00100020"), "P1");
    EXPECT_EQ(values("studies/1.1/series/1.1.1/instances", "00080018"), "1.1.1.1 1.1.1.2 1.1.1.3");
    EXPECT_EQ(values("studies/1.1/series/1.1.1/instances?limit=1&offset=1", "00080018"), "1.1.1.2");
    EXPECT_EQ(values("studies/1.1/instances", "0020000E"), "1.1.2 1.1.1 1.1.1 1.1.1");
    EXPECT_EQ(values("studies/1.1/instances?limit=2&offset=2", "00080018"), "1.1.1.2 1.1.1.3");
    EXPECT_EQ(values("instances?SOPInstanceUID=1.1.1.2,2.1.1", "00080018"), "1.1.1.2 2.1.1");
    EXPECT_EQ(values("instances?SOPInstanceUID=1.1.1.2", "00100020"), "P1");
    EXPECT_EQ(values("studies/1.1/instances?InstanceNumber=3", "00080018"), "1.1.1.3");
    EXPECT_EQ(values("studies/9/series", "0020000E"), "");
}

struct Search
{
    const char* query;
    const char* found;
};

const Search kSearches[] = {
    {"PatientName=*ULL*", "1.1"},
    {"00100010=m%C3%BCller%5Eeva", "1.1"},
    {"PatientName=m?ller", "1.1"},
    {"PatientName=m*r%5E*a", "1.1"},
    {"PatientName=ull", ""},
    {"PatientName=*", "1.1 2"},
    {"PatientName=", "1.1 2"},
    {"PatientName=%22%22&emptyvaluematching=true&StudyInstanceUID=1.1,2", "2"},
    {"StudyDate=%22%22&emptyvaluematching=true&StudyInstanceUID=1.1,2", "2"},
    {"StudyDescription=*ct", "1.1"},
    {"StudyDescription=head ct", ""},
    {"StudyDescription=Head CT", "1.1"},
    {"ModalitiesInStudy=CT,MR", "1.1"},
    {"ModalitiesInStudy=C*", "1.1"},
    {"ModalitiesInStudy=ct", ""},
    {"StudyDate=20240101-20240102&StudyTime=2200-0100", "1.1"},  // one range of moments
    {"StudyDate=20240101-20240102&StudyTime=2345-0100", ""},
    {"StudyDate=20240101&StudyTime=2200-", "1.1"},
    {"StudyDate=20240102&timezone=%2B0200", "1.1"},  // half past midnight there
    {"StudyDate=20240101&timezone=%2B0200", ""},
    {"StudyDate=20240101&timezone=%2B0000", "1.1"},
    {"StudyInstanceUID=1.1%5C2", "1.1 2"},
    {"StudyInstanceUID=1.1&StudyInstanceUID=1.1", "1.1"},
    {"StudyInstanceUID=1.1&StudyInstanceUID=2", ""},
    {"RequestAttributesSequence.ScheduledProcedureStepID=STEP2", "1.1"},
    {"RequestAttributesSequence.ScheduledProcedureStepID=STEP*&PatientID=P1", "1.1"},
    {"00400275.00400009=STEP3", ""},
    {"SOPInstanceUID=2.1.1", "2"},
    {"SeriesNumber=02", "1.1"},
    {"BodyPartExamined=HEAD&PatientID=P1", "1.1"},
    {"BodyPartExamined=FOOT&PatientID=P1", ""},
    {"SOPClassesInStudy=1.2.840.10008.5.1.4.1.1.7&StudyInstanceUID=1.1,2", "1.1 2"},
    {"orderby=PatientName", "2 1.1"},
    {"orderby=-PatientID", "1.1 2"},
};

TEST_P(SearchAnswers, FindWhatIsAskedFor)
{
    storeTwoStudies();
    for (const Search& search : kSearches)
        EXPECT_EQ(studies(search.query), search.found) << search.query;
}

TEST_P(SearchAnswers, ShowTheFieldsThatAreNamed)
{
    storeTwoStudies();
    EXPECT_EQ(values("studies?StudyInstanceUID=1.1&includefield=00080201%2C00081030&includefield=PatientID",
                     "00080201"),
              "+0100");
    EXPECT_EQ(values("studies/1.1/series?Modality=CT&includefield=BodyPartExamined", "00180015"), "HEAD");
    EXPECT_EQ(values("studies/1.1/series?Modality=CT&includefield=all", "00180015"), "HEAD");
    EXPECT_EQ(values("studies/1.1/series/1.1.1/instances?limit=1&includefield=00180015", "00180015"), "HEAD");
    EXPECT_EQ(values("studies/1.1/series?Modality=CT", "00180015"), "");
}

TEST_P(SearchAnswers, SayWhatTheyLeaveOut)
{
    storeTwoStudies();
    const Http::Response cut = get("studies?limit=1");
    ASSERT_EQ(cut.headers.size(), 2);
    EXPECT_EQ(cut.headers.at(1).value,
              "299 http://host/dicom-web: There are 1 additional results that can be requested");
    EXPECT_EQ(get("studies?limit=2").headers.size(), 1);
    EXPECT_EQ(get("studies/1.1/instances?limit=1").headers.at(1).value.contains("There are 3 "), true);
    EXPECT_TRUE(get("studies?fuzzymatching=true").headers.at(1).value.contains("fuzzymatching"));
    EXPECT_EQ(get("studies?BodyPartExamined=HEAD").status, 413);
    EXPECT_EQ(get("studies?Nonsense=HEAD").status, 400);
    EXPECT_EQ(get("studies?accept=text/html").status, 406);
    EXPECT_EQ(bodyOf(get("studies?PatientID=nobody")), "[]");
}

TEST_P(SearchAnswers, ListPatientsOnce)
{
    storeTwoStudies();
    EXPECT_EQ(values("patients", "00100020").find("P1") != std::string::npos, true);
    EXPECT_EQ(list("patients?PatientID=P1").size(), 1);
}

TEST_P(SearchAnswers, WithoutDatabaseTheServiceIsUnavailable)
{
    ThreadSearch nowhere("sqlite:/nowhere/at/all.sqlite");
    SearchResource search(nowhere, shelf());
    Http::Request request;
    request.path = {"studies"};
    ResourcePath path;
    ASSERT_TRUE(ResourcePath::parse(request.path, path));
    EXPECT_EQ(search.answer(request, path).status, 503);
}

}  // namespace
