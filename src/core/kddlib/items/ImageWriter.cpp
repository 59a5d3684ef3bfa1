#include "kddlib/items/ImageWriter.h"

#include "kddlib/items/AttributeValues.h"
#include "kddlib/items/KeyDigits.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <utility>

namespace Kdd
{

namespace
{

constexpr Uint16 kOwnGroup = 0x0006;

using Way = TextConversion::Way;

bool isAsciiText(const QByteArray& bytes)
{
    return std::all_of(bytes.begin(), bytes.end(), [](char c) { return c >= ' ' && c <= '~'; });
}

/// Others are markers, or nothing that an attribute of a file can be.
bool hasValues(VrCode code)
{
    switch (code) {
    case VrCode::Lt:
    case VrCode::Ox:
    case VrCode::UN:
    case VrCode::Up:
    case VrCode::Xs:
        return true;
    default:
        return code <= VrCode::UT && code != VrCode::SQ;
    }
}

/// Calls `visit(key, element)` for what a node shows, or for what it holds itself.
template <typename Visit>
void forEntries(const TagMap& node, bool own, const Visit& visit)
{
    if (own) {
        const TagMap::Tags& tags = node.tagsForLevel();
        for (auto at = tags.cbegin(); at != tags.cend(); ++at)
            visit(at.key(), *at.value());
        return;
    }
    const TagMap::iterator end = node.end();
    for (TagMap::iterator at = node.begin(); at != end; ++at)
        visit(at.key(), *at.value());
}

}  // namespace

ImageWriter::ImageWriter(const AttributeForm& form, QVector<DcmTagKey> wanted)
    : mForm(form)
    , mWanted(std::move(wanted))
{
}

ImageWriter::~ImageWriter() = default;

bool ImageWriter::isWanted(const DcmTagKey& key) const
{
    return key.getGroup() != kOwnGroup &&
           (mWanted.isEmpty() || std::binary_search(mWanted.begin(), mWanted.end(), key));
}

void ImageWriter::forgetAbove()
{
    for (Above& texts : mAbove) {
        for (NodeText& text : texts)
            text.node = nullptr;
    }
}

void ImageWriter::append(QByteArray& out, const TagMap& node, const QByteArray& root, Entries entries)
{
    if (mConversion == nullptr || !mConversion->isFor(node)) {
        mConversion = std::make_unique<TextConversion>(node);
        forgetAbove();
    }
    mConversion->restart();
    const int begin = out.size();
    unsigned int findings = 0;
    do {
        out.truncate(begin);
        findings = appendOnce(out, node, root, Entries::Merged);
    } while (mConversion->nextWay(findings));
    if (entries == Entries::Merged)
        return;
    // How its texts are converted goes by all that the node shows.
    out.truncate(begin);
    appendOnce(out, node, root, entries);
}

unsigned int ImageWriter::appendOnce(QByteArray& out, const TagMap& node, const QByteArray& root,
                                     Entries entries)
{
    const QByteArray address = mForm.addressPart(root);
    mForm.beginImage(out);
    const int begin = out.size();
    Target target{out, nullptr, &address, mConversion->findings()};
    mEntries = entries;
    // A creator may be an image's own where the values in its block are shared.
    if (entries == Entries::Merged && !mForm.showsCreators())
        write(target, node, textAbove(node, 0));
    else
        writeEntries(target, node);
    mForm.endImage(out, begin);
    return target.findings;
}

/// The text of what is above a node; null when nothing is.
const ImageWriter::NodeText* ImageWriter::textAbove(const TagMap& node, int level)
{
    const TagMap* parent = node.parent();
    Above& texts = mAbove[static_cast<int>(mConversion->way())];
    if (parent == nullptr || level >= static_cast<int>(texts.size()))
        return nullptr;
    NodeText& above = texts[static_cast<std::size_t>(level)];
    if (above.node == parent)
        return &above;
    const NodeText* further = textAbove(*parent, level + 1);
    above = {};
    Target target{above.text, &above, nullptr, 0};
    write(target, *parent, further);
    for (const Chunk& chunk : qAsConst(above.chunks))
        above.findings |= chunk.findings;
    above.node = parent;
    return &above;
}

/// All that a node shows, from what it holds itself and the text of what is above it.
void ImageWriter::write(Target& target, const TagMap& node, const NodeText* above)
{
    static const NodeText nothing;
    const NodeText& shared = above != nullptr ? *above : nothing;
    // What is converted declares UTF-8 even where it declared nothing; that is no entry of any node's text.
    bool isDeclared = target.record != nullptr || mConversion->way() == Way::AsStored;
    const Place place{{}, mConversion->characterSet()};
    int chunk = 0;
    const auto declare = [&] {
        chunk = copyBelow(target, shared, chunk, DCM_SpecificCharacterSet);
        mForm.declareUtf8(target.text);
        isDeclared = true;
    };
    const TagMap::Tags& own = node.tagsForLevel();
    for (auto at = own.cbegin(); at != own.cend(); ++at) {
        const DcmTagKey& key = at.key();
        if (!isDeclared && DCM_SpecificCharacterSet < key)
            declare();
        chunk = copyBelow(target, shared, chunk, key);
        if (chunk < shared.chunks.size() && shared.chunks.at(chunk).key == key)
            ++chunk;
        const bool isDeclaration = key == DCM_SpecificCharacterSet && mConversion->way() != Way::AsStored;
        if (isWanted(key) && !isDeclaration)
            attribute(target, node, key, *at.value(), place);
    }
    if (!isDeclared)
        declare();
    copy(target, shared, chunk, shared.chunks.size());
}

/// The same entry by entry, where what is above cannot be copied.
void ImageWriter::writeEntries(Target& target, const TagMap& node)
{
    const Place place{{}, mConversion->characterSet()};
    bool isDeclared = mConversion->way() == Way::AsStored ||
                      (mEntries == Entries::Own && !node.tagsForLevel().contains(DCM_SpecificCharacterSet));
    const auto write = [&](const DcmTagKey& key, const TagElement& element) {
        if (!isDeclared && !(key < DCM_SpecificCharacterSet))
            mForm.declareUtf8(target.text);
        isDeclared = isDeclared || !(key < DCM_SpecificCharacterSet);
        const bool isDeclaration = key == DCM_SpecificCharacterSet && mConversion->way() != Way::AsStored;
        if (isWanted(key) && !isDeclaration)
            attribute(target, node, key, element, place);
    };
    forEntries(node, mEntries == Entries::Own, write);
    if (!isDeclared)
        mForm.declareUtf8(target.text);
}

int ImageWriter::copyBelow(Target& target, const NodeText& above, int chunk, const DcmTagKey& key)
{
    int end = chunk;
    while (end < above.chunks.size() && above.chunks.at(end).key < key)
        ++end;
    copy(target, above, chunk, end);
    return end;
}

void ImageWriter::copy(Target& target, const NodeText& above, int begin, int end)
{
    if (begin == end)
        return;
    int from = begin > 0 ? above.chunks.at(begin - 1).end : 0;
    const int to = above.chunks.at(end - 1).end;
    const int shift = target.text.size() - from;
    if (target.record != nullptr) {
        for (int i = begin; i < end; ++i) {
            const Chunk& chunk = above.chunks.at(i);
            target.record->chunks.append({chunk.key, chunk.end + shift, chunk.findings});
        }
    }
    if (target.record == nullptr && above.findings != 0) {
        for (int i = begin; i < end; ++i)
            target.findings |= above.chunks.at(i).findings;
    }
    auto hole = std::lower_bound(above.holes.begin(), above.holes.end(), from);
    for (; hole != above.holes.end() && *hole < to; ++hole) {
        if (target.record != nullptr) {
            target.record->holes.append(*hole + shift);
            continue;
        }
        target.text.append(above.text.constData() + from, *hole - from).append(*target.root);
        from = *hole;
    }
    target.text.append(above.text.constData() + from, to - from);
}

void ImageWriter::attribute(Target& target, const TagMap& node, const DcmTagKey& key,
                            const TagElement& element, const Place& place)
{
    if (element.markedAsMissing())
        return;
    const unsigned int former = std::exchange(target.findings, 0);
    const bool hasCreator = mForm.showsCreators() && (key.getGroup() & 1) != 0 && key.getElement() > 0xff;
    const char* const creator = hasCreator ? node.privateCreator(key) : nullptr;
    if (element.markedAsOmitted())
        omitted(target, {key, creator}, place);
    else if (element.isSequence())
        sequence(target, {key, creator}, static_cast<const TagSequence&>(element), place);
    else
        value(target, {key, creator}, element, place);
    if (target.record != nullptr && place.path.isEmpty())
        target.record->chunks.append({key, target.text.size(), std::exchange(target.findings, 0)});
    target.findings |= former;
}

void ImageWriter::value(Target& target, const AttributeName& name, const TagElement& element,
                        const Place& place)
{
    if (!hasValues(element.vr()))
        return;
    const DcmEVR vr = evrOf(element.vr(), name.key);
    const bool isKept = !isTextVr(element.vr()) ||
                        (isAsciiText(element.value()) &&
                         (!TextConversion::concerns(vr) || mConversion->keepsAscii(place.characterSet)));
    QByteArray value = element.value();
    if (!isKept)
        target.findings |= mConversion->convert(value, vr, place.characterSet);
    appendAttribute(target.text, mForm, name, vr, value);
}

void ImageWriter::omitted(Target& target, const AttributeName& name, const Place& place) const
{
    // The value's own VR went with it.
    mForm.beginValues(target.text, name, DcmVR(dictionaryEvr(name.key)).getValidVRName());
    mForm.beginAddress(target.text);
    if (target.root != nullptr)
        target.text.append(*target.root);
    else
        target.record->holes.append(target.text.size());
    target.text.append(place.path).append('/').append(keyDigits(name.key));
    mForm.endAddress(target.text);
    mForm.endValues(target.text, 0);
}

void ImageWriter::sequence(Target& target, const AttributeName& name, const TagSequence& sequence,
                           const Place& place)
{
    mForm.beginSequence(target.text, name);
    const QByteArray path = place.path + '/' + keyDigits(name.key) + '/';
    for (int i = 0; i < sequence.numItems(); ++i) {
        const TagMap& item = sequence.itemToRead(i);
        mForm.beginItem(target.text, i);
        const int begin = target.text.size();
        entries(target, item,
                {path + QByteArray::number(i), mConversion->characterSetOf(item, place.characterSet)});
        mForm.endItem(target.text, begin);
    }
    mForm.endSequence(target.text, sequence.numItems());
}

void ImageWriter::entries(Target& target, const TagMap& item, const Place& place)
{
    forEntries(item, mEntries == Entries::Own, [&](const DcmTagKey& key, const TagElement& element) {
        entry(target, item, key, element, place);
    });
}

void ImageWriter::entry(Target& target, const TagMap& item, const DcmTagKey& key, const TagElement& element,
                        const Place& place)
{
    if (key.getGroup() == kOwnGroup || element.markedAsMissing())
        return;
    if (key != DCM_SpecificCharacterSet || mConversion->way() == Way::AsStored) {
        attribute(target, item, key, element, place);
        return;
    }
    if (mConversion->way() == Way::Together)
        target.findings |= TextConversion::kItemDeclares;
    mForm.declareUtf8(target.text);
}

}  // namespace Kdd
