#pragma once

#include "kddlib/tagmodel/VrCode.h"

#include <QByteArray>
#include <QSharedData>

#include <functional>

class DcmTagKey;

namespace Kdd
{

class TagMap;

/// What nodes hold themselves as it stands in the bytes that they were read from. Nearly all nodes of a study that is read
/// are never looked into, so they stay as they are until somebody asks for an element; what only reads a value, or goes
/// through those of all nodes, takes it from here. What the bytes mean only the room above knows, so it makes these.
///
/// A node is named by the place of its elements. Nothing changes once it is made, so any number of threads may ask at the
/// same time. Shared by the nodes that were read together, and gone with the last one that is encoded.
class EncodedElements : public QSharedData
{
public:
    using Pointer = QExplicitlySharedDataPointer<const EncodedElements>;

    /// A value where it stands, as long as this object; a sequence and the markers have no bytes here.
    struct Value
    {
        VrCode vr;
        const char* bytes;
        int size;  // [bytes]
    };

    /// Given the key as one number, group first.
    using Visit = std::function<void(quint32 key, const Value& value)>;

    EncodedElements() = default;
    EncodedElements(const EncodedElements&) = delete;
    EncodedElements& operator=(const EncodedElements&) = delete;
    virtual ~EncodedElements() = default;

    /// Puts the elements into an empty node. Items of their sequences hang nowhere.
    virtual void decode(int place, TagMap& node) const = 0;

    /// False when the node does not hold the key itself.
    virtual bool find(int place, const DcmTagKey& key, Value& value) const = 0;

    /// In the order of their keys.
    virtual void visit(int place, const Visit& visit) const = 0;

    /// The bytes themselves, valid as long as this object; `count` receives how many nodes, items and elements they are.
    virtual QByteArray record(int place, int& count) const = 0;
};

/// A key as one number, in the order of keys.
quint32 packedKey(const DcmTagKey& key);
DcmTagKey unpackedKey(quint32 key);

}  // namespace Kdd
