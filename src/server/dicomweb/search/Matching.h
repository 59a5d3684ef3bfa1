#pragma once

#include "server/dicomweb/search/SearchRequest.h"

#include <QStringList>

namespace Kdd
{
class TagMap;
}

namespace Kdd::DicomWeb
{

/// Where values are read that conditions are held against.
class AttributeSource
{
public:
    virtual ~AttributeSource() = default;

    /// The values of an attribute, in the items of all sequences that lead to it; person names with their groups.
    virtual QStringList values(const QVector<DcmTagKey>& path) const = 0;
};

/// Of a study or series, as the database keeps them.
class KeptAttributes : public AttributeSource
{
public:
    /// `lines` as in Kxg::StudySearchRecord; they must outlive the object.
    explicit KeptAttributes(const QByteArray& lines)
        : mLines(lines)
    {
    }
    QStringList values(const QVector<DcmTagKey>& path) const override;

private:
    const QByteArray& mLines;
};

/// Of an image, with all that it inherits.
class ImageAttributes : public AttributeSource
{
public:
    /// The image must outlive the object.
    explicit ImageAttributes(const TagMap& image)
        : mImage(image)
    {
    }
    QStringList values(const QVector<DcmTagKey>& path) const override;

private:
    const TagMap& mImage;
};

using Conditions = std::vector<const SearchCondition*>;

/// Whether all hold. A range of dates and one of times that belong together are one range of moments. With `zone`
/// [minutes east of UTC] dates and times that the source has in another zone are moved into that one.
bool holdAll(const Conditions& conditions, const AttributeSource& source, std::optional<int> zone);

/// Whether the condition lets everything pass, as "*" does.
bool isUniversal(const SearchCondition& condition);

bool hasWildcard(const QString& text);

/// Whether texts of this VR are compared by wildcards.
bool takesWildcards(DcmEVR vr);

/// A range of dates, times or moments, either end of which may be open.
struct ValueRange
{
    QByteArray from;
    QByteArray to;
    bool isRange = false;  ///< else one value, whose precision makes the ends
};

/// Of a DA or TM value in the form of Kxg::searchDate and Kxg::searchTime. False when it is none.
bool parseRange(DcmEVR vr, const QString& text, ValueRange& range);

/// The attribute of the time that belongs to a date; false when there is none.
bool timeOfDate(const DcmTagKey& date, DcmTagKey& time);

}  // namespace Kdd::DicomWeb
