#pragma once

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

/// The job that gives images another value of an attribute, with the study that they come from where that is another one.
inline QByteArray jobXml(const DcmTagKey& key, const QByteArray& value, const QByteArray& oldStudy = {})
{
    const auto hex = [](int number) { return QByteArray::number(number, 16).rightJustified(4, '0'); };
    return "<Job><Timestamp>20240131120000</Timestamp><Login>anna</Login><Substitutions OldSUID='" +
           oldStudy + "'><Tag Group='" + hex(key.getGroup()) + "' Element='" + hex(key.getElement()) +
           "'><Value>" + value + "</Value></Tag></Substitutions></Job>";
}

}  // namespace Kdd
