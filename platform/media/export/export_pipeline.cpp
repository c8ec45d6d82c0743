#include "platform/media/export/export_pipeline.h"
#include "platform/media/core/media_log.h"

#include "platform/log.h"
#include "platform/media/export/export_audio_copier.h"
#include "platform/media/export/export_audio_encoder.h"
#include "platform/media/export/export_video_encoder.h"
#include "platform/media/export/export_video_splicer.h"
#include "platform/media/export/splice_check.h"
#include "platform/media/core/media_input.h"
#include "platform/media/export/stream_copy.h"

#include <QFile>

#include <algorithm>
#include <vector>

namespace zaf::media::exportpipe {

namespace {

// Audio before the cut is read from a little ahead of it, so the first kept samples do not come
// from a decoder that has just started (no overlap from the previous frame): at least this long, and
// at least two frames of every audio stream (an AAC frame lasts 128 ms at 8 kHz).
constexpr std::int64_t kAudioPreRollMicros = 50000;
// Read errors that the demuxer asks to retry are retried this many times in a row at most.
constexpr int kMaxConsecutiveRetries = 1000;
// An upper bound on the packets of one export: far beyond any real movie, it only stops a demuxer
// that never reaches its end.
constexpr std::int64_t kMaxPackets = std::int64_t(1) << 32;

enum class Route { Drop, Copy, Video, Splice, Audio };

struct StreamRoute {
    Route route = Route::Drop;
    int outputIndex = -1;                        // for Copy
    ExportAudioStage *audio = nullptr;           // for Audio
};

class Pipeline {
public:
    // `smartCut`: cut H.264 video by copying whole groups and re-encoding only the pictures at the
    // cuts; otherwise every kept picture is re-encoded.
    Pipeline(const ExportJob &job, const CancelToken &cancel, const std::function<void(float)> &progress, bool smartCut)
        : m_job(job), m_cancel(cancel), m_progress(progress), m_smartCut(smartCut)
    {
    }

    OptionalError run()
    {
        OptionalError result = runSteps();
        if (m_cancel.isCancelled())
            return makeMediaError(kMediaErrorCancelled, QStringLiteral("the export was cancelled"));
        return result;
    }

private:
    OptionalError runSteps()
    {
        if (StageResult r = openInput())
            return r;
        if (StageResult r = openOutput())
            return r;
        if (StageResult r = planStreams())
            return r;
        if (StageResult r = writeHeader())
            return r;
        if (StageResult r = seekToCut())
            return r;
        if (StageResult r = pump())
            return r;
        return finish();
    }

    StageResult openInput()
    {
        QString error;
        m_input = media::openInput(m_job.sourcePath, m_cancel, &error);
        if (!m_input)
            return stageError(kMediaErrorCannotOpen, error);
        return std::nullopt;
    }

    StageResult openOutput()
    {
        AVFormatContext *raw = nullptr;
        const QByteArray path = QFile::encodeName(m_job.outputPath);
        int rc = avformat_alloc_output_context2(&raw, nullptr, "mp4", path.constData());
        if (rc < 0 || !raw)
            return stageError(kMediaErrorWriteFailed, QStringLiteral("no MPEG-4 muxer"), rc);
        m_output.reset(raw);
        m_output->interrupt_callback = AVIOInterruptCB{&CancelToken::interruptCallback, const_cast<CancelToken *>(&m_cancel)};
        return std::nullopt;
    }

    PacketWriter writer()
    {
        AVFormatContext *out = m_output.get();
        return [out](AVPacket *packet, AVRational timeBase, int outputIndex) {
            packet->stream_index = outputIndex;
            av_packet_rescale_ts(packet, timeBase, out->streams[outputIndex]->time_base);
            packet->pos = -1;
            return av_interleaved_write_frame(out, packet);
        };
    }

    StageResult addCopy(const AVStream *in, StreamRoute &route)
    {
        Error error;
        const AVStream *out = addStreamCopy(m_output.get(), in, &error);
        if (!out)
            return error;
        route.route = Route::Copy;
        route.outputIndex = out->index;
        return std::nullopt;
    }

