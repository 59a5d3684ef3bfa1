#pragma once

#include "kddlib/items/AttributeForm.h"
#include "kddlib/items/TextConversion.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/dcmdata/dctagkey.h>

#include <array>
#include <memory>

namespace Kdd
{

class TagElement;
class TagMap;
class TagSequence;

/// Writes nodes of one tree in a form. What the images of a series show alike, which is most of it, is written down once
/// for the series and then copied, with the address of each image's own bulk data set in.
///
/// The tree must not change while it is written. Used by one thread at a time.
class ImageWriter
{
public:
    enum class Entries { Merged, Own };

    /// With keys, sorted, only these attributes of a node are written, with all that they hold.
    ImageWriter(const AttributeForm& form, QVector<DcmTagKey> wanted);
    ~ImageWriter();

    /// Appends a node; `root` comes before the keys in the addresses of its omitted values, with "/" between.
    void append(QByteArray& out, const TagMap& node, const QByteArray& root, Entries entries);

private:
    /// An attribute in a text: which, where it ends, and what the conversion of its texts met.
    struct Chunk
    {
        DcmTagKey key;
        int end;
        unsigned int findings;
    };

    /// What a node and those above it show.
    struct NodeText
    {
        const TagMap* node = nullptr;
        QByteArray text;
        QVector<Chunk> chunks;
        QVector<int> holes;  // places in the text where an image's address goes
        unsigned int findings = 0;
    };

    /// Of the series, and of the study.
    using Above = std::array<NodeText, 2>;

    /// Where attributes go: into a text to be copied, or after the address into an image's own.
    struct Target
    {
        QByteArray& text;
        NodeText* record;        // null for an image
        const QByteArray* root;  // null for a text to be copied
        unsigned int findings;
    };

    /// Where attributes are written: the keys and item numbers that lead there, and the character set of the texts
    /// there.
    struct Place
    {
        QByteArray path;
        QByteArray characterSet;
    };

    bool isWanted(const DcmTagKey& key) const;
    void forgetAbove();
    const NodeText* textAbove(const TagMap& node, int level);
    void write(Target& target, const TagMap& node, const NodeText* above);
    unsigned int appendOnce(QByteArray& out, const TagMap& node, const QByteArray& root, Entries entries);
    void writeEntries(Target& target, const TagMap& node);

    /// Copies the attributes from `chunk` on whose keys are smaller; the first that is not.
    static int copyBelow(Target& target, const NodeText& above, int chunk, const DcmTagKey& key);
    static void copy(Target& target, const NodeText& above, int begin, int end);

    void attribute(Target& target, const TagMap& node, const DcmTagKey& key, const TagElement& element,
                   const Place& place);
    void value(Target& target, const AttributeName& name, const TagElement& element, const Place& place);
    void omitted(Target& target, const AttributeName& name, const Place& place) const;
    void sequence(Target& target, const AttributeName& name, const TagSequence& sequence, const Place& place);
    void entry(Target& target, const TagMap& item, const DcmTagKey& key, const TagElement& element,
               const Place& place);
    void entries(Target& target, const TagMap& item, const Place& place);

    const AttributeForm& mForm;
    QVector<DcmTagKey> mWanted;
    Entries mEntries = Entries::Merged;
    std::unique_ptr<TextConversion> mConversion;
    Above mAbove[TextConversion::kWays];  // as each way gives it
};

}  // namespace Kdd
