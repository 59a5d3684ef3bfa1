#pragma once

#include <QByteArray>
#include <QStringList>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

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

}  // namespace Kdd::DicomWeb
