#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/database/Catalogue.h"
#include "platform/database/Kxg.h"
#include "support/DatasetBuilder.h"
#include "support/TemporaryStore.h"

#include <gtest/gtest.h>

#include <memory>
#include <vector>

namespace Kdd
{

/// A store of tag files and an empty image database beside it, which all questions go to.
class CatalogueFixture : public testing::Test
{
protected:
    CatalogueFixture()
    {
        Result result;
        mCatalogue = Kxg::Catalogue::open(mAddress, result);
        EXPECT_TRUE(result.good());
        Kxg::SetDatabaseServer(mAddress);
    }

    /// A tag file with images of one series, which has the study's UID with ".3".
    static void writeStudy(const QByteArray& study, const std::vector<QByteArray>& images)
    {
        TagFile file;
        for (const QByteArray& uid : images) {
            const QByteArray series = study + ".3";
            file.addTagMap(anImage(uid).inStudy(study).inSeries(series).map(), nullptr, true);
        }
        EXPECT_TRUE(file.writeCacheFile());
    }

    /// The same in the database.
    void registerImages(const QByteArray& study, const std::vector<QByteArray>& images)
    {
        Kxg::FileRecords files;
        for (const QByteArray& uid : images) {
            Kxg::DicomFileRecord image;
            image.path = '/' + study + '/' + uid;
            image.studyInstanceUID = study;
            image.seriesInstanceUID = study + ".3";
            image.sopInstanceUID = uid;
            files.dicom.push_back(image);
        }
        QMap<QByteArray, qint64> requests;
        EXPECT_TRUE(mCatalogue->registerFiles(files, requests).good());
    }

    /// None when there is no such tag file.
    static QList<QByteArray> imagesInFile(const QByteArray& study)
    {
        TagFile file;
        return file.readCacheFileForStudy(study, false) ? file.imagesByUID().keys() : QList<QByteArray>();
    }

    TemporaryStore mStore;
    QByteArray mAddress = "sqlite:" + mStore.filePath("catalogue.db").toUtf8();
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
};

}  // namespace Kdd
