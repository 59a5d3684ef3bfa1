// Texts that come from requests and files: paths of DICOM files, paths to sequence items, values.

#include "fuzz/Property.h"
#include "kddlib/items/FileNaming.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QString>
#include <QVariant>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>

#include <memory>

using namespace Kdd;

namespace
{

/// Behind the last code that a value can have.
constexpr quint32 kUnknownCode = static_cast<quint32>(VrCode::Unknown2B) + 1;

const QByteArray kFormerValue("former");

void checkFileName(const QByteArray& path)
{
    QByteArray sopUID;
    QByteArray studyUID;
    const bool isNamed = extractUIDs(path.constData(), sopUID, studyUID);
    const QByteArray suffix = extractSuffix(path.constData());
    require(isNamed || (sopUID.isEmpty() && studyUID.isEmpty()), "a path of another form names nothing");
    if (!isNamed)
        return;
    const QByteArray own = "a/" + studyUID + '/' + sopUID + '_' + suffix + ".dcm";
    QByteArray sopAgain;
    QByteArray studyAgain;
    require(extractUIDs(own.constData(), sopAgain, studyAgain), "a path made of the parts names them");
    require(sopAgain == sopUID && studyAgain == studyUID, "a path made of the parts gives the same UIDs");
    require(extractSuffix(own.constData()) == suffix, "a path made of the parts gives the same suffix");
}

void addItem(DcmItem& above, const DcmTagKey& sequence, const char* path)
{
    DcmItem* item = nullptr;
    require(above.findOrCreateSequenceItem(sequence, item, -2).good() &&
                item->putAndInsertString(DCM_TextValue, path).good(),
            "the tree can be made");
}

/// A tree in which every node says by which path it is found.
std::unique_ptr<TagMap> makeTree()
{
    DcmDataset dataset;
    dataset.putAndInsertString(DCM_TextValue, "");
    addItem(dataset, DCM_RequestAttributesSequence, "RequestAttributesSequence[0]");
    addItem(dataset, DCM_RequestAttributesSequence, "RequestAttributesSequence[1]");
    addItem(dataset, DCM_ReferencedPatientSequence, "ReferencedPatientSequence[0]");
    DcmItem* first = nullptr;
    require(dataset.findAndGetSequenceItem(DCM_RequestAttributesSequence, first, 0).good(),
            "there is an item");
    addItem(*first, DCM_RequestedProcedureCodeSequence,
            "RequestAttributesSequence[0].RequestedProcedureCodeSequence[0]");
    return std::unique_ptr<TagMap>(TagMap::createTagMap(&dataset, 1024));
}

void checkItemPath(const QByteArray& path)
{
    static const std::unique_ptr<TagMap> tree = makeTree();
    const TagElement* found = tree->findElement(QString::fromUtf8(path), DCM_TextValue);
    if (found == nullptr)
        return;
    const QString own = QString::fromLatin1(found->value());
    require(tree->findElement(own, DCM_TextValue) == found, "what is found is a node of the tree");
}

void checkText(VrCode vr, const QByteArray& text)
{
    TagElement element(vr, kFormerValue);
    if (!element.putValueAsString(text)) {
        require(element.value() == kFormerValue && element.vr() == vr,
                "a text that is refused changes nothing");
        return;
    }
    QByteArray shown;
    element.getValueAsString(shown);
    require(element.putValueAsString(shown), "a value's own text is accepted");
    QByteArray again;
    element.getValueAsString(again);
    require(again == shown, "a value's own text gives the same text");
}

void checkBytes(VrCode vr, const QByteArray& bytes)
{
    const TagElement element(vr, bytes);
    QByteArray text;
    element.getValueAsString(text);
    element.valueAsVariant();
    bool isNumber = true;
    element.valueAsInt(nullptr, element.numFields() - 1);
    element.valueAsInt(&isNumber, element.numFields());
    require(!isNumber || element.numFields() == 0, "there is no number behind the last one");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray text = bytesOf(data, size);
    checkFileName(text);
    checkItemPath(text);
    for (quint32 code = 0; code <= kUnknownCode; ++code) {
        checkText(static_cast<VrCode>(code), text);
        checkBytes(static_cast<VrCode>(code), text);
    }
    return 0;
}
