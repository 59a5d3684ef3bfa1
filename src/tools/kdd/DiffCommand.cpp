#include "tools/kdd/AttributeText.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QFileInfo>
#include <QJsonArray>

#include <kddlib/AttributeDifference.h>
#include <kddlib/DicomInput.h>
#include <kddlib/LogFile.h>
#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct DiffRequest
{
    QString left;
    QString right;
};

// The first bytes of every tag file.
constexpr char kTagFileMagic[] = "TaCa";

bool isTagFile(const QString& path)
{
    QFile file(path);
    // By what it begins with: copies of tag files may have any name.
    return file.open(QIODevice::ReadOnly) && file.read(4) == kTagFileMagic;
}

/// Reads what the user names: a tag file, a DICOM file, or a study of the store.
bool readNamed(const QString& name, TagFile& file)
{
    // A file goes before a study of the same name.
    if (!QFileInfo(name).isFile())
        return readStudy(name.toLocal8Bit(), file);
    if (isTagFile(name))
        return readTagFile(name, file);
    const QByteArray path = name.toLocal8Bit();
    // What is left out of a damaged file would show as a difference.
    DicomInput input = readDicomInput(path, Damage::Refused);
    // Into an empty study, of which it is then the only image.
    if (input.kind == DicomInput::Kind::Image)
        return file.addTagMap(input.map.release(), path.constData(), true) != nullptr;
    LogFile::errorf("Could not load %s: %s", qUtf8Printable(name), qUtf8Printable(input.reason));
    return false;
}

/// What is printed of a difference.
struct DiffLine
{
    QByteArray path;  ///< "(0008,1140)[0].(0008,1150)"
    QByteArray name;  ///< the dictionary's keyword; empty when it has none
    QByteArray left;  ///< "UI [1.2.3]", or "-" where the node has no such attribute
    QByteArray right;
};

/// The value as a difference shows it. Sequences and omitted values have none to show.
QByteArray describe(const TagMap* node, const DcmTagKey& key)
{
    if (node == nullptr)
        return "-";
    const TagElement& element = *node->findElement(key);
    if (element.isSequence())
        return "SQ of " + QByteArray::number(static_cast<const TagSequence&>(element).numItems()) + " items";
    if (element.markedAsOmitted())
        return "omitted";
    QByteArray text;
    node->findAndGetString(key, text);
    return QByteArray(vrName(element.vr())) + " [" + text + ']';
}

DiffLine lineOf(const AttributeDifference& difference)
{
    // A private name needs the creator, which stands where the attribute does.
    const TagMap& named = difference.left != nullptr ? *difference.left : *difference.right;
    return {difference.path + keyText(difference.key), keywordOf(named, difference.key),
            describe(difference.left, difference.key), describe(difference.right, difference.key)};
}

class Comparison
{
public:
    explicit Comparison(const GlobalOptions& options)
        : mOptions(options)
    {
    }

    /// Image by image, with what each inherits: where a value is stored makes no difference.
    void compare(const TagFile& left, const TagFile& right)
    {
        const auto& mine = left.imagesByUID();
        const auto& theirs = right.imagesByUID();
        // Two single images are meant to be compared even when they do not bear the same UID.
        if (mine.size() == 1 && theirs.size() == 1) {
            compareImages(mine.firstKey(), *mine.first(), *theirs.first());
            return;
        }
        for (auto it = mine.cbegin(); it != mine.cend(); ++it) {
            if (const TagMap* other = theirs.value(it.key(), nullptr))
                compareImages(it.key(), *it.value(), *other);
            else
                tell(it.key(), {"", "", "image", "-"});
        }
        // What only the right side has.
        for (auto it = theirs.cbegin(); it != theirs.cend(); ++it) {
            if (!mine.contains(it.key()))
                tell(it.key(), {"", "", "-", "image"});
        }
    }

    Outcome report() const
    {
        if (mOptions.json)
            printJson({{QStringLiteral("differences"), mList}});
        else if (!mOptions.quiet)
            std::printf("%d differences\n", mCount);
        // A difference is a fault that was found.
        return mCount == 0 ? Outcome::Done : Outcome::Failed;
    }

private:
    void compareImages(const QByteArray& key, const TagMap& left, const TagMap& right)
    {
        compareNodes(left, right, [&](const AttributeDifference& difference) {
            tell(key, lineOf(difference));
            return true;
        });
    }

    void tell(const QByteArray& image, const DiffLine& difference)
    {
        ++mCount;
        if (mOptions.json) {
            // Kept until the end, since the result is one value.
            mList.append(QJsonObject{{QStringLiteral("image"), displayText(image)},
                                     {QStringLiteral("path"), displayText(difference.path)},
                                     {QStringLiteral("name"), displayText(difference.name)},
                                     {QStringLiteral("left"), displayText(difference.left)},
                                     {QStringLiteral("right"), displayText(difference.right)}});
            return;
        }
        std::printf("%s  %s %s: %s <> %s\n", qUtf8Printable(displayText(image)), difference.path.constData(),
                    difference.name.constData(), qUtf8Printable(displayText(difference.left)),
                    qUtf8Printable(displayText(difference.right)));
    }

    const GlobalOptions& mOptions;
    QJsonArray mList;
    int mCount = 0;
};

Outcome runDiff(const GlobalOptions& options, const QString& left, const QString& right)
{
    TagFile leftFile;
    TagFile rightFile;
    if (!readNamed(left, leftFile) || !readNamed(right, rightFile))
        return Outcome::Failed;
    Comparison comparison(options);
    comparison.compare(leftFile, rightFile);
    return comparison.report();
}

}  // namespace

void declareDiff(CommandSet& commands)
{
    const CommandText text = {
        "diff", kChecking, "Compare two studies or files attribute by attribute",
        "Either side is a study of the archive, a tag file or a DICOM file. Images are compared that bear "
        "the same UID; two single images in any case. The exit code is 1 when there is a difference.",
        "kdd diff 2.25.2062 2.25.2062\n"
        "kdd diff 2.25.2062 copy.tc             # a tag file, as of a backup"};
    const auto request = std::make_shared<DiffRequest>();
    ArgumentList arguments = commands.declare(text, [request](const GlobalOptions& options) {
        return runDiff(options, request->left, request->right);
    });
    arguments.path({"LEFT", kStudyOrFile, "Study UID, tag file or DICOM file", true}, request->left);
    arguments.path({"RIGHT", kStudyOrFile, "Study UID, tag file or DICOM file", true}, request->right);
}

}  // namespace Kdd
