#pragma once

#include "kddlib/tagmodel/VrCode.h"

#include <QByteArray>

class DcmElement;
class DcmTagKey;

namespace Kdd
{

/// What is written of an attribute beside its value.
struct AttributeName
{
    const DcmTagKey& key;
    const char* creator;  ///< of a private one, where the form shows it; may be null, and else is
};

/// A way of writing down attributes, each for itself, so that what images share is written once and copied. Everything is
/// appended to `out`, in UTF-8. Without state.
class AttributeForm
{
public:
    virtual ~AttributeForm() = default;

    /// A value of nothing but printable ASCII, or of numbers, straight from its bytes. False, and nothing written, when
    /// the form has no short way for such a value; then it is written by `element`.
    virtual bool plainValue(QByteArray& out, const DcmTagKey& key, VrCode vr,
                            const QByteArray& bytes) const = 0;

    /// Whether private attributes are written with their creator.
    virtual bool showsCreators() const = 0;

    /// Any value. The element is not changed, though DCMTK needs it to be changeable.
    virtual void element(QByteArray& out, DcmElement& element, const char* creator) const = 0;

    /// A value that is elsewhere: between the two comes its address.
    virtual void beginOmitted(QByteArray& out, const AttributeName& name) const = 0;
    virtual void endOmitted(QByteArray& out) const = 0;

    /// A text as a part of that address.
    virtual QByteArray addressPart(const QByteArray& text) const = 0;

    virtual void beginSequence(QByteArray& out, const AttributeName& name) const = 0;
    virtual void endSequence(QByteArray& out, int items) const = 0;

    /// Item `index` of a sequence, from 0. `begin` is where in `out` its attributes began, behind `beginItem`.
    virtual void beginItem(QByteArray& out, int index) const = 0;
    virtual void endItem(QByteArray& out, int begin) const = 0;

    /// The same for an image as a whole.
    virtual void beginImage(QByteArray& out) const = 0;
    virtual void endImage(QByteArray& out, int begin) const = 0;

    /// Specific Character Set, which says UTF-8.
    virtual void declareUtf8(QByteArray& out) const = 0;
};

}  // namespace Kdd
