// Reads one study from its tag file and says who was examined and how many images each series has.

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>
#include <kddlib/TextDecoding.h>

#include <cstdio>

namespace
{

QByteArray textOf(const Kdd::TagMap& node, const DcmTagKey& key)
{
    QByteArray characterSet;
    QByteArray text;
    node.findAndGetString(DCM_SpecificCharacterSet, characterSet);
    node.findAndGetString(key, text);
    return Kdd::decodeText(text, characterSet).toUtf8();
}

// A node shows what it inherits, too: a series the patient of its study, an image the modality of its series.
void print(const Kdd::TagFile& file)
{
    const Kdd::TagMap& study = *file.study();
    std::printf("%s: %d series, %d images\n", textOf(study, DCM_PatientName).constData(),
                file.seriesByUID().size(), file.imagesByUID().size());
    for (const Kdd::TagMap* series : study.children())
        std::printf("  %s, %d images, %s\n", textOf(*series, DCM_Modality).constData(),
                    series->children().size(), textOf(*series, DCM_SeriesInstanceUID).constData());
}

}  // namespace

int main(int argc, char* argv[])
{
    if (argc != 3) {
        std::fprintf(stderr, "usage: ReadStudy META_FOLDER STUDY_INSTANCE_UID\n");
        return 2;
    }
    Kdd::TagFile::setMetaFolder(argv[1]);
    Kdd::TagFile file;
    if (!file.readCacheFileForStudy(argv[2], false)) {
        std::fprintf(stderr, "Could not read study %s: %s\n", argv[2], qUtf8Printable(file.failure()));
        return 1;
    }
    print(file);
    return 0;
}
