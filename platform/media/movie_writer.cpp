#include "platform/media/movie_writer.h"
#include "platform/media/core/media_log.h"

#include "platform/files/atomic_file.h"
#include "platform/log.h"
#include "platform/media/core/ffmpeg_ptr.h"
#include "platform/media/core/frame_converter.h"
#include "platform/media/media_asset.h"

extern "C" {
#include <libavutil/channel_layout.h>
#include <libavutil/display.h>
#include <libavutil/opt.h>
}

#include <QFile>
#include <QFileInfo>
#include <QLoggingCategory>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <vector>

namespace zaf::media {

namespace {

using zaf::media::lcMedia;

Error writerError(int code, const QString &message)
{
    zaf::log::error(lcMedia(), QStringLiteral("MovieWriter: %1").arg(message));
    return Error{QString::fromLatin1(kMediaErrorDomain), code, message};
}

// ENOSPC from FFmpeg or the file system is "disk full"; every other write failure is generic.
int writeErrorCode(int averror)
{
    return averror == AVERROR(ENOSPC) ? kMediaErrorDiskFull : kMediaErrorWriteFailed;
}

// A file error in the POSIX domain, told as the writer's error.
Error fileError(const Error &posix, const QString &what)
{
    const int code = posix.code == EEXIST ? kMediaErrorOutputExists
        : (posix.code == ENOSPC || posix.code == EDQUOT) ? kMediaErrorDiskFull
                                                          : kMediaErrorWriteFailed;
    return writerError(code, QStringLiteral("%1: %2").arg(what, posix.message));
}

struct VideoTrack {
    ff::CodecContextPtr encoder;
    AVStream *stream = nullptr;
    ff::AVFramePtr frame;
    FrameConverter converter;
    std::int64_t nextPts = 0;
};

struct AudioTrack {
    ff::CodecContextPtr encoder;
    AVStream *stream = nullptr;
    ff::AVFramePtr frame;
    int filled = 0;          // samples already in `frame`
    std::int64_t nextPts = 0;
};

} // namespace

struct MovieWriter::Private {
    Settings settings;
    QString finalPath;
    std::unique_ptr<AtomicFile> file;   // the movie under its temporary name until finish()
    QString tempPath;                   // file's temporary path, for messages
    ff::OutputFormatContextPtr output;
    VideoTrack video;
    std::vector<AudioTrack> audio;
    ff::AVPacketPtr packet;
    bool headerWritten = false;
    bool done = false;           // finished, or failed beyond repair
    OptionalError failure;

    ~Private()
    {
        // The muxer lets go of the temporary file before the file discards it.
        output.reset();
        file.reset();
    }

    OptionalError fail(Error error)
    {
        done = true;
        failure = error;
        return error;
    }

    // Takes every packet the encoder has ready and hands it to the muxer.
    OptionalError drain(AVCodecContext *encoder, AVStream *stream)
    {
        for (;;) {
            int rc = avcodec_receive_packet(encoder, packet.get());
            if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
                return std::nullopt;
            if (rc < 0)
                return fail(writerError(kMediaErrorEncodeFailed,
                                        QStringLiteral("encoding stream %1 failed: %2").arg(stream->index).arg(ff::errorString(rc))));
            av_packet_rescale_ts(packet.get(), encoder->time_base, stream->time_base);
            packet->stream_index = stream->index;
            rc = av_interleaved_write_frame(output.get(), packet.get());
            if (rc < 0)
                return fail(writerError(writeErrorCode(rc),
                                        QStringLiteral("writing %1 failed: %2").arg(tempPath, ff::errorString(rc))));
        }
    }

    OptionalError encode(AVCodecContext *encoder, AVStream *stream, const AVFrame *frame)
    {
        const int rc = avcodec_send_frame(encoder, frame);
        if (rc < 0 && rc != AVERROR_EOF)
            return fail(writerError(kMediaErrorEncodeFailed,
                                    QStringLiteral("encoding stream %1 failed: %2").arg(stream->index).arg(ff::errorString(rc))));
        return drain(encoder, stream);
    }