    StageResult planStreams()
    {
        const unsigned count = m_input->nb_streams;
        m_routes.assign(count, StreamRoute{});
        std::optional<ExportAudioEncoder::Cut> audioCut;
        if (m_job.cut)
            audioCut = ExportAudioEncoder::Cut{m_job.cut->startMicros + startOffset(), m_job.cut->endMicros + startOffset()};

        for (unsigned i = 0; i < count; ++i) {
            const AVStream *in = m_input->streams[i];
            const AVMediaType type = in->codecpar->codec_type;
            StreamRoute &route = m_routes[i];
            const bool attachedPicture = in->disposition & AV_DISPOSITION_ATTACHED_PIC;
            if (type == AVMEDIA_TYPE_VIDEO && !attachedPicture) {
                if (!m_job.cut) {
                    if (StageResult r = addCopy(in, route))
                        return r;
                    continue;
                }
                const std::int64_t start = m_job.cut->startMicros + startOffset(), end = m_job.cut->endMicros + startOffset();
                if (StageResult r = addSplicedVideo(in, start, end, route))
                    return r;
                if (route.route == Route::Splice)
                    continue;
                Error error;
                auto stage = ExportVideoEncoder::create({in, start, end, std::nullopt}, m_output.get(), writer(), &error);
                if (!stage)
                    return error;
                route.route = Route::Video;
                m_video.push_back(std::move(stage));
            } else if (type == AVMEDIA_TYPE_AUDIO) {
                if (m_job.mixStreamIndices) {
                    const QList<int> &mixed = *m_job.mixStreamIndices;
                    if (!mixed.contains(int(i)))
                        continue; // not in the mix: dropped
                    // One AAC track mixes into itself unchanged: its packets are copied (a save or
                    // an upload copy of a one-track movie is a remux), and a cut cuts it as it
                    // cuts a track without a mix.
                    if (mixed.size() == 1 && in->codecpar->codec_id == AV_CODEC_ID_AAC) {
                        if (StageResult r = m_job.cut ? addCutAudio(in, *audioCut, route) : addCopy(in, route))
                            return r;
                        continue;
                    }
                    if (!m_mixer) {
                        ExportAudioEncoder::Options options;
                        for (int index : mixed) {
                            if (index < 0 || unsigned(index) >= count || m_input->streams[index]->codecpar->codec_type != AVMEDIA_TYPE_AUDIO)
                                return stageError(kMediaErrorInvalidArgument, QStringLiteral("stream %1 is not an audio stream").arg(index));
                            options.inputs.append(m_input->streams[index]);
                        }
                        options.mix = true;
                        options.cut = audioCut;
                        Error error;
                        auto stage = ExportAudioEncoder::create(options, m_output.get(), writer(), &error);
                        if (!stage)
                            return error;
                        m_mixer = stage.get();
                        m_audio.push_back(std::move(stage));
                    }
                    route.route = Route::Audio;
                    route.audio = m_mixer;
                } else if (m_job.cut) {
                    if (StageResult r = addCutAudio(in, *audioCut, route))
                        return r;
                } else if (StageResult r = addCopy(in, route)) {
                    return r;
                }
            } else if (!m_job.cut && !attachedPicture
                       && avformat_query_codec(m_output->oformat, in->codecpar->codec_id, FF_COMPLIANCE_NORMAL) == 1) {
                if (StageResult r = addCopy(in, route))
                    return r;
            } else {
                zaf::log::info(lcExport(), QStringLiteral("stream %1 (%2) is not exported")
                                               .arg(i).arg(QString::fromLatin1(avcodec_get_name(in->codecpar->codec_id))));
            }
        }
        if (m_output->nb_streams == 0)
            return stageError(kMediaErrorNoTracks, QStringLiteral("nothing to export from %1").arg(m_job.sourcePath));
        return std::nullopt;
    }

    // Routes a cut video stream to the splicer when it can be spliced; leaves the route alone (for
    // a full re-encode) otherwise.
    StageResult addSplicedVideo(const AVStream *in, std::int64_t start, std::int64_t end, StreamRoute &route)
    {
        if (!m_smartCut || m_splicer)
            return std::nullopt;
        if (const std::optional<QString> why = ExportVideoSplicer::whyNotSpliceable(in)) {
            zaf::log::info(lcExport(), QStringLiteral("video stream %1 is re-encoded whole: %2").arg(in->index).arg(*why));
            return std::nullopt;
        }
        if (StageResult r = addCopy(in, route))
            return r;
        Error error;
        m_splicer = ExportVideoSplicer::create({in, start, end}, m_output->streams[route.outputIndex], writer(), &error);
        if (!m_splicer)
            return error;
        route.route = Route::Splice;
        return std::nullopt;
    }

