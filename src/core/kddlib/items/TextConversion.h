#pragma once

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcspchrs.h>
#include <dcmtk/dcmdata/dcvr.h>

namespace Kdd
{

class TagMap;

/// How the texts of one image, which is exchanged as a whole, come to UTF-8. An image has one way for all of its texts:
/// converted together by the character set that it declares, or, where that does not explain one of them or items declare
/// sets of their own, each by itself as `decodeText` does. Texts that nobody can explain and nothing changes stay as they
/// are, with the sets that are declared.
///
/// A value to be thrown away with the image's text. Used by one thread at a time.
class TextConversion
{
public:
    enum class Way {
        Together,  ///< by the declared set
        Each,      ///< each by the set of its item, else by what it looks like
        AsStored,
    };
    static constexpr int kWays = 3;

    // What was met under way that decides whether it was the right one; bits.
    static constexpr unsigned int kUnexplained = 1;   ///< together: the declared set does not explain a text
    static constexpr unsigned int kItemDeclares = 2;  ///< together: an item has a set of its own
    static constexpr unsigned int kChanged = 4;       ///< each: a text is another one now

    /// By the character set that the image shows.
    explicit TextConversion(const TagMap& image);

    /// Whether another image can be converted by this object.
    bool isFor(const TagMap& image) const;

    Way way() const { return mWay; }

    /// Begins with the next image.
    void restart()
    {
        mWay = Way::Together;
        mHasTriedTogether = false;
    }

    /// The way to try after the present one, of which an image had these findings; false when that was the right one.
    /// The first is `Together`.
    bool nextWay(unsigned int findings);

    /// Whether texts of a VR are in the declared character set.
    static bool concerns(DcmEVR vr);

    /// Of the image itself.
    const QByteArray& characterSet() const { return mCharacterSet; }

    /// Of an item, where those above have the one given.
    QByteArray characterSetOf(const TagMap& item, const QByteArray& above) const;

    /// Whether texts of nothing but printable ASCII, declared to be in that set, stay as they are.
    bool keepsAscii(const QByteArray& characterSet) const;

    /// Converts a value of a text VR and tells what was found.
    unsigned int convert(QByteArray& value, DcmEVR vr, const QByteArray& characterSet);

    /// Found before anything is converted.
    unsigned int findings() const { return mWay == Way::Together && !mIsSelected ? kUnexplained : 0; }

private:
    QByteArray mStored;  // bytes of Specific Character Set
    QByteArray mCharacterSet;
    DcmSpecificCharacterSet mConverter;
    Way mWay = Way::Together;
    bool convertTogether(QByteArray& value, DcmEVR vr);

    bool mIsUtf8 = false;
    bool mIsSelected = false;
    bool mReplacesAscii = false;
    bool mHasTriedTogether = false;
    unsigned int mTogether = 0;  // findings on that way
};

}  // namespace Kdd
