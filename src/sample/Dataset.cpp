#include "sample/Dataset.h"

#include "sample/Fault.h"

#include <QByteArrayList>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcelem.h>
#include <dcmtk/dcmdata/dcitem.h>

#include <memory>

namespace Kdd
{

namespace
{

// These are placeholders for a choice between representations; a file has to say which one it is.
bool isUndecided(DcmEVR vr)
{
    return vr == EVR_xs || vr == EVR_ox || vr == EVR_lt || vr == EVR_px || vr == EVR_up || vr == EVR_UNKNOWN;
}

void check(const OFCondition& condition, const DcmTag& tag, const QByteArray& value)
{
    if (condition.good())
        return;
    // Only the head of the value is told, for some are long.
    throw SampleFault(QStringLiteral("The attribute %1 cannot take the value \"%2\": %3")
                          .arg(QString::fromLatin1(tag.toString().c_str()),
                               QString::fromLatin1(value.left(64)), QString::fromLatin1(condition.text())));
}

std::unique_ptr<DcmElement> newElement(const DcmTag& tag, const QByteArray& value)
{
    check(isUndecided(tag.getEVR()) ? OFCondition(EC_InvalidVR) : EC_Normal, tag, value);
    DcmElement* element = nullptr;
    check(DcmItem::newDicomElementWithVR(element, tag), tag, value);
    return std::unique_ptr<DcmElement>(element);
}

void insert(DcmItem& into, std::unique_ptr<DcmElement> element)
{
    const DcmTag tag = element->getTag();
    // Replaces an earlier value, as the header promises.
    check(into.insert(element.get(), OFTrue), tag, "element");
    // The item owns the element once it has taken it.
    static_cast<void>(element.release());
}

}  // namespace

SampleDataset& SampleDataset::with(const DcmTag& tag, const QByteArray& value)
{
    auto element = newElement(tag, value);
    check(element->putString(value.constData(), static_cast<Uint32>(value.size())), tag, value);
    insert(*mItem, std::move(element));
    return *this;
}

SampleDataset& SampleDataset::with(const DcmTag& tag, int value)
{
    return with(tag, QByteArray::number(value));
}

SampleDataset& SampleDataset::with(const SampleAttribute& row)
{
    return with(row.vr == EVR_UNKNOWN ? DcmTag(row.key) : DcmTag(row.key, row.vr), row.value);
}

SampleDataset& SampleDataset::withBytes(const DcmTag& tag, const QByteArray& bytes)
{
    auto element = newElement(tag, "bytes");
    const auto* from = reinterpret_cast<const Uint8*>(bytes.constData());
    check(element->putUint8Array(from, static_cast<unsigned long>(bytes.size())), tag, "bytes");
    insert(*mItem, std::move(element));
    return *this;
}

SampleDataset& SampleDataset::withWords(const DcmTag& tag, const QVector<Uint16>& words)
{
    auto element = newElement(tag, "words");
    check(element->putUint16Array(words.constData(), static_cast<unsigned long>(words.size())), tag, "words");
    insert(*mItem, std::move(element));
    return *this;
}

SampleDataset& SampleDataset::withCode(const DcmTag& sequence, const SampleCode& code)
{
    item(sequence)
        .with(DCM_CodeValue, code.value)
        .with(DCM_CodingSchemeDesignator, code.scheme)
        .with(DCM_CodeMeaning, code.meaning);
    return *this;
}

DcmTag SampleDataset::privateTag(Uint16 group, Uint8 element, DcmEVR vr)
{
    // The block that the creator has reserved is the first, 10.
    return {group, static_cast<Uint16>(0x1000 + element), vr};
}

SampleDataset SampleDataset::item(const DcmTag& sequence)
{
    DcmItem* item = nullptr;
    // -2 asks for a new item at the end.
    check(mItem->findOrCreateSequenceItem(sequence, item, -2), sequence, "item");
    return SampleDataset(*item);
}

QByteArray decimal(double value, int digits)
{
    return QByteArray::number(value, 'f', digits);
}

QByteArray decimals(const QVector<double>& values, int digits)
{
    QByteArrayList texts;
    for (const double value : values)
        texts.append(decimal(value, digits));
    return texts.join('\\');
}

}  // namespace Kdd
