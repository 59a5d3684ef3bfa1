#pragma once

#include "kddlib/tagmodel/EncodedElements.h"

namespace Kdd
{

/// The body of a tag file, in which nodes stay as they are until they are looked into. The place of a node's elements is
/// that of their length.
class StudyBody : public EncodedElements
{
public:
    /// The bytes must not be borrowed.
    explicit StudyBody(const QByteArray& body)
        : mBody(body)
    {
        // It stays for as long as any of its nodes, and one that was read in pieces may have got twice the room.
        if (mBody.capacity() > mBody.size())
            mBody.squeeze();
    }

    /// Whether the elements at `place`, of a node that hangs below `parent`, may stay there: nothing about them is
    /// damaged, they are at most `maxElements` nodes, items and elements, the writer would write them just so again, and
    /// none of their items inherits. Only what may stay is asked for by the others. How many they are, or 0.
    int countPlain(int place, const TagMap& parent, int maxElements) const;

    void decode(int place, TagMap& node) const override;
    bool find(int place, const DcmTagKey& key, Value& value) const override;
    void visit(int place, const Visit& visit) const override;
    QByteArray record(int place, int& count) const override;

private:
    QByteArray mBody;
};

}  // namespace Kdd
