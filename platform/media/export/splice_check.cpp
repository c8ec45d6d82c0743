#include "platform/media/export/splice_check.h"

#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/media_input.h"

namespace zaf::media::exportpipe {

namespace {

// Seeks never need more tries than this to land on a keyframe shown before a splice point.
constexpr int kMaxSeekTries = 8;

class SpliceChecker {
public:
    SpliceChecker(AVFormatContext *input, int index, AVCodecContext *decoder)
        : m_input(input), m_index(index), m_decoder(decoder)
    {
    }

    std::optional<QString> check(std::int64_t at)
    {
        if (std::optional<QString> why = seekBefore(at))
            return why;
        avcodec_flush_buffers(m_decoder);
        int fed = 0, after = 0, decoded = 0;
        ff::AVPacketPtr packet = ff::makePacket();
        ff::AVFramePtr frame = ff::makeFrame();
        auto receive = [&]() -> std::optional<QString> {
            for (;;) {
                const int rc = avcodec_receive_frame(m_decoder, frame.get());
                if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
                    return std::nullopt;
                if (rc < 0)
                    return QStringLiteral("a picture near %1 fails to decode: %2").arg(seconds(at)).arg(ff::errorString(rc));
                const bool damaged = frame->decode_error_flags != 0 || (frame->flags & AV_FRAME_FLAG_CORRUPT);
                av_frame_unref(frame.get());
                if (damaged)
                    return QStringLiteral("a picture near %1 decodes damaged").arg(seconds(at));
                ++decoded;
            }
        };
        bool first = true;
        while (after < kPicturesCheckedAfterSplice) {
            const int rc = av_read_frame(m_input, packet.get());
            if (rc == AVERROR_EOF)
                break;
            if (rc < 0)
                return QStringLiteral("the movie cannot be read near %1: %2").arg(seconds(at)).arg(ff::errorString(rc));
            if (packet->stream_index == m_index) {
                if (first && (packet->pts == AV_NOPTS_VALUE || packet->pts >= at))
                    return QStringLiteral("no keyframe before %1").arg(seconds(at));
                first = false;
                if (packet->pts != AV_NOPTS_VALUE && packet->pts >= at)
                    ++after;
                ++fed;
                const int sent = avcodec_send_packet(m_decoder, packet.get());
                av_packet_unref(packet.get());
                if (sent < 0)
                    return QStringLiteral("a picture near %1 fails to decode: %2").arg(seconds(at)).arg(ff::errorString(sent));
                if (std::optional<QString> why = receive())
                    return why;
            } else {
                av_packet_unref(packet.get());
            }
        }
        avcodec_send_packet(m_decoder, nullptr);
        if (std::optional<QString> why = receive())
            return why;
        if (after == 0)
            return QStringLiteral("no picture after %1").arg(seconds(at));
        if (decoded != fed)
            return QStringLiteral("%1 of %2 pictures around %3 decode").arg(decoded).arg(fed).arg(seconds(at));
        return std::nullopt;
    }

private:
    QString seconds(std::int64_t pts) const
    {
        return QStringLiteral("%1 s").arg(pts * av_q2d(m_input->streams[m_index]->time_base), 0, 'f', 3);
    }

    // Places the demuxer on a keyframe shown before `at`. Seeks go by decode time, which runs ahead
    // of presentation by the reorder delay, so the first try may land on the splice's own keyframe.
    std::optional<QString> seekBefore(std::int64_t at)
    {
        std::int64_t target = at - 1;
        ff::AVPacketPtr packet = ff::makePacket();
        for (int tries = 0; tries < kMaxSeekTries; ++tries) {
            if (av_seek_frame(m_input, m_index, target, AVSEEK_FLAG_BACKWARD) < 0)
                return QStringLiteral("cannot seek before %1").arg(seconds(at));
            std::int64_t firstPts = AV_NOPTS_VALUE, firstDts = AV_NOPTS_VALUE;
            for (;;) {
                const int rc = av_read_frame(m_input, packet.get());
                if (rc < 0)
                    return QStringLiteral("the movie cannot be read before %1").arg(seconds(at));
                const bool ours = packet->stream_index == m_index;
                firstPts = packet->pts;
                firstDts = packet->dts;
                av_packet_unref(packet.get());
                if (ours)
                    break;
            }
            if (firstPts != AV_NOPTS_VALUE && firstPts < at)
                return av_seek_frame(m_input, m_index, target, AVSEEK_FLAG_BACKWARD) < 0
                           ? std::optional<QString>(QStringLiteral("cannot seek before %1").arg(seconds(at)))
                           : std::nullopt;
            if (firstDts == AV_NOPTS_VALUE)
                break;
            target = std::min(target, firstDts) - 1;
        }
        return QStringLiteral("no keyframe before %1").arg(seconds(at));
    }

    AVFormatContext *m_input;
    int m_index;
    AVCodecContext *m_decoder;
};

} // namespace

std::optional<QString> checkSplices(const QString &path, const QList<std::int64_t> &spliceMicros, const CancelToken &cancel)
{
    if (spliceMicros.isEmpty())
        return std::nullopt;
    QString error;
    ff::InputFormatContextPtr input = openInput(path, cancel, &error);
    if (!input)
        return error;
    const int index = av_find_best_stream(input.get(), AVMEDIA_TYPE_VIDEO, -1, -1, nullptr, 0);
    if (index < 0)
        return QStringLiteral("the movie has no video");
    for (unsigned i = 0; i < input->nb_streams; ++i) {
        if (int(i) != index)
            input->streams[i]->discard = AVDISCARD_ALL;
    }
    const AVStream *stream = input->streams[index];
    ff::CodecContextPtr decoder = openDecoder(stream, DecoderOptions{0, FF_THREAD_FRAME | FF_THREAD_SLICE, ff::kMaxPixels,
                                                                     AV_EF_EXPLODE | AV_EF_BITSTREAM | AV_EF_BUFFER}, &error);
    if (!decoder)
        return error;
    SpliceChecker checker(input.get(), index, decoder.get());
    for (std::int64_t micros : spliceMicros) {
        if (std::optional<QString> why = checker.check(av_rescale_q(micros, AV_TIME_BASE_Q, stream->time_base)))
            return why;
    }
    return std::nullopt;
}

} // namespace zaf::media::exportpipe
