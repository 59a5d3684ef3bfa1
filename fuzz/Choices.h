#pragma once

#include <QByteArray>

namespace Kdd
{

/// Takes its decisions from the bytes of a run, which outlive it, and zeros behind them.
class Choices
{
public:
    explicit Choices(const QByteArray& bytes)
        : mBytes(bytes)
    {
    }

    bool isAtEnd() const { return mAt >= mBytes.size(); }
    int next() { return isAtEnd() ? 0 : static_cast<unsigned char>(mBytes.at(mAt++)); }

    QByteArray value()
    {
        const int length = next();
        const QByteArray taken = mBytes.mid(mAt, length);
        mAt += taken.size();
        return taken;
    }

private:
    const QByteArray& mBytes;
    int mAt = 0;
};

}  // namespace Kdd
