#include "QueriedArchive.h"
#include "server/dimse/OnlyPatient.h"

#include <gmock/gmock.h>

using namespace Kdd;
using testing::HasSubstr;

namespace
{

/// "LIMITED" may see the studies of patient P1.
class LimitedPeers : public QueriedArchive
{
protected:
    void SetUp() override
    {
        QueriedArchive::SetUp();
        mSettings.dimse->rules.peers.insert("LIMITED",
                                            {{}, {}, 0, false, Dimse::kAllRights, onlyPatient("P1")});
        fill();
    }

    const QStringList mLimited = {QStringLiteral("-aet"), QStringLiteral("LIMITED")};
};

INSTANTIATE_TEST_SUITE_P(Engines, LimitedPeers,
                         testing::Values(DicomWeb::Engine::Sqlite, DicomWeb::Engine::Postgres),
                         DicomWeb::engineName);

const struct
{
    const char* level;
    const char* keys;
    const char* all;   // images that are had
    const char* seen;  // by who is limited
} kWishes[] = {
    {"STUDY", "StudyInstanceUID=1\\2", "1.1.1 1.1.2 1.2.1 2.1.1", "1.1.1 1.1.2 1.2.1"},
    {"STUDY", "StudyInstanceUID=1", "1.1.1 1.1.2 1.2.1", "1.1.1 1.1.2 1.2.1"},
    {"STUDY", "StudyInstanceUID=2", "2.1.1", ""},
    {"STUDY", "StudyInstanceUID=9", "", ""},
    {"SERIES", "StudyInstanceUID=1|SeriesInstanceUID=1.1", "1.1.1 1.1.2", "1.1.1 1.1.2"},
    {"SERIES", "StudyInstanceUID=2|SeriesInstanceUID=2.1", "2.1.1", ""},
    {"SERIES", "SeriesInstanceUID=1.1\\2.1", "1.1.1 1.1.2 2.1.1", "1.1.1 1.1.2"},
    {"IMAGE", "StudyInstanceUID=2|SeriesInstanceUID=2.1|SOPInstanceUID=2.1.1", "2.1.1", ""},
    {"IMAGE", "SOPInstanceUID=1.1.2\\2.1.1", "1.1.2 2.1.1", "1.1.2"},
    {"STUDY", "PatientID=P2|StudyInstanceUID=1\\2", "2.1.1", ""},
};

TEST_P(LimitedPeers, GetWhatIsNamedOnEveryLevelButNothingThatTheyMayNotSee)
{
    for (const auto& each : kWishes) {
        const QStringList keys = onLevel(each.level, keysOf(each.keys));
        get(keys);
        EXPECT_EQ(answered(DCM_SOPInstanceUID), each.all) << "C-GET " << each.keys;
        move(keys);
        EXPECT_EQ(answered(DCM_SOPInstanceUID), each.all) << "C-MOVE " << each.keys;
        const std::string got = get(keys, mLimited);
        EXPECT_EQ(answered(DCM_SOPInstanceUID), each.seen) << "C-GET " << each.keys << '\n' << got;
        const std::string moved = move(keys, mLimited);
        EXPECT_EQ(answered(DCM_SOPInstanceUID), each.seen) << "C-MOVE " << each.keys << '\n' << moved;
        EXPECT_THAT(moved, HasSubstr("Received Final Move Response (Success)")) << each.keys;
    }
    run("getscu", {QStringLiteral("-P")}, onLevel("PATIENT", keysOf("PatientID=P1")));
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.1 1.1.2 1.2.1");
}

TEST_P(LimitedPeers, FindNothingOfStudiesThatTheyMayNotSee)
{
    const struct
    {
        const char* level;
        const char* keys;
        DcmTagKey shown;
        const char* seen;
    } kQuestions[] = {
        {"STUDY", "StudyInstanceUID", DCM_StudyInstanceUID, "1"},
        {"STUDY", "StudyInstanceUID=2", DCM_StudyInstanceUID, ""},
        {"SERIES", "SeriesInstanceUID", DCM_SeriesInstanceUID, "1.1 1.2"},
        {"IMAGE", "SOPInstanceUID=2.1.1", DCM_SOPInstanceUID, ""},
        {"IMAGE", "StudyInstanceUID=2|SOPInstanceUID", DCM_SOPInstanceUID, ""},
    };
    for (const auto& each : kQuestions) {
        run("findscu", QStringList{QStringLiteral("-S"), QStringLiteral("-X")} + mLimited,
            onLevel(each.level, keysOf(each.keys)));
        EXPECT_EQ(answered(each.shown), each.seen) << each.keys;
    }
    run("findscu", QStringList{QStringLiteral("-P"), QStringLiteral("-X")} + mLimited,
        onLevel("PATIENT", keysOf("PatientID")));
    EXPECT_EQ(answered(DCM_PatientID), "P1");
}

}  // namespace
