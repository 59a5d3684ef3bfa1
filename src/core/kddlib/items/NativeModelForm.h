#pragma once

#include "kddlib/items/AttributeForm.h"

namespace Kdd
{

/// The Native DICOM Model in XML.
class NativeModelForm : public AttributeForm
{
public:
    static const NativeModelForm& instance();

    bool plainValue(QByteArray& out, const DcmTagKey& key, VrCode vr, const QByteArray& bytes) const override;
    bool showsCreators() const override { return true; }
    void element(QByteArray& out, DcmElement& element, const char* creator) const override;
    void beginOmitted(QByteArray& out, const AttributeName& name) const override;
    void endOmitted(QByteArray& out) const override;
    QByteArray addressPart(const QByteArray& text) const override;
    void beginSequence(QByteArray& out, const AttributeName& name) const override;
    void endSequence(QByteArray& out, int items) const override;
    void beginItem(QByteArray& out, int index) const override;
    void endItem(QByteArray& out, int begin) const override;
    void beginImage(QByteArray& out) const override;
    void endImage(QByteArray& out, int begin) const override;
    void declareUtf8(QByteArray& out) const override;
};

}  // namespace Kdd
