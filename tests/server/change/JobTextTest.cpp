#include "server/dicomweb/change/JobText.h"

#include <gmock/gmock.h>
#include <kddlib/QAData.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

std::string told(const QAData& job)
{
    QString text = QString::fromLatin1(job.timestamp + '|' + job.login + '|' + job.oldStudyUID);
    for (const QASubstitution& each : job.substitutions)
        text += QLatin1Char('|') + QString::fromStdString(each.key.toString()) +
                (each.value.isNull() ? QString() : QLatin1Char('=') + each.value);
    return text.toStdString();
}

/// The same job twice.
const std::pair<const char*, const char*> kJobs[] = {
    {"{}", "<Job/>"},
    {R"({"timestamp":" 20240131120000.25+0100 ","login":" J\u00fcrg B "})",
     "<Job><Timestamp> 20240131120000.25+0100 </Timestamp><Login> J\xc3\xbcrg B </Login></Job>"},
    {R"({"oldStudy":"1.2-a"})", "<Substitutions OldSUID='1.2-a'/>"},
    {R"({"tags":[{"tag":"00100010","value":"Doe^J&J <i>\"]]>"},{"tag":"7fe00010"},{"tag":"0008103E","value":""}]})",
     "<a><Tag Group='10' Element='10'><Value>Doe^J&amp;J &lt;i&gt;\"]]&gt;</Value></Tag><Tag Group='7fe0' "
     "Element='0010'/>"
     "<Tag Group='0008' Element='103e'><Value/></Tag></a>"},
    {R"({"tags":[{"tag":"00104000","value":" a\r\n\tb\u0085\u2028 "}]})",
     "<Tag Group='10' Element='4000'><Value> a&#13;&#10;&#9;b&#133;&#8232; </Value></Tag>"},
    {R"({"tags":[{"tag":"00104000","value":"\ud83d\ude00\\"}]})",
     "<Tag Group='10' Element='4000'><Value>\xf0\x9f\x98\x80\\</Value></Tag>"},
};

TEST(JobText, SaysTheSameInBothForms)
{
    for (const auto& [json, xml] : kJobs) {
        QAData fromJson;
        QAData fromXml;
        QString reason;
        EXPECT_TRUE(readJob(json, JobForm::Json, fromJson, reason)) << json << reason.toStdString();
        EXPECT_TRUE(readJob(xml, JobForm::Xml, fromXml, reason)) << xml << reason.toStdString();
        EXPECT_EQ(told(fromJson), told(fromXml));
    }
}

const std::pair<const char*, const char*> kFaults[] = {
    {"", "no JSON object"},
    {"[]", "no JSON object"},
    {"{} {}", "no JSON object"},
    {R"({"login":"a","login":"b"})", "twice"},
    {R"({"Login":"a"})", "\"Login\" is nothing"},
    {R"({"login":1})", "login is no text"},
    {R"({"login":"a\nb"})", "Login \"a\nb\" is not one line"},
    {R"({"login":"\u0416"})", "Latin-1"},
    {R"({"login":"\u0000"})", "characters that no value may have"},
    {R"({"timestamp":"2024"})", "Timestamp \"2024\" is no time"},
    {R"({"oldStudy":"../1"})", "oldStudy has something that is no UID"},
    {R"({"oldStudy":null})", "oldStudy is no text"},
    {R"({"tags":{}})", "tags is no list"},
    {R"({"tags":[1]})", "tag is no text"},
    {R"({"tags":[{"tag":"0010001","value":""}]})", "eight hexadecimal digits"},
    {R"({"tags":[{"tag":"+0100010","value":""}]})", "eight hexadecimal digits"},
    {R"({"tags":[{"tag":"00100010"}]})", "Tag (0010,0010) has no Value"},
    {R"({"tags":[{"tag":"00100010","value":null}]})", "value is no text"},
    {R"({"tags":[{"tag":"00100010","value":["a"]}]})", "value is no text"},
    {R"({"tags":[{"tag":"00100010","value":"\ud83d"}]})", "no JSON object"},
    {R"({"tags":[{"tag":"00100010","value":"\ufffe"}]})", "characters"},
    {R"({"tags":[{"tag":"00100010","value":"a","vr":"PN"}]})", "\"vr\" is nothing"},
    {R"({"tags":[{"tag":"00100010","value":"a"},{"tag":"00100010","value":"b"}]})", "stands twice"},
    {R"({"images":"1.2"})", "images is no list"},
    {R"({"images":["/etc/passwd"]})", "no UID"},
    {R"({"wholeStudy":"true"})", "neither true nor false"},
};

TEST(JobText, AFaultIsNamedAndLeavesTheJobAlone)
{
    for (const auto& [json, fault] : kFaults) {
        QAData job;
        job.login = "before";
        QString reason;
        EXPECT_FALSE(readJob(json, JobForm::Json, job, reason)) << json;
        EXPECT_THAT(reason.toStdString(), testing::HasSubstr(fault));
        EXPECT_FALSE(reason.startsWith(QLatin1String("Line")));
        EXPECT_EQ(job.login + job.images.value(0), "before") << json;
    }
}

}  // namespace