    OptionalError sendAudioFrame(AudioTrack &track)
    {
        if (track.filled == 0)
            return std::nullopt;
        AVFrame *frame = track.frame.get();
        const int frameSize = track.encoder->frame_size;
        if (track.filled < frameSize) {
            if (track.encoder->codec->capabilities & AV_CODEC_CAP_SMALL_LAST_FRAME) {
                frame->nb_samples = track.filled;
            } else {
                for (int c = 0; c < track.encoder->ch_layout.nb_channels; ++c)
                    std::fill_n(reinterpret_cast<float *>(frame->data[c]) + track.filled, frameSize - track.filled, 0.0f);
            }
        }
        frame->pts = track.nextPts;
        track.nextPts += frame->nb_samples;
        track.filled = 0;
        return encode(track.encoder.get(), track.stream, frame);
    }

    OptionalError openVideo(const AVCodec *codec);
    OptionalError openAudio(const AVCodec *codec);
};

OptionalError MovieWriter::Private::openVideo(const AVCodec *codec)
{
    const AVRational rate = av_d2q(settings.frameRate, 1001000);
    video.stream = avformat_new_stream(output.get(), nullptr);
    video.encoder.reset(avcodec_alloc_context3(codec));
    if (!video.stream || !video.encoder)
        return writerError(kMediaErrorEncodeFailed, QStringLiteral("out of memory setting up the video encoder"));
    AVCodecContext *enc = video.encoder.get();
    enc->width = settings.videoSize.width();
    enc->height = settings.videoSize.height();
    enc->pix_fmt = AV_PIX_FMT_YUV420P;
    enc->time_base = av_inv_q(rate);
    enc->framerate = rate;
    enc->gop_size = settings.gopLength;
    enc->keyint_min = settings.gopLength;
    enc->sample_aspect_ratio = AVRational{1, 1};
    enc->color_range = AVCOL_RANGE_MPEG;
    enc->colorspace = AVCOL_SPC_SMPTE170M;
    enc->color_primaries = AVCOL_PRI_SMPTE170M;
    enc->color_trc = AVCOL_TRC_SMPTE170M;
    enc->thread_count = 0;
    if (output->oformat->flags & AVFMT_GLOBALHEADER)
        enc->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    av_opt_set(enc->priv_data, "preset", settings.preset.toUtf8().constData(), 0);
    av_opt_set_double(enc->priv_data, "crf", settings.crf, 0);
    // Keyframes exactly every gopLength frames (no scene-cut keyframes, closed GOPs): seeking and
    // fast thumbnails can count on where the sync samples are.
    av_opt_set(enc->priv_data, "x264-params", "scenecut=0:open-gop=0", 0);

    int rc = avcodec_open2(enc, codec, nullptr);
    if (rc < 0)
        return writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot open the H.264 encoder: %1").arg(ff::errorString(rc)));
    rc = avcodec_parameters_from_context(video.stream->codecpar, enc);
    if (rc < 0)
        return writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot describe the video stream: %1").arg(ff::errorString(rc)));
    video.stream->time_base = enc->time_base;
    video.stream->avg_frame_rate = rate;

    if (settings.rotation != 0) {
        // av_display_rotation_set builds the matrix of a clockwise turn (readers get it back from
        // av_display_rotation_get as the negative, counter-clockwise angle).
        auto *matrix = reinterpret_cast<int32_t *>(
            av_stream_new_side_data(video.stream, AV_PKT_DATA_DISPLAYMATRIX, sizeof(int32_t) * 9));
        if (!matrix)
            return writerError(kMediaErrorEncodeFailed, QStringLiteral("out of memory storing the rotation"));
        av_display_rotation_set(matrix, double(settings.rotation));
    }

    video.frame = ff::makeFrame();
    if (!video.frame)
        return writerError(kMediaErrorEncodeFailed, QStringLiteral("out of memory allocating a video frame"));
    video.frame->format = enc->pix_fmt;
    video.frame->width = enc->width;
    video.frame->height = enc->height;
    rc = av_frame_get_buffer(video.frame.get(), 0);
    if (rc < 0)
        return writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot allocate a video frame: %1").arg(ff::errorString(rc)));
    return std::nullopt;
}

OptionalError MovieWriter::Private::openAudio(const AVCodec *codec)
{
    for (int i = 0; i < settings.audioTracks; ++i) {
        AudioTrack track;
        track.stream = avformat_new_stream(output.get(), nullptr);
        track.encoder.reset(avcodec_alloc_context3(codec));
        if (!track.stream || !track.encoder)
            return writerError(kMediaErrorEncodeFailed, QStringLiteral("out of memory setting up an audio encoder"));
        AVCodecContext *enc = track.encoder.get();
        enc->sample_fmt = AV_SAMPLE_FMT_FLTP;
        enc->sample_rate = settings.sampleRate;
        av_channel_layout_default(&enc->ch_layout, settings.channels);
        enc->bit_rate = settings.audioBitRate;
        enc->time_base = AVRational{1, settings.sampleRate};
        if (output->oformat->flags & AVFMT_GLOBALHEADER)
            enc->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
        int rc = avcodec_open2(enc, codec, nullptr);
        if (rc < 0)
            return writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot open the AAC encoder: %1").arg(ff::errorString(rc)));
        rc = avcodec_parameters_from_context(track.stream->codecpar, enc);
        if (rc < 0)
            return writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot describe an audio stream: %1").arg(ff::errorString(rc)));
        track.stream->time_base = enc->time_base;

        track.frame = ff::makeFrame();
        if (!track.frame)
            return writerError(kMediaErrorEncodeFailed, QStringLiteral("out of memory allocating an audio frame"));
        track.frame->format = enc->sample_fmt;
        track.frame->sample_rate = enc->sample_rate;
        track.frame->nb_samples = enc->frame_size > 0 ? enc->frame_size : 1024;
        av_channel_layout_copy(&track.frame->ch_layout, &enc->ch_layout);
        rc = av_frame_get_buffer(track.frame.get(), 0);
        if (rc < 0)
            return writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot allocate an audio frame: %1").arg(ff::errorString(rc)));
        audio.push_back(std::move(track));
    }
    return std::nullopt;
}

MovieWriter::MovieWriter() : d(std::make_unique<Private>()) {}

MovieWriter::~MovieWriter() = default;

Result<std::unique_ptr<MovieWriter>> MovieWriter::create(const QString &path, const Settings &requested)
{
    ensureFFmpegLogging();
    using R = Result<std::unique_ptr<MovieWriter>>;
    Settings settings = requested;
    if (path.isEmpty())
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("no output path")));
    if (settings.videoSize.width() < 2 || settings.videoSize.height() < 2
        || qint64(settings.videoSize.width()) * settings.videoSize.height() > ff::kMaxPixels)
        return R::failure(writerError(kMediaErrorInvalidArgument,
                                      QStringLiteral("unsupported picture size %1x%2").arg(settings.videoSize.width()).arg(settings.videoSize.height())));
    // 4:2:0 chroma needs even dimensions.
    settings.videoSize = QSize((settings.videoSize.width() + 1) & ~1, (settings.videoSize.height() + 1) & ~1);
    if (!(settings.frameRate >= 1 && settings.frameRate <= 240))
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("unsupported frame rate %1").arg(settings.frameRate)));
    if (settings.audioTracks < 0 || settings.audioTracks > 16)
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("unsupported number of audio tracks %1").arg(settings.audioTracks)));
    if (settings.channels != 1 && settings.channels != 2)
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("unsupported channel count %1").arg(settings.channels)));
    if (settings.sampleRate < 8000 || settings.sampleRate > 96000)
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("unsupported sample rate %1").arg(settings.sampleRate)));
    if (settings.rotation != 0 && settings.rotation != 90 && settings.rotation != 180 && settings.rotation != 270)
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("unsupported rotation %1").arg(settings.rotation)));
    if (settings.crf < 0 || settings.crf > 51 || settings.gopLength < 1)
        return R::failure(writerError(kMediaErrorInvalidArgument, QStringLiteral("unsupported quality settings")));

    const QFileInfo target(path);

    const AVCodec *videoCodec = avcodec_find_encoder_by_name("libx264");
    const AVCodec *audioCodec = avcodec_find_encoder(AV_CODEC_ID_AAC);
    if (!videoCodec || (settings.audioTracks > 0 && !audioCodec))
        return R::failure(writerError(kMediaErrorEncodeFailed, QStringLiteral("the H.264 or AAC encoder is not available")));

    std::unique_ptr<MovieWriter> writer(new MovieWriter);
    Private &d = *writer->d;
    d.settings = settings;
    d.finalPath = target.absoluteFilePath();

    // The movie is written under a temporary name beside the target and put in place by finish().
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(d.finalPath);
    if (!file.ok())
        return R::failure(fileError(*file.error, QStringLiteral("cannot create the movie")));
    d.file = std::move(*file.value);
    d.tempPath = d.file->temporaryPath();
    const QByteArray pattern = QFile::encodeName(d.tempPath);

    AVFormatContext *raw = nullptr;
    int rc = avformat_alloc_output_context2(&raw, nullptr, "mp4", pattern.constData());
    d.output.reset(raw);
    if (rc < 0 || !raw)
        return R::failure(writerError(kMediaErrorWriteFailed, QStringLiteral("cannot set up an MPEG-4 file: %1").arg(ff::errorString(rc))));
    d.packet = ff::makePacket();
    if (!d.packet)
        return R::failure(writerError(kMediaErrorEncodeFailed, QStringLiteral("out of memory")));

    if (OptionalError e = d.openVideo(videoCodec))
        return R::failure(*e);
    if (OptionalError e = d.openAudio(audioCodec))
        return R::failure(*e);

    rc = avio_open(&d.output->pb, pattern.constData(), AVIO_FLAG_WRITE);
    if (rc < 0)
        return R::failure(writerError(writeErrorCode(rc), QStringLiteral("cannot open %1: %2").arg(d.tempPath, ff::errorString(rc))));
    rc = avformat_write_header(d.output.get(), nullptr);
    if (rc < 0)
        return R::failure(writerError(writeErrorCode(rc), QStringLiteral("cannot write the header of %1: %2").arg(d.tempPath, ff::errorString(rc))));
    d.headerWritten = true;
    zaf::log::info(lcMedia(), QStringLiteral("MovieWriter: writing %1 (%2x%3, %4 fps, %5 audio tracks)")
                                  .arg(d.finalPath).arg(settings.videoSize.width()).arg(settings.videoSize.height())
                                  .arg(settings.frameRate).arg(settings.audioTracks));
    return R::success(std::move(writer));
}

