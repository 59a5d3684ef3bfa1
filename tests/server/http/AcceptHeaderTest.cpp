#include "server/http/AcceptHeader.h"

#include "server/Handled.h"

using namespace Kdd;
using namespace Kdd::Http;

namespace
{

const QVector<MediaType> kOffers = {{"application/dicom+json", ""},
                                    {"multipart/related", "application/dicom"},
                                    {"multipart/related", "application/octet-stream"},
                                    {"image/jpeg", ""}};

/// What is accepted and which of the offers is chosen.
const std::pair<const char*, int> kChoices[] = {
    {"*/*", 0},
    {"", -1},
    {"application/dicom+json", 0},
    {"APPLICATION/dicom+JSON ; charset=utf-8", 0},
    {"image/*", 3},
    {"text/html", -1},
    {"html", -1},
    {"multipart/related", 1},
    {"multipart/related; type=\"application/octet-stream\"; transfer-syntax=\"*\"", 2},
    {"multipart/related;type=application/octet-stream;transfer-syntax=*", 2},
    {"multipart/related; type=\"image/*\"", -1},
    {"multipart/related; type=\"application/*\"", 1},
    {"image/jpeg;q=0.5, application/dicom+json;q=0.4", 3},
    {"*/*;q=0.1, application/dicom+json;q=0", 1},
    {"application/dicom+json;q=0", -1},
    {"a/b;c=\"x,y;image/jpeg\"", -1},
    {"a/b;c=\"never closed, image/jpeg", -1},
    {",;,image/jpeg", 3},
    {"image/jpeg;q=much", 3},
    {"text/html,application/xhtml+xml,application/xml;q=0.9,*/*;q=0.8", 0},
};

TEST(AcceptHeader, ChoosesWhatIsMostWelcome)
{
    for (const auto& [accept, offer] : kChoices)
        EXPECT_EQ(AcceptHeader(QByteArray(accept)).choose(kOffers), offer) << accept;
}

TEST(AcceptHeader, TellsTheTransferSyntaxBestFirst)
{
    const AcceptHeader accept(
        "multipart/related; type=application/dicom; transfer-syntax=1.2.840.10008.1.2.4.50; q=0.3,"
        "multipart/related; type=\"application/dicom\"; transfer-syntax=\"1.2.840.10008.1.2.1\"");
    ASSERT_EQ(accept.ranges().size(), 2);
    EXPECT_EQ(accept.ranges()[0].transferSyntax, "1.2.840.10008.1.2.1");
    EXPECT_EQ(accept.ranges()[1].transferSyntax, "1.2.840.10008.1.2.4.50");
    EXPECT_EQ(accept.ranges()[1].quality, 300);
}

TEST(AcceptHeader, KnowsContentCodings)
{
    const std::tuple<const char*, bool> cases[] = {
        {"gzip, deflate, br", true}, {"GZIP;q=0.5", true},           {"gzip;q=0, *", false}, {"*", true},
        {"*, gzip;q=0", false},      {"identity;q=1, *;q=0", false}, {"br", false},          {"", false}};
    for (const auto& [header, isAccepted] : cases) {
        EXPECT_EQ(acceptsCoding(requestFor("", {{"accept-encoding", header}}), "gzip"), isAccepted) << header;
    }
}

}  // namespace
