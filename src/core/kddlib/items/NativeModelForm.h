#pragma once

#include "kddlib/items/AttributeForm.h"

namespace Kdd
{

/// The Native DICOM Model in XML.
class NativeModelForm : public AttributeForm
{
public:
    static const NativeModelForm& instance();

    bool showsCreators() const override { return true; }
    void beginValues(QByteArray& out, const AttributeName& name, const char* vr) const override;
    void endValues(QByteArray& out, int count) const override;
    void text(QByteArray& out, int index, std::string_view text) const override;
    void name(QByteArray& out, int index, const NameGroups& groups) const override;
    void numeral(QByteArray& out, int index, std::string_view text) const override;
    void number(QByteArray& out, int index, std::string_view digits) const override;
    void binary(QByteArray& out, const QByteArray& bytes) const override;
    void beginAddress(QByteArray& out) const override;
    void endAddress(QByteArray& out) const override;
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
