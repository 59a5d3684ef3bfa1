#pragma once

#include <QString>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>

#include <memory>
#include <vector>

namespace Kdd
{

class TagMap;

/// Makes datasets for tests: `anImage("1.2.3").inSeries("1.2").with(DCM_PatientName, "Doe^J").build()`. What a test does
/// not speak of has a default: one study, one series, secondary capture.
class DatasetBuilder
{
public:
    explicit DatasetBuilder(const char* sopUID);

    DatasetBuilder& inStudy(const char* uid) { return with(DCM_StudyInstanceUID, uid); }
    DatasetBuilder& inSeries(const char* uid) { return with(DCM_SeriesInstanceUID, uid); }

    /// A text, or numbers as text for the binary VRs.
    DatasetBuilder& with(const DcmTag& tag, const char* value);

    /// Several texts by their names: "PatientID=P1|PatientName=Doe^J".
    DatasetBuilder& with(const QByteArray& attributes);

    /// Binary values by the VR that goes with them: OB, OW and US.
    DatasetBuilder& bytes(const std::vector<Uint8>& values, const DcmTagKey& key = DCM_PixelData);
    DatasetBuilder& words(const std::vector<Uint16>& values, const DcmTagKey& key = DCM_PixelData);
    DatasetBuilder& numbers(const DcmTagKey& key, const std::vector<Uint16>& values);

    /// A text of `length` characters.
    DatasetBuilder& withLong(const DcmTag& tag, int length);

    /// Compressed pixels in fragments of so many bytes, the first of which is the table of offsets.
    DatasetBuilder& fragments(E_TransferSyntax xfer, const std::vector<int>& sizes);
    DatasetBuilder& fragments(E_TransferSyntax xfer, const QVector<QByteArray>& parts);

    /// Binary values of any VR.
    DatasetBuilder& data(const DcmTag& tag, const QByteArray& values);

    /// What describes pixels, as `aPicture` has it, and how many bits are stored.
    DatasetBuilder& asPicture(int rows, int columns, int bitsAllocated,
                              const char* photometric = "MONOCHROME2");

    /// Takes the element over.
    DatasetBuilder& with(DcmElement* element);

    /// Appends an item to a sequence.
    DatasetBuilder& withItem(const DcmTag& sequence, const DatasetBuilder& item);

    DatasetBuilder& without(const DcmTagKey& key);

    const DcmDataset& build() const { return *mDataset; }
    DcmDataset& dataset() const { return *mDataset; }

    /// Writes a DICOM file. What cannot be written throws.
    void save(const QString& path, E_TransferSyntax syntax = EXS_LittleEndianExplicit,
              E_EncodingType lengths = EET_UndefinedLength) const;

    /// The bytes of such a file.
    QByteArray file(E_TransferSyntax syntax = EXS_LittleEndianExplicit) const;

    /// What the cache makes of it; the caller owns the map.
    TagMap* map(unsigned int maxLength = 1024) const;

private:
    friend DatasetBuilder anItem();
    DatasetBuilder();

    std::shared_ptr<DcmDataset> mDataset;
};

DatasetBuilder anImage(const char* sopUID = "1.2.3.1");

/// A few pixels without identity: unsigned, with all bits stored unless a test says otherwise; of three samples when they
/// are YBR or RGB.
DatasetBuilder aPicture(int rows, int columns, int bitsAllocated, const char* photometric = "MONOCHROME2");

/// An axial image of 4 x 3 pixels of 16 bits, half a millimetre wide and 0.25 mm high, at (x, y, z) [mm].
DatasetBuilder aSlice(const char* sopUID, int number, double z, double y = 0, double x = 0);

/// Compressed pixel data; the first part is the table of offsets.
std::unique_ptr<DcmPixelSequence> sequenceOf(const QVector<QByteArray>& parts);

/// Without any attribute, for sequences.
DatasetBuilder anItem();

}  // namespace Kdd