    // A cut audio track: AAC packets are copied between the cuts when they can be, anything else
    // is re-encoded.
    StageResult addCutAudio(const AVStream *in, const ExportAudioEncoder::Cut &cut, StreamRoute &route)
    {
        Error error;
        std::unique_ptr<ExportAudioStage> stage;
        const ExportAudioCopier::Options copy{in, cut.startMicros, cut.endMicros};
        if (const std::optional<QString> why = ExportAudioCopier::whyNotCopyable(copy)) {
            zaf::log::info(lcExport(), QStringLiteral("audio stream %1 is re-encoded: %2").arg(in->index).arg(*why));
            stage = ExportAudioEncoder::create({{in}, false, cut}, m_output.get(), writer(), &error);
        } else {
            stage = ExportAudioCopier::create(copy, m_output.get(), writer(), &error);
        }
        if (!stage)
            return error;
        route.route = Route::Audio;
        route.audio = stage.get();
        m_audio.push_back(std::move(stage));
        return std::nullopt;
    }

    // Source timestamps of the movie's first instant (ranges are relative to it).
    std::int64_t startOffset() const
    {
        const std::int64_t start = m_input->start_time;
        return start != AV_NOPTS_VALUE && start > 0 ? start : 0;
    }

    StageResult writeHeader()
    {
        const QByteArray path = QFile::encodeName(m_job.outputPath);
        int rc = avio_open2(&m_output->pb, path.constData(), AVIO_FLAG_WRITE, &m_output->interrupt_callback, nullptr);
        if (rc < 0)
            return writeError(QStringLiteral("cannot write %1").arg(m_job.outputPath), rc);
        rc = avformat_write_header(m_output.get(), nullptr);
        if (rc < 0)
            return writeError(QStringLiteral("cannot write the header of %1").arg(m_job.outputPath), rc);
        return std::nullopt;
    }

    StageResult seekToCut()
    {
        if (!m_job.cut || m_job.cut->startMicros <= 0)
            return std::nullopt;
        std::int64_t preRoll = kAudioPreRollMicros;
        for (unsigned i = 0; i < m_input->nb_streams; ++i) {
            const AVCodecParameters *par = m_input->streams[i]->codecpar;
            if (par->codec_type == AVMEDIA_TYPE_AUDIO && par->sample_rate > 0 && par->frame_size > 0)
                preRoll = std::max(preRoll, av_rescale(2 * par->frame_size, AV_TIME_BASE, par->sample_rate));
        }
        const std::int64_t target = std::max<std::int64_t>(0, m_job.cut->startMicros - preRoll) + startOffset();
        // The latest keyframe at or before the target, for every stream.
        const int rc = avformat_seek_file(m_input.get(), -1, INT64_MIN, target, target, 0);
        if (rc < 0) {
            zaf::log::info(lcExport(), QStringLiteral("seek failed (%1); reading from the start").arg(ff::errorString(rc)));
            avformat_seek_file(m_input.get(), -1, INT64_MIN, 0, 0, 0);
        }
        return std::nullopt;
    }

    bool allStagesPastEnd() const
    {
        if (!m_job.cut)
            return false;
        if (m_splicer && !m_splicer->isPastEnd())
            return false;
        for (const auto &v : m_video) {
            if (!v->isPastEnd())
                return false;
        }
        for (const auto &a : m_audio) {
            if (!a->isPastEnd())
                return false;
        }
        return true;
    }

    void reportProgress(const AVPacket *packet)
    {
        double done = 0, total = 0;
        if (m_job.cut) {
            total = double(m_job.cut->endMicros - m_job.cut->startMicros) / AV_TIME_BASE;
            if (!m_video.empty())
                done = m_video.front()->encodedSeconds();
            else if (packet->pts != AV_NOPTS_VALUE)
                done = packet->pts * av_q2d(m_input->streams[packet->stream_index]->time_base)
                       - double(m_job.cut->startMicros + startOffset()) / AV_TIME_BASE;
        } else {
            total = m_job.durationSeconds;
            if (packet->dts != AV_NOPTS_VALUE)
                done = packet->dts * av_q2d(m_input->streams[packet->stream_index]->time_base);
        }
        if (total > 0 && m_progress)
            m_progress(float(std::clamp(done / total, 0.0, 0.99)));
    }

    StageResult routePacket(AVPacket *packet)
    {
        if (packet->stream_index < 0 || std::size_t(packet->stream_index) >= m_routes.size())
            return std::nullopt; // a stream that appeared after the header was read
        const StreamRoute &route = m_routes[packet->stream_index];
        switch (route.route) {
        case Route::Drop:
            return std::nullopt;
        case Route::Copy: {
            const AVRational timeBase = m_input->streams[packet->stream_index]->time_base;
            const int rc = writer()(packet, timeBase, route.outputIndex);
            if (rc < 0)
                return writeError(QStringLiteral("writing %1").arg(m_job.outputPath), rc);
            return std::nullopt;
        }
        case Route::Video:
            for (const auto &v : m_video) {
                if (v->sourceStreamIndex() == packet->stream_index)
                    return v->sendPacket(packet);
            }
            return std::nullopt;
        case Route::Splice:
            return m_splicer->sendPacket(packet);
        case Route::Audio:
            return route.audio->sendPacket(packet);
        }
        return std::nullopt;
    }

