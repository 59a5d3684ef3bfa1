#pragma once

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavformat/avformat.h>
#include <libavutil/pixdesc.h>
#include <libswscale/swscale.h>
}

#include <memory>

namespace Kdd
{

/// Frees what the decoders' library made, each kind in its own way.
struct AvDeleter
{
    void operator()(AVIOContext* io) const
    {
        // The buffer may have been replaced by a larger one in the meantime.
        av_freep(&io->buffer);
        avio_context_free(&io);
    }
    void operator()(AVFormatContext* format) const { avformat_close_input(&format); }
    void operator()(AVCodecContext* decoder) const { avcodec_free_context(&decoder); }
    void operator()(AVPacket* packet) const { av_packet_free(&packet); }
    void operator()(AVFrame* frame) const { av_frame_free(&frame); }
    void operator()(SwsContext* scaler) const { sws_freeContext(scaler); }
};

template <typename T>
using AvHandle = std::unique_ptr<T, AvDeleter>;

}  // namespace Kdd
