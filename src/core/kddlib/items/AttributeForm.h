#pragma once

#include <QByteArray>

#include <string_view>

class DcmTagKey;

namespace Kdd
{

/// What is written of an attribute beside its value.
struct AttributeName
{
    const DcmTagKey& key;
    const char* creator;  ///< of a private one, where the form shows it; may be null, and else is
};

/// A person's name, without the spaces and the separators of components that pad its forms.
struct NameGroups
{
    std::string_view alphabetic;
    std::string_view ideographic;
    std::string_view phonetic;
};

/// A way of writing down attributes, each for itself, so that what images share is written once and copied. Everything is
/// appended to `out`, in UTF-8. Without state.
class AttributeForm
{
public:
    virtual ~AttributeForm() = default;

    /// Whether private attributes are written with their creator.
    virtual bool showsCreators() const = 0;

    /// An attribute that is no sequence: between the two come its values, `count` of them. `vr` is one of the standard.
    virtual void beginValues(QByteArray& out, const AttributeName& name, const char* vr) const = 0;
    virtual void endValues(QByteArray& out, int count) const = 0;

    /// Value `index`, from 0, which may be empty; then the VR decides what that is written as.
    virtual void text(QByteArray& out, int index, std::string_view text) const = 0;

    virtual void name(QByteArray& out, int index, const NameGroups& groups) const = 0;

    /// A text that should be a number. Whether it is one has to be seen.
    virtual void numeral(QByteArray& out, int index, std::string_view text) const = 0;

    /// A number, by the digits that read back as it.
    virtual void number(QByteArray& out, int index, std::string_view digits) const = 0;

    /// Bytes, at least one, that are a value as a whole.
    virtual void binary(QByteArray& out, const QByteArray& bytes) const = 0;

    /// In place of values that are elsewhere: between the two comes their address.
    virtual void beginAddress(QByteArray& out) const = 0;
    virtual void endAddress(QByteArray& out) const = 0;

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
