#include "server/Handled.h"
#include "server/dicomweb/search/SearchPlan.h"

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

Headers fields(const QByteArray& query)
{
    return requestFor('?' + query).query;
}

/// Empty when it is understood.
std::string refusal(const QByteArray& query)
{
    SearchRequest request;
    SearchPlan plan;
    QString reason;
    const bool isGood =
        SearchRequest::parse(fields(query), request, reason) && SearchPlan::make(request, plan, reason);
    EXPECT_EQ(isGood, reason.isEmpty()) << query.constData();
    return reason.toStdString();
}

const char* const kUnderstood[] = {
    "0010001f=a",
    "includefield=00081030,PatientName&includefield=all",
    "includefield=00081030,",
    "limit=0&offset=99999999999999",
    "fuzzymatching=true&emptyvaluematching=false",
    "StudyDate=20240101-&StudyTime=-1030",
    "orderby=PatientName,-StudyDate",
    "TimezoneOffsetFromUTC=-0330",
    "accept=application/dicom+json&_=17",
};

const char* const kRefused[] = {
    "PatientNmae=a",
    "limit=-1",
    "limit=ten",
    "offset=1.5",
    "fuzzymatching=yes",
    "includefield=nix",
    "orderby=StudyFoo",
    "orderby=Rows",
    "timezone=0100",
    "timezone=+01:00",
    "StudyDate=yesterday",
    "StudyDate=20240101-2024",
    "StudyDate=-",
    "StudyTime=1",
    "RequestAttributesSequence=1",
    "A.B.C.D.E.F.G.H.I=1",
    "=1",
    ".PatientName=1",
};

TEST(SearchRequest, IsUnderstoodOrRefusedWithAReason)
{
    for (const char* query : kUnderstood)
        EXPECT_EQ(refusal(query), "") << query;
    for (const char* query : kRefused)
        EXPECT_NE(refusal(query), "") << query;
}

TEST(SearchRequest, IsBounded)
{
    QByteArray uids;
    for (int i = 0; i < 3000; ++i)
        uids += QByteArray::number(i) + ',';
    const QByteArray kQueries[] = {"PatientName=" + QByteArray(100000, 'x'), "StudyInstanceUID=" + uids,
                                   QByteArray("PatientName=a&").repeated(100) + "PatientID=1",
                                   "includefield=" + QByteArray("00081030,").repeated(2000),
                                   "orderby=" + QByteArray("PatientID,").repeated(20) + "PatientID"};
    for (const QByteArray& query : kQueries)
        EXPECT_NE(refusal(query), "") << query.left(30).constData();
}

TEST(SearchRequest, ListsAreSeparatedByCommaOrBackslash)
{
    SearchRequest request;
    QString reason;
    ASSERT_TRUE(SearchRequest::parse(
        fields("StudyInstanceUID=1.2,1.3\\1.2&ModalitiesInStudy=CT,MR&PatientID=A\\B"), request, reason));
    EXPECT_EQ(request.conditions[0].list, (QVector<QString>{QStringLiteral("1.2"), QStringLiteral("1.3")}));
    EXPECT_EQ(request.conditions[1].list.size(), 2);
    EXPECT_EQ(request.conditions[2].list.size(), 1);
    ASSERT_TRUE(SearchRequest::parse(fields("PatientID=A\\B&multiplevaluematching=true"), request, reason));
    EXPECT_EQ(request.conditions.back().list.size(), 2);
}

TEST(SearchRequest, OffsetsFromUtcAreMinutes)
{
    EXPECT_EQ(zoneMinutes("+0130"), 90);
    EXPECT_EQ(zoneMinutes(" 0130"), 90);  // as a "+" arrives that was not encoded
    EXPECT_EQ(zoneMinutes("-0330"), -210);
    for (const char* wrong : {"", "0100", "+01", "+1500", "+0160", "+-100", "+01000"})
        EXPECT_FALSE(zoneMinutes(wrong)) << wrong;
}

}  // namespace
