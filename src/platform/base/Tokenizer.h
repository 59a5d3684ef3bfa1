#pragma once

#include <QByteArray>

namespace Kdd
{

/// Walks the words of a text. Words are what stands between white space and backslashes, the separator of DICOM's
/// multi-valued texts; separators in a row count as one.
///
/// Keeps a reference: the text must outlive the tokenizer.
class Tokenizer
{
public:
    explicit Tokenizer(const QByteArray& text)
        : mText(text)
    {
    }

    /// Puts the next word into `word`; false when there is none left.
    bool next(QByteArray& word)
    {
        while (mPosition < mText.size() && isSeparator(mText.at(mPosition)))
            ++mPosition;
        const int start = mPosition;
        while (mPosition < mText.size() && !isSeparator(mText.at(mPosition)))
            ++mPosition;
        word = mText.mid(start, mPosition - start);
        return !word.isEmpty();
    }

private:
    static bool isSeparator(char c) { return c == '\\' || c == ' ' || (c >= '\t' && c <= '\r'); }

    const QByteArray& mText;
    int mPosition = 0;
};

}  // namespace Kdd
