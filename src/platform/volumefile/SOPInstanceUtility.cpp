#include "platform/volumefile/SOPInstanceUtility.h"

#include "platform/volumefile/ParamBundle.h"

#include <QList>

namespace Kdd
{
namespace
{

// One text for all: tens of thousands of parameters would make opening a volume file slow.
const char kName[] = "UIDs";
constexpr char kSeparator = '\\';  // as between the values of a DICOM attribute

}  // namespace

std::vector<std::string> SOPInstanceUtility::sopUIDList(const ParamBundle& sopInstanceUIDs)
{
    const QByteArray text = sopInstanceUIDs.text(kName);
    std::vector<std::string> uids;
    // Splitting an empty text would give one empty UID.
    if (text.isEmpty())
        return uids;
    const QList<QByteArray> values = text.split(kSeparator);
    uids.reserve(static_cast<std::size_t>(values.size()));
    for (const QByteArray& value : values)
        uids.push_back(value.toStdString());
    return uids;
}

ParamBundle SOPInstanceUtility::bundleOf(const std::vector<std::string>& sopUIDs)
{
    QByteArray text;
    for (const std::string& uid : sopUIDs) {
        if (&uid != &sopUIDs.front())
            text += kSeparator;
        // Up to the first zero: a text with one could not be written.
        text += uid.c_str();
    }
    ParamBundle bundle;
    bundle.insert(kName, Parameter::ofText(text));
    return bundle;
}

}  // namespace Kdd
