#include "platform/media/core/frame_converter.h"

extern "C" {
#include <libavutil/imgutils.h>
#include <libavutil/pixdesc.h>
}

namespace zaf::media {

namespace {

// A frame of `size` and `format` with FFmpeg's own alignment and padding (alignment 0 lets
// FFmpeg choose the one its SIMD code needs).
ff::AVFramePtr paddedFrame(QSize size, AVPixelFormat format)
{
    ff::AVFramePtr frame = ff::makeFrame();
    if (!frame)
        return {};
    frame->format = format;
    frame->width = size.width();
    frame->height = size.height();
    if (av_frame_get_buffer(frame.get(), 0) < 0)
        return {};
    return frame;
}

void freeFrame(void *frame)
{
    auto *f = static_cast<AVFrame *>(frame);
    av_frame_free(&f);
}

} // namespace

bool isRgbFormat(int format)
{
    const AVPixFmtDescriptor *descriptor = av_pix_fmt_desc_get(AVPixelFormat(format));
    return descriptor && (descriptor->flags & AV_PIX_FMT_FLAG_RGB);
}

FrameConverter::FrameConverter() = default;
FrameConverter::~FrameConverter() = default;

bool FrameConverter::scale(const AVFrame *source, AVFrame *target, int swsFlags)
{
    if (source->width <= 0 || source->height <= 0 || target->width <= 0 || target->height <= 0 || !target->data[0])
        return false;
    // A YUV picture turned into RGB is read with its own matrix and range; other conversions keep
    // swscale's defaults.
    const bool toRgb = isRgbFormat(target->format) && !isRgbFormat(source->format);
    const int colorspace = !toRgb ? -1
                           : source->colorspace == AVCOL_SPC_UNSPECIFIED || source->colorspace == AVCOL_SPC_RGB ? SWS_CS_DEFAULT
                                                                                                             : int(source->colorspace);
    const int range = toRgb ? (source->color_range == AVCOL_RANGE_JPEG ? 1 : 0) : -1;
    const Shape shape{source->width, source->height, source->format, target->width, target->height, target->format,
                      swsFlags, colorspace, range};
    if (!m_scaler || !(shape == m_shape)) {
        m_scaler.reset(sws_getContext(source->width, source->height, AVPixelFormat(source->format), target->width, target->height,
                                      AVPixelFormat(target->format), swsFlags, nullptr, nullptr, nullptr));
        m_shape = shape;
        if (!m_scaler)
            return false;
        if (toRgb)
            sws_setColorspaceDetails(m_scaler.get(), sws_getCoefficients(colorspace), range, sws_getCoefficients(SWS_CS_DEFAULT), 1, 0,
                                     1 << 16, 1 << 16);
    }
    return sws_scale(m_scaler.get(), source->data, source->linesize, 0, source->height, target->data, target->linesize) > 0;
}

ff::AVFramePtr FrameConverter::convert(const AVFrame *source, QSize size, AVPixelFormat format, int swsFlags)
{
    if (size.isEmpty())
        return {};
    ff::AVFramePtr target = paddedFrame(size, format);
    if (!target || !scale(source, target.get(), swsFlags))
        return {};
    av_frame_copy_props(target.get(), source);
    if (isRgbFormat(format) != isRgbFormat(source->format)) {
        target->colorspace = isRgbFormat(format) ? AVCOL_SPC_RGB : kYuvFromRgbColorspace;
        target->color_range = isRgbFormat(format) ? AVCOL_RANGE_JPEG : kYuvFromRgbRange;
    }
    return target;
}

QImage FrameConverter::toImage(const AVFrame *source, QSize size, int swsFlags)
{
    ff::AVFramePtr frame = convert(source, size, AV_PIX_FMT_RGB32, swsFlags);
    if (!frame)
        return {};
    // The image owns the frame from here: it is freed when the last copy of the image goes.
    AVFrame *raw = frame.release();
    QImage image(raw->data[0], raw->width, raw->height, raw->linesize[0], QImage::Format_RGB32, &freeFrame, raw);
    if (image.isNull())
        freeFrame(raw);
    return image;
}

bool FrameConverter::convertImageInto(const QImage &image, AVFrame *target, int swsFlags)
{
    if (image.isNull())
        return false;
    const QImage::Format f = image.format();
    const QImage rgb = f == QImage::Format_RGB32 || f == QImage::Format_ARGB32 || f == QImage::Format_ARGB32_Premultiplied
                           ? image
                           : image.convertToFormat(QImage::Format_RGB32);
    ff::AVFramePtr source = paddedFrame(rgb.size(), AV_PIX_FMT_RGB32);
    if (rgb.isNull() || !source)
        return false;
    av_image_copy_plane(source->data[0], source->linesize[0], rgb.constBits(), int(rgb.bytesPerLine()), rgb.width() * 4, rgb.height());
    return scale(source.get(), target, swsFlags);
}

} // namespace zaf::media
