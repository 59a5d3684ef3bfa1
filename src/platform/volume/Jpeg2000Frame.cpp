#include "platform/late/LateLibrary.h"
#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volume/NativeFrame.h"
#include "platform/volume/PixelTypes.h"

#include <openjpeg.h>

#include <cstring>
#include <memory>

namespace Kdd
{

namespace
{

constexpr int kMaxSubsampling = 4;

/// The bytes that the decoder reads, and where it is.
struct Reader
{
    const QByteArray& bytes;
    qint64 position = 0;
};

OPJ_SIZE_T readBytes(void* to, OPJ_SIZE_T size, void* user)
{
    auto* reader = static_cast<Reader*>(user);
    const qint64 left = reader->bytes.size() - reader->position;
    // The library's sign for the end.
    if (left <= 0)
        return static_cast<OPJ_SIZE_T>(-1);
    const auto count = static_cast<size_t>(qMin<quint64>(quint64(left), size));
    std::memcpy(to, reader->bytes.constData() + reader->position, count);
    reader->position += qint64(count);
    return count;
}

OPJ_BOOL seekBytes(OPJ_OFF_T position, void* user)
{
    auto* reader = static_cast<Reader*>(user);
    if (position < 0 || position > reader->bytes.size())
        return OPJ_FALSE;
    reader->position = position;
    return OPJ_TRUE;
}

OPJ_OFF_T skipBytes(OPJ_OFF_T count, void* user)
{
    auto* reader = static_cast<Reader*>(user);
    const qint64 left = reader->bytes.size() - reader->position;
    if (count < 0 || left <= 0)
        return -1;
    const qint64 skipped = qMin<qint64>(count, left);
    reader->position += skipped;
    return skipped;
}

void keepMessage(const char* message, void* user)
{
    *static_cast<QString*>(user) = QString::fromLatin1(message).trimmed();
}

void ignoreMessage(const char* /*message*/, void* /*user*/) {}

/// The library's handles; codec and stream are of one type to the compiler.
using Codec = std::unique_ptr<opj_codec_t, decltype(&opj_destroy_codec)>;
using Stream = std::unique_ptr<opj_stream_t, decltype(&opj_stream_destroy)>;
using Image = std::unique_ptr<opj_image_t, decltype(&opj_image_destroy)>;

/// One decoding: header first, then the pixels, so that nothing is decoded that does not fit.
class Jpeg2000Decoder
{
public:
    explicit Jpeg2000Decoder(const QByteArray& bytes);
    Result readHeader(const FrameLayout& layout);
    Result decode(int reduction);

    /// How often the size can be halved without falling below `least`.
    int reductionFor(int least) const;

