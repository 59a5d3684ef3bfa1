#include "SearchedArchive.h"
#include "support/Gzip.h"

#include <QXmlStreamReader>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

class SearchAnswers : public SearchedArchive
{
protected:
    static DatasetBuilder image(const QByteArray& sop, const QByteArray& study, const QByteArray& series)
    {
        return anImage(sop).inStudy(study).inSeries(series);
    }

    void storeTwoStudies() const
    {
        for (const char* sop : {"1.1.1.1", "1.1.1.2", "1.1.1.3"})
            store(sop, image(sop, "1.1", "1.1.1")
                           .with("SpecificCharacterSet=ISO_IR 100|PatientName=M\xfcller^Eva|PatientID=P1|"
                                 "StudyDate=20240101|StudyTime=233000|TimezoneOffsetFromUTC=+0100|"
                                 "StudyDescription=Head CT|Modality=CT|SeriesNumber=2|BodyPartExamined=HEAD")
                           .with(DCM_InstanceNumber, QByteArray(sop).right(1))
                           .with(DCM_InstitutionAddress, "Main Road 1\r\nTown")
                           .with(DCM_FrameIncrementPointer, "(0018,1063)")
                           .with(DCM_SelectorFLValue, "-2.59096709e-07")
                           .with(DCM_SelectorFDValue, "0.123456789")
                           .withItem(DCM_RequestAttributesSequence,
                                     anItem().with("ScheduledProcedureStepID=STEP1|RequestedProcedureID=RP1"))
                           .withItem(DCM_RequestAttributesSequence,
                                     anItem().with("ScheduledProcedureStepID=STEP2")));
        store("1.1.2.1",
              image("1.1.2.1", "1.1", "1.1.2").with("PatientName=Muller^Eva|Modality=SR|SeriesNumber=1"));
        store("z.2.1.1", image("2.1.1", "2", "2.1"));
        add();
    }
};

/// An object in one line: keys, VRs and values.
QString lineOf(const QJsonObject& object)
{
    QString line;
    for (auto at = object.begin(); at != object.end(); ++at) {
        const QJsonObject element = at.value().toObject();
        line += at.key() + element.value(QLatin1String("vr")).toString();
        for (const QJsonValue& value : element.value(QLatin1String("Value")).toArray()) {
            const bool isName = value.toObject().contains(QLatin1String("Alphabetic"));
            line += isName             ? QLatin1Char('[') + value.toObject().begin().value().toString()
                    : value.isObject() ? QLatin1Char('[') + lineOf(value.toObject())
                                       : QLatin1Char('[') + value.toVariant().toString();
        }
        line += element.value(QLatin1String("BulkDataURI")).toString() + QLatin1Char(';');
    }
    return line;
}

/// The same of a document of the Native DICOM Model.
QString lineOf(const QByteArray& xml)
{
    QString line;
    QXmlStreamReader reader(xml);
    while (reader.readNext() != QXmlStreamReader::EndDocument && !reader.hasError()) {
        const auto name = reader.name();
        if (reader.isStartElement() && name == QLatin1String("DicomAttribute"))
            line += reader.attributes().value(QLatin1String("tag")).toString() +
                    reader.attributes().value(QLatin1String("vr")).toString();
        else if (reader.isEndElement() && name == QLatin1String("DicomAttribute"))
            line += QLatin1Char(';');
        else if (reader.isStartElement() && reader.attributes().hasAttribute(QLatin1String("number")))
            line += QLatin1Char('[');
        else if (reader.isStartElement() && name == QLatin1String("BulkData"))
            line += reader.attributes().value(QLatin1String("uri")).toString();
        else if (reader.isStartElement() && name == QLatin1String("GivenName"))
            line += QLatin1Char('^');
        else if (reader.isCharacters())
            line += reader.text().toString();
    }
    EXPECT_FALSE(reader.hasError()) << reader.errorString().toStdString() << xml.toStdString();
    return line;
}

INSTANTIATE_TEST_SUITE_P(Engines, SearchAnswers, kBothEngines, engineName);

TEST_P(SearchAnswers, HaveWhatViewersNeed)
{
    storeTwoStudies();
    const QJsonArray studies = list("studies");
    ASSERT_EQ(studies.size(), 2);
    for (const char* key : {"00080020", "00080030", "00080050", "00080061", "00080090", "00081030",
                            "00081190", "00080056", "00080201", "00100010", "00100020", "00100030",
                            "00100040", "0020000D", "00200010", "00201206", "00201208"})
        EXPECT_TRUE(jsonAt(studies[0], key).isObject()) << key;
    EXPECT_EQ(values("studies", "00100010"), "Müller^Eva ");
    EXPECT_EQ(jsonAt(studies[0], "00080061/Value").toArray().size(), 2);
    EXPECT_EQ(values("studies", "00201206"), "2 1");
    EXPECT_EQ(values("studies", "00201208"), "4 1");
    EXPECT_EQ(textOf(studies[0], "00081190"), QLatin1String("http://host/dicom-web/studies/1.1"));
    EXPECT_TRUE(jsonAt(studies[0], "00100021").isUndefined());
    // A list without value breaks viewers.
    EXPECT_TRUE(jsonAt(studies[1], "00080061").isUndefined());
    EXPECT_EQ(values("studies", "0020000D"), "1.1 2");
}

