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
};

INSTANTIATE_TEST_SUITE_P(Engines, LimitedPeers, kBothEngines, engineName);

/// The images that are had, and those of them that who is limited gets.
const std::tuple<const char*, const char*, const char*, const char*> kWishes[] = {
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
    for (const auto& [level, named, all, seen] : kWishes) {
        const QByteArray keys = onLevel(level, named);
        for (const auto& [options, images] : {std::pair("", all), std::pair("-aet LIMITED", seen)}) {
            const std::string got = get(keys, options);
            EXPECT_EQ(answered(DCM_SOPInstanceUID), images) << "C-GET " << named << options << '\n' << got;
            const std::string moved = move(keys, options);
            EXPECT_EQ(answered(DCM_SOPInstanceUID), images) << "C-MOVE " << named << options << '\n' << moved;
            EXPECT_THAT(moved, HasSubstr("Received Final Move Response (Success)")) << named << options;
        }
    }
    run("getscu", "-P", onLevel("PATIENT", "PatientID=P1"));
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.1 1.1.2 1.2.1");
}

TEST_P(LimitedPeers, FindNothingOfStudiesThatTheyMayNotSee)
{
    const std::tuple<const char*, const char*, const char*, DcmTagKey, const char*> kQuestions[] = {
        {"-S", "STUDY", "StudyInstanceUID", DCM_StudyInstanceUID, "1"},
        {"-S", "STUDY", "StudyInstanceUID=2", DCM_StudyInstanceUID, ""},
        {"-S", "SERIES", "SeriesInstanceUID", DCM_SeriesInstanceUID, "1.1 1.2"},
        {"-S", "IMAGE", "SOPInstanceUID=2.1.1", DCM_SOPInstanceUID, ""},
        {"-S", "IMAGE", "StudyInstanceUID=2|SOPInstanceUID", DCM_SOPInstanceUID, ""},
        {"-P", "PATIENT", "PatientID", DCM_PatientID, "P1"},
    };
    for (const auto& [root, level, keys, shown, seen] : kQuestions) {
        find(onLevel(level, keys), root + QByteArray(" -aet LIMITED"));
        EXPECT_EQ(answered(shown), seen) << keys;
    }
}

}  // namespace
