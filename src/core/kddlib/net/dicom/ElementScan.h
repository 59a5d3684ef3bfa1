#pragma once

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>
#include <dcmtk/dcmdata/dcxfer.h>

namespace Kdd
{

/// Finds where the elements of a dataset lie, also where a parser would give up: delimiters that stand for each other
/// are taken for what they must be, and what an element holds is only walked through where its length is undefined.
///
/// Keeps a reference to the bytes.
class ElementScan
{
public:
    ElementScan(const QByteArray& bytes, const DcmXfer& syntax)
        : mBytes(bytes)
        , mSyntax(syntax)
    {
    }

    struct Element
    {
        DcmTagKey key;
        bool isOpen = false;  ///< its length is undefined
        qint64 value = 0;     ///< where its value begins
        qint64 end = -1;      ///< where it ends; -1 when it does not end within the bytes
    };

    /// The element at an offset; false when not even its head is there.
    bool find(qint64 at, Element& element) const;

    /// From the first item on the last end of items that are whole, of fragments for instance; how many are counted in
    /// `items`.
    qint64 endOfWholeItems(qint64 at, int& items) const;

private:
    struct Head;

    bool readHead(qint64 at, bool isExplicit, Head& head) const;
    qint64 endOf(const Head& head, bool isExplicit, int depth) const;
    qint64 endOfSequence(qint64 at, bool isExplicit, int depth) const;
    qint64 endOfOpenItem(qint64 at, bool isExplicit, int depth) const;
    quint16 word(qint64 at) const;
    quint32 doubleWord(qint64 at) const;

    const QByteArray& mBytes;
    DcmXfer mSyntax;
};

}  // namespace Kdd
