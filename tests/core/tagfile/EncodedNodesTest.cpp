#include "TagFileFixture.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/RandomImages.h"
#include "support/Threads.h"

using namespace Kdd;

namespace
{

constexpr int kImages = 12;

QByteArray uidOf(int image)
{
    return "1.2.3." + QByteArray::number(image);
}

/// A study that was just read, and what is told of what is asked there.
struct Asked
{
    TagFile file;
    std::string answer;

    TagMap* image(int number) const { return file.findImage(uidOf(number)); }
    TagMap* series() const { return file.seriesByUID().first(); }
};

void askAll(Asked& asked)
{
    for (const TagMap* image : asked.file.imagesByUID()) {
        for (const DcmTagKey& key : {DCM_SOPInstanceUID, DCM_StudyDescription, DCM_SmallestImagePixelValue,
                                     DCM_RequestAttributesSequence, DcmTagKey(0x0009, 0x1001), kPreview}) {
            QByteArray text = "none";
            int number = -1;
            const bool isNumber = image->findAndGetInt(key, number);
            image->findAndGetString(key, text);
            asked.answer += text.toStdString() + (isNumber ? " is " : " no ") + std::to_string(number) + '\n';
        }
        asked.answer += image->uid(TagMap::ImageLevel).toStdString() + filePathOf(*image).toStdString();
    }
}

void replaceImage(Asked& asked)
{
    TagMap* image = anImage(uidOf(3)).with(DCM_StudyDescription, "AB").map();
    asked.file.addTagMap(image, nullptr, true);
}

/// A sequence comes above images that have had theirs alone.
void holdSequences(Asked& asked)
{
    for (const DcmTagKey& key : kSequenceKeys) {
        auto sequence = std::make_unique<TagSequence>();
        sequence->addItem(anItem().with(DCM_CodeValue, "above").map());
        asked.series()->putElement(key, sequence.release());
    }
    asked.file.study()->relinkItems();
}

void merge(Asked& asked)
{
    ASSERT_TRUE(asked.file.writeCacheFile());
    asked.file.clear();
    replaceImage(asked);
    ASSERT_TRUE(asked.file.mergeIntoCacheFile());
}

using Operation = void (*)(Asked& asked);

const Operation kOperations[] = {
    [](Asked&) {},
    askAll,
    replaceImage,
    holdSequences,
    merge,
    [](Asked& asked) { asked.file.optimizeAll(); },
    [](Asked& asked) { asked.series()->optimize(DCM_StudyDescription); },
    [](Asked& asked) { asked.series()->storeOptionA(DCM_StudyDescription); },
    [](Asked& asked) { asked.series()->storeOptionB(DCM_StudyDescription, VrCode::LO, "AB"); },
    [](Asked& asked) { asked.answer = shownText(*std::unique_ptr<TagMap>(asked.file.takeImage(uidOf(1)))); },
    [](Asked& asked) { asked.series()->detachItems(); },
    [](Asked& asked) { asked.image(2)->detachItems(); },
    [](Asked& asked) { asked.image(2)->deleteElement(DCM_StudyDescription); },
    [](Asked& asked) { delete asked.image(2)->tagsForLevel().take(kSequenceKeys[0]); },
    [](Asked& asked) { asked.answer = ownText(TagMap(*asked.image(4))); },
    [](Asked& asked) { asked.image(4)->putAndInsertString(DCM_SOPInstanceUID, "9"); },
    [](Asked& asked) { asked.file.study()->removeTagsNotNeededByClient(); },
    [](Asked& asked) { asked.file.createAbstractTags(); },
};

class EncodedNodes : public TagFileTest
{
protected:
    /// Optimised, and written with a path of its own for each image.
    QByteArray randomStudy(unsigned int seed)
    {
        RandomImages random(seed);
        TagFile file;
        for (int i = 0; i < kImages; ++i) {
            TagMap* image = file.addTagMap(random.next(uidOf(i)), nullptr, false);
            image->putAndInsertString(kFilePath, "/archive/" + uidOf(i));
        }
        file.optimizeAll();
        mShown = imagesText(file);
        return written(file);
    }

    std::string mShown;  // by the images of the study made last
};

/// What was never looked into comes out of everything as what was looked into before.
TEST_F(EncodedNodes, AreWhatTheyWouldBeDecoded)
{
    for (unsigned int seed = 1; seed < 30; ++seed) {
        const QByteArray content = randomStudy(seed);
        for (const Operation& operation : kOperations) {
            Asked encoded;
            Asked decoded;
            ASSERT_TRUE(read(encoded.file, content) && read(decoded.file, content));
            ASSERT_EQ(imagesText(decoded.file), mShown) << seed;
            operation(encoded);
            operation(decoded);
            ASSERT_EQ(encoded.answer, decoded.answer) << seed << ' ' << &operation - kOperations;
            ASSERT_EQ(written(encoded.file).toHex(), written(decoded.file).toHex())
                << seed << ' ' << &operation - kOperations;
            ASSERT_EQ(treeText(encoded.file), treeText(decoded.file)) << seed;
        }
    }
}

/// Whatever a reader takes is written in one form: keys in order and once, lengths as short as they can be.
TEST_F(EncodedNodes, ThatAreInAnotherFormAreWrittenInOurs)
{
    const QByteArray above = QByteArray::fromHex("00 0a00 20000d00 16 0300 312e32"
                                                 "01 0900 20000e00 16 0200 3973");
    const QByteArray uid = QByteArray::fromHex("08001800 16 0100 31");
    const QByteArray name = QByteArray::fromHex("10001000 0f 0100 41");
    const QByteArray ours = above + QByteArray::fromHex("02 1000") + uid + name;
    const QByteArray longName = QByteArray::fromHex("10001000 0f ffff01000000 41");
    const QByteArray others[] = {
        above + QByteArray::fromHex("02 1000") + name + uid,
        above + QByteArray::fromHex("02 1800") + uid + QByteArray::fromHex("10001000 0f 0100 42") + name,
        above + QByteArray::fromHex("02 1400") + uid + longName,
        above + QByteArray::fromHex("02 ffff10000000") + uid + name,
        ours,
    };
    for (const QByteArray& body : others) {
        TagFile file;
        ASSERT_TRUE(read(file, framed(body)));
        EXPECT_EQ(written(file).toHex(), framed(ours).toHex());
    }
}

TEST_F(EncodedNodes, AreDecodedOnceForSeveralThreads)
{
    const QByteArray content = randomStudy(7);
    for (int i = 0; i < 20; ++i) {
        TagFile file;
        ASSERT_TRUE(read(file, content));
        std::vector<std::string> texts(4);
        onThreads(4, [&](int thread) { texts[static_cast<std::size_t>(thread)] = imagesText(file); });
        EXPECT_EQ(texts, std::vector<std::string>(4, mShown));
    }
}

}  // namespace