    /// Whether the codestream says that its samples are luminance and chroma; the decoder undoes only the transform
    /// that belongs to the codestream itself.
    bool isYbr() const { return mImage->color_space == OPJ_CLRSPC_SYCC; }
    bool hasTransform() const { return mHasTransform; }
    const opj_image_t& image() const { return *mImage; }

private:
    Result failed() const
    {
        return Result::failure(QStringLiteral("JPEG 2000 data cannot be decoded: ") + mMessage);
    }
    Result checkSamples(const FrameLayout& layout) const;
    void readStructure();
    Reader mReader;
    QString mMessage;
    Stream mStream;
    Codec mCodec;
    Image mImage{nullptr, &opj_image_destroy};
    quint32 mResolutions = 1;
    bool mHasTransform = false;
};

// A bare codestream begins with a marker, its container with the length of a box.
Jpeg2000Decoder::Jpeg2000Decoder(const QByteArray& bytes)
    : mReader{bytes}
    , mStream(opj_stream_default_create(OPJ_TRUE), &opj_stream_destroy)
    , mCodec(opj_create_decompress(bytes.startsWith('\xff') ? OPJ_CODEC_J2K : OPJ_CODEC_JP2),
             &opj_destroy_codec)
{
    opj_stream_set_read_function(mStream.get(), readBytes);
    opj_stream_set_seek_function(mStream.get(), seekBytes);
    opj_stream_set_skip_function(mStream.get(), skipBytes);
    opj_stream_set_user_data(mStream.get(), &mReader, nullptr);
    opj_stream_set_user_data_length(mStream.get(), static_cast<OPJ_UINT64>(bytes.size()));
    opj_set_error_handler(mCodec.get(), keepMessage, &mMessage);
    opj_set_warning_handler(mCodec.get(), ignoreMessage, nullptr);
    opj_set_info_handler(mCodec.get(), ignoreMessage, nullptr);
}

Result Jpeg2000Decoder::readHeader(const FrameLayout& layout)
{
    opj_dparameters_t parameters;
    opj_set_default_decoder_parameters(&parameters);
    // The dataset's palette counts; one of the container would change the number of samples.
    parameters.flags |= OPJ_DPARAMETERS_IGNORE_PCLR_CMAP_CDEF_FLAG;
    opj_image_t* image = nullptr;
    const bool isRead = opj_setup_decoder(mCodec.get(), &parameters) != OPJ_FALSE &&
                        opj_read_header(mStream.get(), mCodec.get(), &image) != OPJ_FALSE;
    mImage.reset(image);
    if (!isRead || !image || image->numcomps < 1)
        return failed();
    Result fits = checkCodestream(layout, qint64(image->x1) - image->x0, qint64(image->y1) - image->y0,
                                  image->numcomps, static_cast<int>(image->comps[0].prec));
    readStructure();
    return fits.bad() ? fits : checkSamples(layout);
}

void Jpeg2000Decoder::readStructure()
{
    opj_codestream_info_v2_t* structure = opj_get_cstr_info(mCodec.get());
    if (structure && structure->m_default_tile_info.tccp_info) {
        mResolutions = structure->m_default_tile_info.tccp_info[0].numresolutions;
        mHasTransform = structure->m_default_tile_info.mct != 0;
    }
    opj_destroy_cstr_info(&structure);
}

/// Samples may be coarser than pixels and of different precision each; the decoder itself takes 32 bits for each.
Result Jpeg2000Decoder::checkSamples(const FrameLayout& layout) const
{
    if (layout.numValues() > kMaxFrameBytes / qint64(sizeof(OPJ_INT32)))
        return Result::failure(QStringLiteral("JPEG 2000 data of this size are not decoded"));
    const opj_image_comp_t& first = mImage->comps[0];
    for (OPJ_UINT32 i = 0; i < mImage->numcomps; ++i) {
        const opj_image_comp_t& sample = mImage->comps[i];
        if (sample.dx < 1 || sample.dx > kMaxSubsampling || sample.dy < 1 || sample.dy > kMaxSubsampling ||
            sample.prec != first.prec)
            return Result::failure(QStringLiteral("JPEG 2000 samples of different kinds cannot be decoded"));
    }
    return Result();
}

int Jpeg2000Decoder::reductionFor(int least) const
{
    if (least <= 0)
        return 0;
    // The shorter side decides, and the codestream has only so many resolutions.
    const quint32 side = qMin(mImage->x1 - mImage->x0, mImage->y1 - mImage->y0);
    quint32 reduction = 0;
    while (reduction + 1 < mResolutions && (side >> (reduction + 1)) >= quint32(least))
        ++reduction;
    return static_cast<int>(reduction);
}

Result Jpeg2000Decoder::decode(int reduction)
{
    const bool isDecoded =
        opj_set_decoded_resolution_factor(mCodec.get(), static_cast<OPJ_UINT32>(reduction)) != OPJ_FALSE &&
        opj_decode(mCodec.get(), mStream.get(), mImage.get()) != OPJ_FALSE &&
        opj_end_decompress(mCodec.get(), mStream.get()) != OPJ_FALSE;
    if (!isDecoded)
        return failed();
    // Held against what copySamples relies on, although the decoder reports success.
    for (OPJ_UINT32 i = 0; i < mImage->numcomps; ++i) {
        const opj_image_comp_t& sample = mImage->comps[i];
        if (!sample.data || sample.w < 1 || sample.h < 1)
            return failed();
    }
    return Result();
}

/// Sample by sample into pixels; a coarse sample serves several pixels.
template <typename T>
void copySamples(const opj_image_t& image, TypedData2D& pixels)
{
    T* to = valuesOf<T>(pixels);
    for (int i = 0; i < pixels.components; ++i) {
        const opj_image_comp_t& sample = image.comps[i];
        for (int y = 0; y < pixels.height; ++y) {
            // Where the size is no multiple of the step, the last coarse sample serves the pixels left over.
            const OPJ_UINT32 row = qMin(OPJ_UINT32(y) / sample.dy, sample.h - 1);
            const OPJ_INT32* from = sample.data + size_t(row) * sample.w;
            T* line = to + qint64(y) * pixels.width * pixels.components + i;
            for (int x = 0; x < pixels.width; ++x)
                line[qint64(x) * pixels.components] =
                    static_cast<T>(from[qMin(OPJ_UINT32(x) / sample.dx, sample.w - 1)]);
        }
    }
}

/// Rounded up, as each resolution of a codestream is.
int halved(int size, int times)
{
    return static_cast<int>((qint64(size) + (qint64(1) << times) - 1) >> times);
}

StoredFrame::Colour colourOf(const Jpeg2000Decoder& decoder, const FrameLayout& layout)
{
    // With its own transform undone the codestream gives RGB, whatever the dataset says.
    const bool isYbr =
        !decoder.hasTransform() && (decoder.isYbr() || layout.photometric.startsWith("YBR_FULL"));
    return isYbr ? StoredFrame::Colour::YbrFull : StoredFrame::Colour::Rgb;
}

}  // namespace

Result decodeJpeg2000(const QByteArray& bytes, const FrameLayout& layout, int least, StoredFrame& out)
{
    const Result loaded = loadLate(LateLibrary::Codecs);
    if (loaded.bad())
        return loaded;
    Jpeg2000Decoder decoder(bytes);
    Result header = decoder.readHeader(layout);
    if (header.bad())
        return header;
    out.reduction = decoder.reductionFor(least);
    Result decoded = decoder.decode(out.reduction);
    if (decoded.bad())
        return decoded;
    if (layout.samples == 3)
        out.colour = colourOf(decoder, layout);
    out.pixels = TypedData2D{halved(layout.columns, out.reduction),
                             halved(layout.rows, out.reduction),
                             layout.samples,
                             layout.type(),
                             {}};
    allocatePixels(out.pixels);
    visitPixelType(out.pixels.type,
                   [&](auto zero) { copySamples<decltype(zero)>(decoder.image(), out.pixels); });
    // The codestream may have fewer bits than the dataset tells; the sign is then the top one of those.
    const int bits = qMin(int(decoder.image().comps[0].prec), layout.bitsStored);
    keepStoredBits(out.pixels, bits, bits - 1);
    return Result();
}

}  // namespace Kdd
