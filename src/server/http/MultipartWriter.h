#pragma once

#include "server/http/Packing.h"

namespace Kdd::Http
{

/// Makes multipart/related bodies. The boundary is of random letters, so many that nothing it stands between holds them.
class MultipartWriter : public Packing
{
public:
    /// `type` is that of the parts, for the header of the whole.
    explicit MultipartWriter(const QByteArray& type);

    QByteArray mediaType() const override;
    QByteArray begin(const QByteArray& name, const QByteArray& mediaType) override;
    void pass(const QByteArray&) override {}
    QByteArray end() override { return "\r\n"; }
    QByteArray finish() override;

private:
    QByteArray mType;
    QByteArray mBoundary;
};

}  // namespace Kdd::Http
