#include "platform/media/export/stream_copy.h"

#include <cstring>

namespace zaf::media::exportpipe {

AVStream *addStreamCopy(AVFormatContext *output, const AVStream *in, Error *error)
{
    AVStream *out = avformat_new_stream(output, nullptr);
    if (!out) {
        *error = stageError(kMediaErrorUnknown, QStringLiteral("out of memory"));
        return nullptr;
    }
    const int rc = avcodec_parameters_copy(out->codecpar, in->codecpar);
    if (rc < 0) {
        *error = stageError(kMediaErrorWriteFailed, QStringLiteral("stream parameters"), rc);
        return nullptr;
    }
    // The source container's tag may mean nothing in MPEG-4; the muxer picks its own.
    out->codecpar->codec_tag = 0;
    out->time_base = in->time_base;
    out->avg_frame_rate = in->avg_frame_rate;
    out->r_frame_rate = in->r_frame_rate;
    out->sample_aspect_ratio = in->sample_aspect_ratio;
    out->disposition = in->disposition;
    av_dict_copy(&out->metadata, in->metadata, 0);
    for (int i = 0; i < in->nb_side_data; ++i) {
        const AVPacketSideData &side = in->side_data[i];
        if (uint8_t *copy = av_stream_new_side_data(out, side.type, side.size))
            std::memcpy(copy, side.data, side.size);
    }
    return out;
}

} // namespace zaf::media::exportpipe
