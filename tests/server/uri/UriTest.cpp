#include "server/retrieve/RetrieveFixture.h"

#include <QImage>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

class UriTest : public RetrieveTest
{
protected:
    Http::Response object(const QByteArray& parameters, const QByteArray& accept = "*/*")
    {
        return getByUri(kObject + parameters, accept);
    }

    QImage picture(const QByteArray& parameters)
    {
        Http::Response response = object(parameters);
        EXPECT_EQ(response.status, 200) << parameters.constData();
        return QImage::fromData(bodyOf(response));
    }
};

/// What is asked of an image with so many frames, by which Accept, and what is given; a number is a refusal.
const std::tuple<int, const char*, const char*, const char*> kForms[] = {
    {1, "", "*/*", "image/jpeg"},
    {2, "", "*/*", "application/dicom; transfer-syntax=1.2.840.10008.1.2.1"},
    {2, "frameNumber=2", "*/*", "image/jpeg"},
    {2, "", "image/avif,image/webp,image/*,*/*;q=0.8", "image/jpeg"},
    {1, "", "application/dicom", "application/dicom; transfer-syntax=1.2.840.10008.1.2.1"},
    {1, "contentType=application/dicom", "image/jpeg",
     "application/dicom; transfer-syntax=1.2.840.10008.1.2.1"},
    {1, "contentType=image/png", "*/*", "image/png"},
    {1, "contentType=image/gif,image/png;q=0.5,image/jpeg;q=0.4", "*/*", "image/png"},
    {1, "contentType=image/gif", "*/*", "406"},
    {1, "contentType=application/pdf", "*/*", "406"},
    {1, "contentType=video/mp4", "*/*", "406"},
    {1, "contentType=application/dicom&transferSyntax=1.2.840.10008.1.2.4.80", "*/*",
     "application/dicom; transfer-syntax=1.2.840.10008.1.2.4.80"},
    {1, "contentType=application/dicom&transferSyntax=1.2.840.10008.1.2.4.91", "*/*",
     "application/dicom; transfer-syntax=1.2.840.10008.1.2.1"},
    {1, "contentType=application/dicom&transferSyntax=x!", "*/*", "400"},
    {1, "charset=UTF-8&contentType=image/jpeg", "*/*", "image/jpeg"},
    {1, "anonymize=yes", "*/*", "400"},
    {1, "anonymize=yes&contentType=application/dicom", "*/*", "400"},
    {1, "annotation=patient", "*/*", "400"},
    {1, "presentationUID=1.2&presentationSeriesUID=1.3", "*/*", "400"},
    {2, "frameNumber=3&contentType=image/jpeg", "*/*", "404"},
    {2, "frameNumber=0", "*/*", "400"},
    {1, "rows=0", "*/*", "400"},
    {1, "columns=9000", "*/*", "400"},
    {1, "imageQuality=0", "*/*", "400"},
    {1, "windowCenter=40", "*/*", "400"},
    {1, "windowCenter=40&windowWidth=0.5", "*/*", "400"},
    {1, "windowCenter=nan&windowWidth=10", "*/*", "400"},
    {1, "region=0.5,0,0.4,1", "*/*", "400"},
    {1, "region=0,0,1.1,1", "*/*", "400"},
    {1, "region=0,0,1", "*/*", "400"},
};

TEST_F(UriTest, GivesTheFormThatIsAskedForOrTellsWhyNot)
{
    int frames = 0;
    for (const auto& [count, parameters, accept, expected] : kForms) {
        if (count != frames)
            add("a.dcm", anImageWithFrames(count));
        frames = count;
        Http::Response response = object(parameters, accept);
        const QByteArray given =
            response.status == 200 ? headerOf(response, "Content-Type") : QByteArray::number(response.status);
        EXPECT_EQ(given, expected) << parameters << ' ' << accept;
    }
}

TEST_F(UriTest, NeedsAllItsParameters)
{
    add("a.dcm", anImageWithFrames(1));
    for (const char* name : {"requestType", "studyUID", "seriesUID", "objectUID"})
        EXPECT_EQ(getByUri(QByteArray(kObject).replace(name, "other")).status, 400) << name;
    EXPECT_EQ(getByUri(QByteArray(kObject).replace("WADO", "QIDO")).status, 400);
    EXPECT_EQ(getByUri(QByteArray(kObject).replace("studyUID=1.2", "studyUID=../1.2")).status, 400);
    EXPECT_EQ(getByUri(QByteArray(kObject).replace("studyUID=1.2", "studyUID=1.9")).status, 404);
    EXPECT_EQ(getByUri(QByteArray(kObject).replace("seriesUID=1.2.3", "seriesUID=1.2.4")).status, 404);
}

TEST_F(UriTest, DrawsAsThePathsDo)
{
    add("a.dcm", anImageWithFrames(2));
    EXPECT_EQ(picture("contentType=image/png").size(), QSize(16, 16));
    EXPECT_EQ(picture("contentType=image/png&rows=40").size(), QSize(40, 40));
    EXPECT_EQ(picture("contentType=image/png&rows=40&columns=8").size(), QSize(8, 8));
    EXPECT_EQ(picture("contentType=image/png&region=0.25,0.5,1,1").size(), QSize(12, 8));
    const QImage cut = picture(
        "contentType=image/png&frameNumber=1&region=0.5,0.25,1,0.75&windowCenter=2000&windowWidth=900");
    const QImage whole = picture("contentType=image/png&frameNumber=1&windowCenter=2000&windowWidth=900");
    EXPECT_EQ(cut, whole.copy(8, 4, 8, 8));
    const QByteArray path = kInstance + "/frames/1/rendered?window=2000,900,linear";
    EXPECT_EQ(QImage::fromData(bodyOf(get(path, "image/png"))), whole);
}

}  // namespace
