#pragma once

#include <QByteArray>

#include <memory>

namespace Kdd::Http
{

/// Compresses a body that is made block by block, with little memory. The same blocks give the same bytes. Used by one
/// thread at a time.
class GzipEncoder
{
public:
    /// What stands around the compressed bytes.
    enum class Frame { Gzip, None };

    explicit GzipEncoder(Frame frame = Frame::Gzip);
    ~GzipEncoder();

    /// Appends to `out` what is ready of the blocks until now; seldom all of it.
    void add(const QByteArray& block, QByteArray& out);

    /// Appends the rest. Nothing may be added any more.
    void finish(QByteArray& out);

private:
    struct Private;
    std::unique_ptr<Private> d;
};

/// The whole of a body.
QByteArray gzipped(const QByteArray& bytes);

}  // namespace Kdd::Http
