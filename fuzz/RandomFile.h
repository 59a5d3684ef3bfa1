#pragma once

#include <QByteArray>
#include <QMap>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class Choices;

/// A DICOM file of attributes as no conformant writer makes them: of any VR, with bytes of any kind as their values, in items
/// too. Made by hand, for DCMTK would mend much of it. Its study is "1.2".
class RandomFile
{
public:
    enum class Syntax { Explicit, Implicit };

    /// Of which VRs attributes are. Where VRs are not written along, others than the dictionary's cannot be read.
    enum class Vrs { Any, Usual };

    explicit RandomFile(Vrs vrs = Vrs::Any)
        : mVrs(vrs)
    {
    }

    /// Sets up to 7 attributes.
    void change(Choices& choices) { change(mAttributes, choices, 0); }

    QByteArray bytes(const QByteArray& seriesUID, const QByteArray& sopUID,
                     Syntax syntax = Syntax::Explicit) const;

private:
    struct Attribute;
    using Attributes = QMap<DcmTagKey, Attribute>;

    struct Attribute
    {
        QByteArray vr;
        QByteArray value;
        QVector<Attributes> items;  // of a sequence
        bool isOpen = false;        // a sequence of undefined length
    };

    void change(Attributes& attributes, Choices& choices, int depth) const;
    static void write(QByteArray& out, const Attributes& attributes, Syntax syntax);
    static void write(QByteArray& out, const DcmTagKey& key, const Attribute& attribute, Syntax syntax);
    static QByteArray itemsOf(const Attribute& attribute, Syntax syntax);

    Vrs mVrs;
    Attributes mAttributes;
};

}  // namespace Kdd
