#pragma once

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctag.h>

#include <cstddef>

class DcmItem;

namespace Kdd
{

/// One row of a table of attributes. The value is text, that of numbers and tags too: "1\\2", "(0018,1063)".
struct SampleAttribute
{
    DcmTagKey key;
    const char* value;
    DcmEVR vr = EVR_UNKNOWN;  // the dictionary's, unless given; needed where the dictionary allows several
};

/// One element of a private block; `element` is the low byte of its number.
struct SamplePrivate
{
    Uint8 element;
    DcmEVR vr;
    const char* value;
};

struct SampleCode
{
    const char* value;
    const char* scheme;
    const char* meaning;
};

/// Fills a dataset or a sequence item in a fluent way.
///
/// Only a view: the item given must outlive it. A later value of an attribute replaces the earlier one. Every
/// operation throws SampleFault, naming attribute and value, when the value does not suit the attribute.
class SampleDataset
{
public:
    explicit SampleDataset(DcmItem& item)
        : mItem(&item)
    {
    }

    SampleDataset& with(const DcmTag& tag, const QByteArray& value);
    SampleDataset& with(const DcmTag& tag, int value);
    SampleDataset& withBytes(const DcmTag& tag, const QByteArray& bytes);
    SampleDataset& withWords(const DcmTag& tag, const QVector<Uint16>& words);
    SampleDataset& withCode(const DcmTag& sequence, const SampleCode& code);

    template <std::size_t N>
    SampleDataset& withAll(const SampleAttribute (&rows)[N])
    {
        for (const SampleAttribute& row : rows)
            with(row);
        return *this;
    }

    /// Reserves (group,1000) to (group,10FF) for `creator` and fills what `rows` name.
    template <std::size_t N>
    SampleDataset& withPrivate(Uint16 group, const char* creator, const SamplePrivate (&rows)[N])
    {
        with(DcmTag(group, 0x0010, EVR_LO), creator);
        for (const SamplePrivate& row : rows)
            with(privateTag(group, row.element, row.vr), row.value);
        return *this;
    }

    static DcmTag privateTag(Uint16 group, Uint8 element, DcmEVR vr);

    /// Appends an item to a sequence, which is made when it is not there.
    SampleDataset item(const DcmTag& sequence);

private:
    SampleDataset& with(const SampleAttribute& row);

    DcmItem* mItem;
};

/// `value` with so many digits after the point, as decimal strings want it.
QByteArray decimal(double value, int digits);

/// "x\\y\\z"
QByteArray decimals(const QVector<double>& values, int digits);

}  // namespace Kdd