OptionalError MovieWriter::appendVideoFrame(const QImage &image)
{
    if (d->done)
        return d->failure ? d->failure : writerError(kMediaErrorInvalidArgument, QStringLiteral("frame appended after finish"));
    VideoTrack &video = d->video;
    AVFrame *frame = video.frame.get();
    int rc = av_frame_make_writable(frame);
    if (rc < 0)
        return d->fail(writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot get a video frame: %1").arg(ff::errorString(rc))));

    if (image.isNull()) {
        const int w = frame->width, h = frame->height;
        for (int y = 0; y < h; ++y)
            std::memset(frame->data[0] + y * frame->linesize[0], 16, w);
        for (int y = 0; y < h / 2; ++y) {
            std::memset(frame->data[1] + y * frame->linesize[1], 128, w / 2);
            std::memset(frame->data[2] + y * frame->linesize[2], 128, w / 2);
        }
    } else {
        if (!video.converter.convertImageInto(image, frame, SWS_BICUBIC))
            return d->fail(writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot convert a %1x%2 picture").arg(image.width()).arg(image.height())));
    }
    frame->pts = video.nextPts++;
    return d->encode(video.encoder.get(), video.stream, frame);
}

OptionalError MovieWriter::appendAudio(int trackIndex, const float *interleaved, qint64 frames)
{
    if (d->done)
        return d->failure ? d->failure : writerError(kMediaErrorInvalidArgument, QStringLiteral("audio appended after finish"));
    if (trackIndex < 0 || trackIndex >= int(d->audio.size()))
        return writerError(kMediaErrorInvalidArgument, QStringLiteral("no audio track %1").arg(trackIndex));
    if (frames < 0 || (frames > 0 && !interleaved))
        return writerError(kMediaErrorInvalidArgument, QStringLiteral("no samples"));
    AudioTrack &track = d->audio[size_t(trackIndex)];
    const int channels = track.encoder->ch_layout.nb_channels;
    const int frameSize = track.frame->nb_samples;
    qint64 done = 0;
    while (done < frames) {
        AVFrame *frame = track.frame.get();
        if (track.filled == 0) {
            frame->nb_samples = frameSize;
            const int rc = av_frame_make_writable(frame);
            if (rc < 0)
                return d->fail(writerError(kMediaErrorEncodeFailed, QStringLiteral("cannot get an audio frame: %1").arg(ff::errorString(rc))));
        }
        const int n = int(std::min<qint64>(frames - done, frameSize - track.filled));
        for (int c = 0; c < channels; ++c) {
            float *plane = reinterpret_cast<float *>(frame->data[c]) + track.filled;
            const float *src = interleaved + done * channels + c;
            for (int i = 0; i < n; ++i)
                plane[i] = std::clamp(src[i * channels], -1.0f, 1.0f);
        }
        track.filled += n;
        done += n;
        if (track.filled == frameSize) {
            if (OptionalError e = d->sendAudioFrame(track))
                return e;
        }
    }
    return std::nullopt;
}

OptionalError MovieWriter::finish()
{
    if (d->done)
        return d->failure ? d->failure : writerError(kMediaErrorInvalidArgument, QStringLiteral("finish called twice"));
    for (AudioTrack &track : d->audio) {
        if (OptionalError e = d->sendAudioFrame(track))
            return e;
        if (OptionalError e = d->encode(track.encoder.get(), track.stream, nullptr))
            return e;
    }
    if (OptionalError e = d->encode(d->video.encoder.get(), d->video.stream, nullptr))
        return e;

    int rc = av_write_trailer(d->output.get());
    if (rc < 0)
        return d->fail(writerError(writeErrorCode(rc), QStringLiteral("cannot complete %1: %2").arg(d->tempPath, ff::errorString(rc))));
    rc = avio_closep(&d->output->pb);
    if (rc < 0)
        return d->fail(writerError(writeErrorCode(rc), QStringLiteral("cannot close %1: %2").arg(d->tempPath, ff::errorString(rc))));
    d->output.reset();

    if (OptionalError e = d->file->commit())
        return d->fail(fileError(*e, QStringLiteral("cannot put the movie in place")));
    d->done = true;
    zaf::log::info(lcMedia(), QStringLiteral("MovieWriter: finished %1 (%2 frames)").arg(d->finalPath).arg(d->video.nextPts));
    return std::nullopt;
}

const MovieWriter::Settings &MovieWriter::settings() const
{
    return d->settings;
}

qint64 MovieWriter::videoFramesWritten() const
{
    return d->video.nextPts;
}

QString MovieWriter::path() const
{
    return d->finalPath;
}

} // namespace zaf::media
