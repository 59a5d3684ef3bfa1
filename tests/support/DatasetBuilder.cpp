#include "support/DatasetBuilder.h"

#include "kddlib/tagmodel/TagMap.h"
#include "support/FileContent.h"

#include <QFile>

#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>

#include <stdexcept>

namespace Kdd
{

DatasetBuilder::DatasetBuilder()
    : mDataset(std::make_shared<DcmDataset>())
{
}

DatasetBuilder::DatasetBuilder(const char* sopUID)
    : DatasetBuilder()
{
    with(DCM_SOPClassUID, UID_SecondaryCaptureImageStorage);
    with(DCM_SOPInstanceUID, sopUID);
    with(DCM_StudyInstanceUID, "1.2");
    with(DCM_SeriesInstanceUID, "1.2.3");
}

DatasetBuilder& DatasetBuilder::with(const DcmTag& tag, const char* value)
{
    if (mDataset->putAndInsertString(tag, value).bad())
        throw std::invalid_argument("the test's value does not fit its attribute");
    return *this;
}

DatasetBuilder& DatasetBuilder::with(const QByteArray& attributes)
{
    for (const QByteArray& attribute : attributes.split('|')) {
        const QByteArray name = attribute.split('=').front();
        DcmTag tag;
        if (DcmTag::findTagFromName(name.constData(), tag).bad())
            throw std::invalid_argument("the test names no attribute");
        with(tag, attribute.mid(name.size() + 1).constData());
    }
    return *this;
}

DatasetBuilder& DatasetBuilder::bytes(const std::vector<Uint8>& values, const DcmTagKey& key)
{
    mDataset->putAndInsertUint8Array(DcmTag(key, EVR_OB), values.data(), values.size());
    return *this;
}

DatasetBuilder& DatasetBuilder::words(const std::vector<Uint16>& values, const DcmTagKey& key)
{
    mDataset->putAndInsertUint16Array(DcmTag(key, EVR_OW), values.data(), values.size());
    return *this;
}

DatasetBuilder& DatasetBuilder::numbers(const DcmTagKey& key, const std::vector<Uint16>& values)
{
    mDataset->putAndInsertUint16Array(DcmTag(key, EVR_US), values.data(), values.size());
    return *this;
}

DatasetBuilder& DatasetBuilder::withLong(const DcmTag& tag, int length)
{
    return with(tag, QByteArray(length, 'x').constData());
}

DatasetBuilder& DatasetBuilder::fragments(E_TransferSyntax xfer, const std::vector<int>& sizes)
{
    QVector<QByteArray> parts;
    for (const int size : sizes)
        parts.append(QByteArray(size, 1));
    return fragments(xfer, parts);
}

DatasetBuilder& DatasetBuilder::fragments(E_TransferSyntax xfer, const QVector<QByteArray>& parts)
{
    auto* pixels = new DcmPixelData(DcmTag(DCM_PixelData, EVR_OB));
    pixels->putOriginalRepresentation(xfer, nullptr, sequenceOf(parts).release());
    return with(pixels);
}

DatasetBuilder& DatasetBuilder::data(const DcmTag& tag, const QByteArray& values)
{
    // Only pixel data of its own class is compressed.
    auto* element = tag == DCM_PixelData ? new DcmPixelData(tag) : new DcmOtherByteOtherWord(tag);
    element->putUint8Array(reinterpret_cast<const Uint8*>(values.constData()),
                           static_cast<unsigned long>(values.size()));
    return with(element);
}

DatasetBuilder& DatasetBuilder::asPicture(int rows, int columns, int bitsAllocated, const char* photometric)
{
    const bool isColour = QByteArray("YBR RGB").contains(QByteArray(photometric).left(3));
    return with(DCM_Rows, QByteArray::number(rows))
        .with(DCM_Columns, QByteArray::number(columns))
        .with(DCM_BitsAllocated, QByteArray::number(bitsAllocated))
        .with(DCM_BitsStored, QByteArray::number(bitsAllocated))
        .with(DCM_HighBit, QByteArray::number(bitsAllocated - 1))
        .with(DCM_SamplesPerPixel, isColour ? "3" : "1")
        .with(DCM_PixelRepresentation, "0")
        .with(DCM_PhotometricInterpretation, photometric);
}

DatasetBuilder& DatasetBuilder::with(DcmElement* element)
{
    if (mDataset->insert(element, OFTrue).bad())
        throw std::invalid_argument("the test's element cannot be inserted");
    return *this;
}

DatasetBuilder& DatasetBuilder::withItem(const DcmTag& sequence, const DatasetBuilder& item)
{
    if (mDataset->insertSequenceItem(sequence, new DcmItem(*item.mDataset)).bad())
        throw std::invalid_argument("the test's item cannot be inserted");
    return *this;
}

DatasetBuilder& DatasetBuilder::without(const DcmTagKey& key)
{
    delete mDataset->remove(key);
    return *this;
}

void DatasetBuilder::save(const QString& path, E_TransferSyntax syntax, E_EncodingType lengths) const
{
    DcmFileFormat file(mDataset.get());
    if (file.saveFile(QFile::encodeName(path).constData(), syntax, lengths).bad())
        throw std::invalid_argument("the test's image cannot be written");
}

QByteArray DatasetBuilder::file(E_TransferSyntax syntax) const
{
    const QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("image.dcm"));
    save(path, syntax);
    return fileContent(path);
}

TagMap* DatasetBuilder::map(unsigned int maxLength) const
{
    return TagMap::createTagMap(mDataset.get(), maxLength);
}

DatasetBuilder anImage(const char* sopUID)
{
    return DatasetBuilder(sopUID);
}

DatasetBuilder aPicture(int rows, int columns, int bitsAllocated, const char* photometric)
{
    DatasetBuilder picture = anItem();
    return picture.asPicture(rows, columns, bitsAllocated, photometric)
        .without(DCM_BitsStored)
        .without(DCM_HighBit);
}

DatasetBuilder aSlice(const char* sopUID, int number, double z, double y, double x)
{
    const QByteArray position = QString::asprintf("%g\\%g\\%g", x, y, z).toLatin1();
    return anImage(sopUID)
        .asPicture(3, 4, 16)
        .with(DCM_InstanceNumber, QByteArray::number(number))
        .with(DCM_ImagePositionPatient, position)
        .with(DCM_ImageOrientationPatient, "1\\0\\0\\0\\1\\0")
        .with(DCM_PixelSpacing, "0.25\\0.5")
        .words({0, 1, 2, 3, 1000, 2000, 3000, 4000, 4095, 5, 6, 7});
}

std::unique_ptr<DcmPixelSequence> sequenceOf(const QVector<QByteArray>& parts)
{
    auto sequence = std::make_unique<DcmPixelSequence>(DcmTag(DCM_PixelData, EVR_OB));
    for (const QByteArray& part : parts) {
        auto* fragment = new DcmPixelItem(DcmTag(DCM_Item, EVR_OB));
        fragment->putUint8Array(reinterpret_cast<const Uint8*>(part.constData()),
                                static_cast<unsigned long>(part.size()));
        sequence->insert(fragment);
    }
    return sequence;
}

DatasetBuilder anItem()
{
    return DatasetBuilder();
}

}  // namespace Kdd
