#pragma once

#include "server/Handled.h"
#include "server/dicomweb/render/RenderedResource.h"
#include "server/dicomweb/retrieve/BulkDataResource.h"
#include "server/dicomweb/retrieve/FramesResource.h"
#include "server/dicomweb/retrieve/InstancesResource.h"
#include "server/dicomweb/uri/UriResource.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"
#include "support/TemporaryStore.h"

#include <QFile>

#include <dcmtk/dcmdata/dcrledrg.h>
#include <dcmtk/dcmdata/dcrleerg.h>
#include <gtest/gtest.h>
#include <kddlib/DicomFileReader.h>
#include <kddlib/Limits.h>
#include <kddlib/LogFile.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/QAData.h>
#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{

const QByteArray kInstance = "studies/1.2/series/1.2.3/instances/1.2.3.1";
const QByteArray kObject = "requestType=WADO&studyUID=1.2&seriesUID=1.2.3&objectUID=1.2.3.1&";
constexpr const char* kStored = "application/dicom; transfer-syntax=*";
constexpr int kFrameBytes = 16 * 16 * 2;

/// So many frames of 16 x 16 words, each frame of other bytes than the others.
inline DatasetBuilder anImageWithFrames(int frames, const char* sopUID = "1.2.3.1")
{
    QByteArray pixels(frames * kFrameBytes, 0);
    for (int i = 0; i < pixels.size(); ++i)
        pixels[i] = static_cast<char>((i / kFrameBytes + 1) * 7 + i % 5);
    return anImage(sopUID)
        .with(DCM_PatientName, "Wrong^Name")
        .asPicture(16, 16, 16)
        .with(DCM_NumberOfFrames, QByteArray::number(frames))
        .data(DcmTag(DCM_PixelData, EVR_OW), pixels);
}

inline QByteArray frameOf(int number)
{
    QByteArray pixels(kFrameBytes, 0);
    for (int i = 0; i < pixels.size(); ++i)
        pixels[i] = static_cast<char>((number + 1) * 7 + (number * kFrameBytes + i) % 5);
    return pixels;
}

class RetrieveTest : public testing::Test
{
protected:
    RetrieveTest()
    {
        DcmRLEEncoderRegistration::registerCodecs();
        DcmRLEDecoderRegistration::registerCodecs();
        LogFile::setCallback([](LogFile::Severity, const char*, const std::string&) {});
        mResources.push_back(std::make_unique<FramesResource>(mStudies, mObjects));
        mResources.push_back(std::make_unique<InstancesResource>(mStudies, mObjects));
        mResources.push_back(std::make_unique<BulkDataResource>(mStudies, mObjects));
        mResources.push_back(std::make_unique<RenderedResource>(mStudies, mObjects));
        mResources.push_back(std::make_unique<UriResource>(mStudies, mObjects));
    }
    ~RetrieveTest() override { LogFile::setCallback(nullptr); }

    QString path(const char* name) const { return mStore.filePath(name); }

    void write(const char* name, const DatasetBuilder& image,
               E_TransferSyntax syntax = EXS_LittleEndianExplicit)
    {
        ASSERT_TRUE(image.dataset().chooseRepresentation(syntax, nullptr).good());
        image.save(path(name), syntax);
    }

    /// Puts the file into its study's tag file, as if it lay in `place`, which may be a URL.
    void add(const QString& path, const QByteArray& place = {})
    {
        DcmFileFormat file;
        TagFile study;
        ASSERT_TRUE(readDicomFile(path.toLocal8Bit().constData(), file).good()) << qPrintable(path);
        std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
        map->putAndInsertValue(kFilePath, VrCode::LO, place.isEmpty() ? path.toLocal8Bit() : place);
        study.addTagMap(map.release(), nullptr, true);
        ASSERT_TRUE(study.mergeIntoCacheFile());
    }

    void add(const char* name, const DatasetBuilder& image,
             E_TransferSyntax syntax = EXS_LittleEndianExplicit)
    {
        write(name, image, syntax);
        add(path(name));
    }

    void correct(const DcmTagKey& key, const char* value, const char* oldStudy = "",
                 const char* study = "1.2")
    {
        QAData job;
        QString message;
        job.studyUID = study;
        job.oldStudyUID = oldStudy;
        job.images = {"1.2.3.1"};
        job.substitutions = {{key, QString::fromLatin1(value)}};
        if (*oldStudy != '\0')
            job.substitutions.append({DCM_StudyInstanceUID, QString::fromLatin1(study)});
        EXPECT_TRUE(TagFile::applyQA(job, message)) << qPrintable(message);
        EXPECT_EQ(job.outcome.changed, 1);
    }

    Http::Response get(const QByteArray& target, const QByteArray& accept = "*/*",
                       const QByteArray& range = {})
    {
        Http::Request request = requestFor(target, {{"accept", accept}});
        if (!range.isEmpty())
            request.headers.append({"range", range});
        return get(request);
    }

    Http::Response get(const Http::Request& request)
    {
        ResourcePath parsed;
        if (!ResourcePath::parse(request.path, parsed))
            return Http::failure(404, QStringLiteral("no path"));
        for (const auto& resource : mResources) {
            if (resource->owns(parsed))
                return resource->answer(request, parsed);
        }
        return Http::failure(404, QStringLiteral("nobody's path"));
    }

    /// As older viewers ask, all in parameters.
    Http::Response getByUri(const QByteArray& parameters, const QByteArray& accept = "*/*")
    {
        return get("wado?" + parameters, accept);
    }

    /// The parts of a multipart answer: header lines and body.
    using Parts = QVector<std::pair<QByteArray, QByteArray>>;
    static Parts partsOf(const Http::Response& response)
    {
        const QByteArray type = headerOf(response, "Content-Type");
        const QByteArray mark = "--" + type.mid(type.indexOf("boundary=") + 9);
        const QByteArray body = bodyOf(response);
        Parts parts;
        for (int at = body.indexOf(mark + "\r\n"); at >= 0;) {
            const int next = body.indexOf(mark, at + 1);
            const int head = body.indexOf("\r\n\r\n", at);
            parts.append({body.mid(at + mark.size() + 2, head - at - mark.size() - 2),
                          body.mid(head + 4, next - head - 6)});
            at = body.mid(next + mark.size(), 2) == "--" ? -1 : next;
        }
        return parts;
    }

    static QByteArray nameIn(const QByteArray& dicom, const DcmTagKey& key = DCM_PatientName)
    {
        DcmFileFormat file;
        OFString value;
        if (readDicomBuffer(dicom, file).bad())
            return "unreadable: " + dicom.left(60);
        file.getDataset()->findAndGetOFString(key, value);
        return QByteArray::fromStdString(value);
    }

    TemporaryStore mStore;
    std::shared_ptr<StudyShelf> mStudies =
        std::make_shared<StudyShelf>(1 << 26, std::chrono::nanoseconds(-1'000'000'000));
    std::shared_ptr<ObjectShelf> mObjects = std::make_shared<ObjectShelf>(1 << 20);
    std::vector<std::unique_ptr<Resource>> mResources;
};

}  // namespace Kdd::DicomWeb