TEST_P(SearchAnswers, GoDownTheLevels)
{
    storeTwoStudies();
    EXPECT_EQ(values("studies/1.1/series", "0020000E"), "1.1.2 1.1.1");  // by number
    EXPECT_EQ(values("studies/1.1/series", "00201209"), "1 3");
    EXPECT_EQ(values("studies/1.1/series?Modality=CT", "00081190"),
              "http://host/dicom-web/studies/1.1/series/1.1.1");
    EXPECT_TRUE(jsonAt(list("studies/1.1/series"), "0/00100010").isUndefined());
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

const std::pair<const char*, const char*> kSearches[] = {
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
    {"ModalitiesInStudy=CT&StudyDate=20240102-", ""},
    {"ModalitiesInStudy=ct", ""},
    {"StudyDate=20240101-20240102&StudyTime=2200-0100", "1.1"},  // one range of moments
    {"StudyDate=20240101-20240102&StudyTime=2345-0100", ""},
    {"StudyDate=20240101&StudyTime=2200-", "1.1"},
    {"StudyDate=20231231-20240101&StudyTime=2200-2300", ""},
    {"StudyDate=20240102&timezone=%2B0200", "1.1"},  // half past midnight there
    {"StudyDate=20240101&timezone=%2B0200", ""},
    {"StudyDate=20240101&timezone=%2B0000", "1.1"},
    {"StudyDate=-20240101", "1.1"},
    {"StudyInstanceUID=1.1%5C2", "1.1 2"},
    {"StudyInstanceUID=1.1&StudyInstanceUID=1.1", "1.1"},
    {"StudyInstanceUID=1.1&StudyInstanceUID=2", ""},
    {"RequestAttributesSequence.ScheduledProcedureStepID=STEP2", "1.1"},
    {"RequestAttributesSequence.ScheduledProcedureStepID=STEP*&PatientID=P1", "1.1"},
    {"00400275.00400009=STEP3", ""},
    {"SOPInstanceUID=2.1.1", "2"},
    {"PatientID=P1", "1.1"},
    {"PatientID=p1", ""},
    {"PatientID=p*", "1.1"},
    {"SeriesInstanceUID=1.1.2&Modality=SR", "1.1"},
    {"SeriesInstanceUID=1.1.2&Modality=CT", ""},
    {"SeriesNumber=02", "1.1"},
    {"SeriesNumber=1e30", ""},
    {"BodyPartExamined=HEAD&PatientID=P1", "1.1"},
    {"BodyPartExamined=FOOT&PatientID=P1", ""},
    {"SelectorFDValue=0.123456789&PatientID=P1", "1.1"},
    {"SelectorFDValue=0.123457&PatientID=P1", ""},
    {"SelectorFLValue=-2.59096709e-07&PatientID=P1", "1.1"},
    {"FrameIncrementPointer=00181063&PatientID=P1", "1.1"},
    {"SOPClassesInStudy=1.2.840.10008.5.1.4.1.1.7&StudyInstanceUID=1.1,2", "1.1 2"},
    {"orderby=PatientName", "2 1.1"},
    {"orderby=-PatientID", "1.1 2"},
};

TEST_P(SearchAnswers, FindWhatIsAskedFor)
{
    storeTwoStudies();
    for (const auto& [query, found] : kSearches)
        EXPECT_EQ(studies(query), found) << query;
}

const std::pair<const char*, const char*> kTexts[] = {
    {"ISO_IR 13", "\xd4\xcf\xc0\xde^\xc0\xdb\xb3"},  // katakana, one with a mark of its own
    {"ISO_IR 13", "A~1"},                            // whose tilde is an overline
    {"ISO 2022 IR 13\\ISO 2022 IR 87", "Ono~2"},
    {"ISO 2022 IR 13\\ISO 2022 IR 87", "\xd4\xcf\xc0\xde~3=\x1b$B;3ED\x1b(J"},
    {"\\ISO 2022 IR 13", "B~4"},
    {"\\ISO 2022 IR 87", "C~5=\x1b$B;3ED\x1b(B"},
    {"ISO_IR 100", "M\xfcller~6"},
    {"GB18030", "\xcd\xf5~7"},
};

TEST_P(SearchAnswers, FindWhatTheyShow)
{
    int number = 0;
    for (const auto& [characterSet, bytes] : kTexts) {
        const QByteArray uid = "7." + QByteArray::number(++number);
        store(uid.constData(), image(uid + ".1.1", uid, uid + ".1")
                                   .with(DCM_SpecificCharacterSet, characterSet)
                                   .with(DCM_PatientName, bytes)
                                   .with(DCM_PatientID, QByteArray(bytes).left(8))
                                   .with(DCM_StudyDescription, QByteArray(bytes).left(8)));
    }
    add();
    for (const QJsonValue& study : list("studies")) {
        for (const char* key : {"00100010", "00100020", "00081030"}) {
            const QString shown = textOf(study, key);
            EXPECT_EQ(studies(key + QByteArray("=") + shown.toUtf8().toPercentEncoding()),
                      textOf(study, "0020000D").toStdString())
                << key << ' ' << shown.toStdString();
        }
    }
}

TEST_P(SearchAnswers, FindEachModalityOfASeriesOfSeveral)
{
    store("8", image("8.1.1", "8", "8.1").with(DCM_Modality, "PT\\CT"));
    add();
    EXPECT_EQ(jsonAt(list("studies"), "0/00080061/Value"),
              (QJsonArray{QStringLiteral("CT"), QStringLiteral("PT")}));
    for (const char* modality : {"CT", "PT"})
        EXPECT_EQ(studies("ModalitiesInStudy=" + QByteArray(modality)), "8") << modality;
}

const std::pair<const char*, const char*> kNames[] = {
    {"harris^", "1"},
    {"^harris", "2"},
    {"Harris", "1"},  // one that names no component asks for the first
    {"H\xc3\xa4rris", "1"},
    {"*arri*", "1 2"},
    {"tom", "2"},
    {"har*^t*", "1"},
    {"yamada", "3"},
    {"^TAR\xc5\x8cU", "3"},
    {"\xe5\xb1\xb1*", "3 9"},              // in any group
    {"=\xe5\xb1\xb1\xe7\x94\xb0", "3 9"},  // in the second
    {"=\xe5\xb1\xb1\xe7\x94\xb0^", "3 9"},
    {"=^\xe5\xa4\xaa*", "3 9"},
    {"\xe5\xb1\xb1*=", ""},  // in the first
    {"==\xe3\x82\x84*", "3"},
    {"=\xe3\x82\x84*", ""},
    {"yamada^tarou=\xe5\xb1\xb1*", "3"},
    {"yamada^hanako=\xe5\xb1\xb1*", ""},
    {"=heri", ""},
    {"==\xe5\xb1\xb1\xe7\x94\xb0", ""},
    {"*\xe7\x94\xb0*", "3 9"},
    {"*\xe9\x83\x8e^*", ""},
    {"doe", "4 5 6"},
    {"DOE^JOHN", "4"},
    {"Do", ""},
    {"john", ""},
    {"^John", "4"},
    {"^John^^Dr", "4"},
    {"doe^^dr", ""},
    {"Doe^", "4 5 6"},
    {"*oh*", "4 5 6"},
    {"*ohn", "4 6"},
    {"oh*", ""},
    {"d*^j*", "4 5"},
    {"d?e", "4 5 6"},
    {"?we", ""},
    {"=*oe*", ""},
    {"d*e", "4 5 6 91"},
    {"strasse", "7"},
    {"*%*", "7"},
    {"^J[1]", "8"},
    {"*q*", ""},  // the marks between components are nobody's letters
};

TEST_P(SearchAnswers, FindPersonsByComponentAndGroup)
{
    const char* const yamada = "Yamada^Tarou=\xe5\xb1\xb1\xe7\x94\xb0^\xe5\xa4\xaa\xe9\x83\x8e="
                               "\xe3\x82\x84\xe3\x81\xbe\xe3\x81\xa0^\xe3\x81\x9f";
    const std::pair<QByteArray, const char*> kPersons[] = {
        {"1", "Harris^Tom"},
        {"2", "Tom^Harris"},
        {"3", yamada},
        {"4", "Doe^John^^Dr"},
        {"5", "Doe^Johnny"},
        {"6", "Doe^^John"},
        {"7", "Stra\xc3\x9f"
              "e^A%B"},
        {"8", "AB^J[1]"},
        {"9", "=\xe5\xb1\xb1\xe7\x94\xb0^\xe5\xa4\xaa\xe9\x83\x8e"},
        {"91", "Dowe^X"},
        {"92", "Dan^X=Yee^Jo=Roe"},
    };
    for (const auto& [uid, person] : kPersons)
        store(uid.constData(), image(uid + ".1.1", uid, uid + ".1")
                                   .with(DCM_SpecificCharacterSet, "ISO_IR 192")
                                   .with(DCM_PatientName, person));
    add();
    for (const auto& [query, found] : kNames) {
        const QByteArray name = QByteArray(query).toPercentEncoding("*");
        for (const char* order : {"", "&fuzzymatching=true"})
            EXPECT_EQ(studies("orderby=StudyInstanceUID&PatientName=" + name + order), found) << query;
    }
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
    EXPECT_EQ(headerOf(get("studies?limit=1"), "Warning"),
              "299 http://host/dicom-web: There are 1 additional results that can be requested");
    EXPECT_EQ(headerOf(get("studies?limit=2"), "Warning"), "");
    EXPECT_TRUE(headerOf(get("studies/1.1/instances?limit=1"), "Warning").contains("There are 3 "));
    EXPECT_TRUE(headerOf(get("studies?fuzzymatching=true"), "Warning").contains("fuzzymatching"));
    EXPECT_EQ(get("studies?BodyPartExamined=HEAD").status, 413);
    EXPECT_EQ(get("studies?Nonsense=HEAD").status, 400);
    EXPECT_EQ(get("studies?accept=text/html").status, 406);
    EXPECT_EQ(bodyOf(get("studies?PatientID=nobody")), "[]");
}

const char* const kInBothForms[] = {"studies", "studies/1.1/series", "instances?PatientID=P1", "patients",
                                    "studies/1.1/series/1.1.1/instances?includefield=all"};

TEST_P(SearchAnswers, AreXmlForThoseWhoTakeIt)
{
    storeTwoStudies();
    const QVector<Http::Field> xml = {{"accept", "multipart/related; type=\"application/dicom+xml\""}};
    for (const char* target : kInBothForms) {
        const Http::Response response = get(target, xml);
        const QByteArray type = headerOf(response, "Content-Type");
        EXPECT_TRUE(type.startsWith("multipart/related; type=\"application/dicom+xml\"; boundary="));
        const QByteArray boundary = "--" + type.mid(type.lastIndexOf('=') + 1);
        QByteArray body = bodyOf(response);
        for (const QJsonValue& each : list(target)) {
            const QByteArray begin = boundary + "\r\nContent-Type: application/dicom+xml\r\n\r\n";
            ASSERT_TRUE(body.startsWith(begin)) << target;
            const int end = body.indexOf("\r\n" + boundary);
            EXPECT_EQ(lineOf(body.mid(begin.size(), end - begin.size())), lineOf(each.toObject())) << target;
            body.remove(0, end + 2);
        }
        EXPECT_EQ(body, boundary + "--\r\n") << target;
    }
    EXPECT_EQ(get("studies?PatientID=nobody", xml).status, 204);
}

TEST_P(SearchAnswers, AreCompressedForThoseWhoTakeIt)
{
    storeTwoStudies();
    for (const char* target : {"studies", "studies?limit=1", "changefeed"}) {
        const Http::Response plain = get(target);
        const Http::Response compressed = get(target, {{"accept-encoding", "gzip"}});
        const bool isLarge = bodyOf(plain).size() >= 1024;
        EXPECT_EQ(headerOf(compressed, "Content-Encoding"), isLarge ? "gzip" : "") << target;
        EXPECT_EQ(isLarge ? unpacked(bodyOf(compressed)) : bodyOf(compressed), bodyOf(plain)) << target;
        EXPECT_TRUE(headerOf(plain, "Vary").contains("Accept-Encoding"));
        EXPECT_EQ(headerOf(compressed, "Warning"), headerOf(plain, "Warning"));
    }
    EXPECT_EQ(headerOf(get("studies", {{"accept-encoding", "gzip"}}), "Content-Encoding"), "gzip");
    EXPECT_EQ(headerOf(get("studies?PatientID=nobody", {{"accept-encoding", "gzip"}}), "Content-Encoding"),
              "");
}

TEST_P(SearchAnswers, SayWhereValuesThatTheyLeaveOutAre)
{
    store("3.1", image("3.1", "3", "3.9")
                     .withLong(DCM_PatientComments, 3000)
                     .withItem(DCM_ProcedureCodeSequence,
                               anItem().with("CodeValue=C1").withLong(DCM_CodeMeaning, 3000)));
    add();
    const QByteArray place = "0/00081032/Value/0/00080104/BulkDataURI";
    EXPECT_EQ(textAt(list("studies/3/instances?includefield=ProcedureCodeSequence"), place),
              "http://host/dicom-web/studies/3/series/3.9/instances/3.1/bulkdata/00081032/0/00080104");
    EXPECT_EQ(textAt(list("studies?includefield=all"), "0/00081032/Value/0/00080100/Value/0"), "C1");
    EXPECT_EQ(textAt(list("studies?includefield=all"), place), "") << "of a study it has none";
    EXPECT_EQ(textAt(list("studies/3/instances?includefield=all"), "0/00104000/BulkDataURI"),
              "http://host/dicom-web/studies/3/series/3.9/instances/3.1/bulkdata/00104000");
}

}  // namespace
