#pragma once

// FrameConverter: the one way pictures go through swscale. Private to platform/media.
//
// swscale reads and writes pictures in whole vector blocks: a row may be written a block past its
// last pixel, and the last rows a little past the end of the picture. Every picture it writes
// into is therefore allocated the way FFmpeg allocates its own frames (aligned stride, padding
// after the rows), never by the callers: a QImage a few pixels wide has no room for it and its
// neighbours on the heap get overwritten. Pictures that FFmpeg did not allocate (QImages) are
// copied into such a frame before swscale reads them.
//
// A converter keeps one scaler for pictures of one shape and makes a new one when the shape
// changes. Not thread-safe: one converter per thread of use.

#include "platform/media/core/ffmpeg_ptr.h"

#include <QImage>
#include <QSize>

namespace zaf::media {

// Whether pictures of `format` (an AVPixelFormat) hold RGB rather than YUV or grey.
bool isRgbFormat(int format);

// What an RGB picture becomes in YUV: the BT.601 matrix at limited range, swscale's defaults.
inline constexpr AVColorSpace kYuvFromRgbColorspace = AVCOL_SPC_SMPTE170M;
inline constexpr AVColorRange kYuvFromRgbRange = AVCOL_RANGE_MPEG;

class FrameConverter {
public:
    FrameConverter();
    ~FrameConverter();
    FrameConverter(const FrameConverter &) = delete;
    FrameConverter &operator=(const FrameConverter &) = delete;

    // `source` scaled to `size` and converted to `format`, in a new padded frame that carries the
    // source's properties (timestamps, ...) and describes its own colours. Null when the picture is empty or
    // swscale cannot convert it. `swsFlags`: the scaling algorithm (SWS_BILINEAR, ...).
    ff::AVFramePtr convert(const AVFrame *source, QSize size, AVPixelFormat format, int swsFlags);

    // `source` scaled to `size` as a 32-bit RGB image (QImage::Format_RGB32) that shares the padded
    // frame's memory (no copy). A YUV source is read with its own matrix and range. Null on failure.
    QImage toImage(const AVFrame *source, QSize size, int swsFlags);

    // `image` (any format) scaled and converted into `target`, whose planes FFmpeg allocated
    // (av_frame_get_buffer) at the target's width, height and format. False on failure.
    bool convertImageInto(const QImage &image, AVFrame *target, int swsFlags);

private:
    bool scale(const AVFrame *source, AVFrame *target, int swsFlags);

    struct Shape {
        int sourceWidth = 0, sourceHeight = 0, sourceFormat = -1;
        int targetWidth = 0, targetHeight = 0, targetFormat = -1;
        int flags = 0, colorspace = -1, range = -1;
        bool operator==(const Shape &) const = default;
    };
    ff::SwsContextPtr m_scaler;
    Shape m_shape;
};

} // namespace zaf::media
