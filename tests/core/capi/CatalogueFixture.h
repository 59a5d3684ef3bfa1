#pragma once

#include "core/tagfile/ArchiveFixture.h"

namespace Kdd
{

/// Tag files and what the database knows, each without the other.
class CatalogueFixture : public ArchiveTest
{
protected:
    /// A tag file with images of one series, which has the study's UID with ".1".
    static void writeStudy(const char* study, const Uids& images)
    {
        TagFile file;
        for (const QByteArray& uid : images)
            file.addTagMap(image(uid.constData(), study).map(), nullptr, true);
        EXPECT_TRUE(file.writeCacheFile());
    }

    /// The same in the database.
    void registerImages(const char* study, const Uids& images)
    {
        for (const QByteArray& uid : images) {
            const std::unique_ptr<TagMap> map(image(uid.constData(), study).map());
            registerFiles({{fileRecord(*map, '/' + uid, {})}, {}, {}});
        }
    }
};

}  // namespace Kdd