    StageResult pump()
    {
        ff::AVPacketPtr packet = ff::makePacket();
        int retries = 0;
        for (std::int64_t n = 0; n < kMaxPackets; ++n) {
            if (m_cancel.isCancelled())
                return makeMediaError(kMediaErrorCancelled, QStringLiteral("the export was cancelled"));
            const int rc = av_read_frame(m_input.get(), packet.get());
            if (rc == AVERROR_EOF)
                return std::nullopt;
            if (rc == AVERROR(EAGAIN)) {
                if (++retries > kMaxConsecutiveRetries)
                    return stageError(kMediaErrorDecodeFailed, QStringLiteral("the source stopped delivering data"), rc);
                continue;
            }
            if (rc < 0)
                return stageError(kMediaErrorDecodeFailed, QStringLiteral("the source is damaged or truncated: %1").arg(m_job.sourcePath), rc);
            retries = 0;
            reportProgress(packet.get());
            StageResult r = routePacket(packet.get());
            av_packet_unref(packet.get());
            if (r)
                return r;
            if (allStagesPastEnd())
                return std::nullopt;
        }
        return stageError(kMediaErrorDecodeFailed, QStringLiteral("the source never ends: %1").arg(m_job.sourcePath));
    }

    StageResult finish()
    {
        if (m_splicer) {
            if (StageResult r = m_splicer->finish())
                return r;
        }
        for (const auto &v : m_video) {
            if (StageResult r = v->finish())
                return r;
        }
        for (const auto &a : m_audio) {
            if (StageResult r = a->finish())
                return r;
        }
        int rc = av_write_trailer(m_output.get());
        if (rc < 0)
            return writeError(QStringLiteral("cannot finish %1").arg(m_job.outputPath), rc);
        avio_flush(m_output->pb);
        if (m_output->pb->error < 0)
            return writeError(QStringLiteral("cannot write %1").arg(m_job.outputPath), m_output->pb->error);
        rc = avio_closep(&m_output->pb);
        if (rc < 0)
            return writeError(QStringLiteral("cannot close %1").arg(m_job.outputPath), rc);
        if (m_splicer) {
            zaf::log::info(lcExport(), QStringLiteral("cut by copying %1 pictures and re-encoding %2")
                                           .arg(m_splicer->copiedPictures()).arg(m_splicer->encodedPictures()));
            if (const std::optional<QString> why = checkSplices(m_job.outputPath, m_splicer->splicePoints(), m_cancel))
                return spliceError(*why);
        }
        if (m_progress)
            m_progress(1.0f);
        return std::nullopt;
    }

    const ExportJob &m_job;
    const CancelToken &m_cancel;
    const std::function<void(float)> &m_progress;
    ff::InputFormatContextPtr m_input;
    // Declared before the stages: the stages' writers point at it, and it outlives them.
    ff::OutputFormatContextPtr m_output;
    std::vector<StreamRoute> m_routes;
    const bool m_smartCut;
    std::vector<std::unique_ptr<ExportVideoEncoder>> m_video;
    std::unique_ptr<ExportVideoSplicer> m_splicer;
    std::vector<std::unique_ptr<ExportAudioStage>> m_audio;
    ExportAudioEncoder *m_mixer = nullptr;
};

} // namespace

OptionalError runExport(const ExportJob &job, const CancelToken &cancel, const std::function<void(float)> &progress)
{
    // Progress never runs backwards, also when a smart cut is redone as a full re-encode.
    float reported = 0;
    const std::function<void(float)> monotonic = [&](float value) {
        if (value > reported || value >= 1.0f) {
            reported = std::max(reported, value);
            if (progress)
                progress(reported);
        }
    };
    OptionalError result = Pipeline(job, cancel, monotonic, true).run();
    if (result && isSpliceError(*result)) {
        zaf::log::info(lcExport(), QStringLiteral("the smart cut of %1 is redone as a full re-encode: %2").arg(job.sourcePath, result->message));
        result = Pipeline(job, cancel, monotonic, false).run();
    }
    return result;
}

} // namespace zaf::media::exportpipe
