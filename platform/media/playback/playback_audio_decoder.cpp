#include "platform/media/playback/playback_audio_decoder.h"

#include "platform/log.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/media_input.h"
#include "platform/media/core/media_log.h"

#include <algorithm>
#include <cmath>
#include <vector>

namespace zaf::media::playback {

namespace {

constexpr int kMaxConsecutiveReadRetries = 1000;
// A stream that starts later than the requested time is padded with silence, at most this long.
constexpr double kMaxLeadingSilenceSeconds = 10;
// When one stream has this much audio waiting while another has none, the silent one is taken as
// having a gap and the mix goes on without it.
constexpr double kMaxStreamSkewSeconds = 2;

struct StreamDecoder {
    int index = -1;
    double timeBase = 0;
    ff::CodecContextPtr codec;
    ff::SwrContextPtr swr;
    std::vector<float> pending; // interleaved output-format samples waiting to be mixed
    bool started = false;       // a frame arrived since the last seek
    bool ended = false;
};

bool makeResampler(StreamDecoder &s, const AudioOutputFormat &out)
{
    AVChannelLayout inLayout;
    if (s.codec->ch_layout.order == AV_CHANNEL_ORDER_UNSPEC || s.codec->ch_layout.nb_channels <= 0)
        av_channel_layout_default(&inLayout, std::max(1, s.codec->ch_layout.nb_channels));
    else
        av_channel_layout_copy(&inLayout, &s.codec->ch_layout);
    AVChannelLayout outLayout;
    av_channel_layout_default(&outLayout, out.channels);
    SwrContext *raw = nullptr;
    int rc = swr_alloc_set_opts2(&raw, &outLayout, AV_SAMPLE_FMT_FLT, out.sampleRate, &inLayout,
        s.codec->sample_fmt, s.codec->sample_rate, 0, nullptr);
    av_channel_layout_uninit(&inLayout);
    av_channel_layout_uninit(&outLayout);
    s.swr.reset(raw);
    if (rc < 0 || !raw)
        return false;
    return swr_init(raw) >= 0;
}

} // namespace

AudioDecoder::AudioDecoder(QString path, QList<int> streamIndexes, AudioOutputFormat format, AudioRing *ring,
    std::function<void(const QString &)> failed)
    : m_path(std::move(path))
    , m_streams(std::move(streamIndexes))
    , m_format(format)
    , m_ring(ring)
    , m_failed(std::move(failed))
{
    m_thread = std::thread([this] { run(); });
}

AudioDecoder::~AudioDecoder()
{
    m_stop.cancel();
    m_wake.notify_all();
    m_ring->wake();
    if (m_thread.joinable())
        m_thread.join();
}

std::uint64_t AudioDecoder::start(std::int64_t targetNs)
{
    std::uint64_t number;
    {
        std::lock_guard lock(m_mutex);
        m_target = targetNs;
        m_hasRequest = true;
        number = ++m_latest;
    }
    m_wake.notify_all();
    m_ring->wake();
    return number;
}

void AudioDecoder::stop()
{
    {
        std::lock_guard lock(m_mutex);
        m_target.reset();
        m_hasRequest = true;
        ++m_latest;
    }
    m_wake.notify_all();
    m_ring->wake();
}

void AudioDecoder::run()
{
    QString error;
    ff::InputFormatContextPtr format = openInput(m_path, m_stop, &error);
    if (!format) {
        if (!m_stop.isCancelled())
            m_failed(QStringLiteral("no audio playback: %1").arg(error));
        return;
    }
    std::vector<StreamDecoder> streams;
    for (int index : m_streams) {
        if (index < 0 || index >= int(format->nb_streams) || format->streams[index]->codecpar->codec_type != AVMEDIA_TYPE_AUDIO)
            continue;
        StreamDecoder s;
        s.index = index;
        s.timeBase = av_q2d(format->streams[index]->time_base);
        s.codec = openDecoder(format->streams[index], DecoderOptions{2}, &error);
        if (!s.codec) {
            zaf::log::error(lcPlayback(), QStringLiteral("audio stream %1 of %2 is skipped: %3").arg(index).arg(m_path, error));
            continue;
        }
        if (!makeResampler(s, m_format)) {
            zaf::log::error(lcPlayback(), QStringLiteral("audio stream %1 of %2 cannot be resampled").arg(index).arg(m_path));
            continue;
        }
        streams.push_back(std::move(s));
    }
    if (streams.empty()) {
        m_failed(QStringLiteral("%1 has no playable audio").arg(m_path));
        return;
    }
    for (unsigned i = 0; i < format->nb_streams; ++i) {
        const bool used = std::any_of(streams.begin(), streams.end(), [i](const StreamDecoder &s) { return s.index == int(i); });
        if (!used)
            format->streams[i]->discard = AVDISCARD_ALL;
    }

    const double startSeconds = containerStartSeconds(format.get());
    const int channels = m_format.channels;
    ff::AVPacketPtr packet = ff::makePacket();
    ff::AVFramePtr frame = ff::makeFrame();
    if (!packet || !frame)
        return;

    std::uint64_t request = 0;
    bool active = false;
    bool draining = false;
    double targetSeconds = 0;
    int readRetries = 0;
    std::vector<float> mixed;
    std::vector<std::int16_t> converted;

    auto giveUp = [&] { return m_stop.isCancelled() || m_latest.load() != request; };

    // Mixes and writes what every live stream has; with `all`, everything that is left.
    auto writeMix = [&](bool all) {
        std::size_t frames = SIZE_MAX;
        std::size_t most = 0;
        for (const StreamDecoder &s : streams) {
            most = std::max(most, s.pending.size() / channels);
            if (!s.ended)
                frames = std::min(frames, s.pending.size() / channels);
        }
        if (all || frames == SIZE_MAX || most > std::size_t(kMaxStreamSkewSeconds * m_format.sampleRate))
            frames = most;
        if (frames == 0)
            return true;
        mixed.assign(frames * channels, 0.0f);
        for (StreamDecoder &s : streams) {
            const std::size_t take = std::min(frames * channels, s.pending.size());
            for (std::size_t i = 0; i < take; ++i)
                mixed[i] += s.pending[i];
            s.pending.erase(s.pending.begin(), s.pending.begin() + qsizetype(take));
        }
        for (float &v : mixed)
            v = std::clamp(v, -1.0f, 1.0f);
        if (m_format.float32)
            return m_ring->write(reinterpret_cast<const char *>(mixed.data()), qsizetype(mixed.size() * sizeof(float)), giveUp);
        converted.resize(mixed.size());
        for (std::size_t i = 0; i < mixed.size(); ++i)
            converted[i] = std::int16_t(std::lrint(mixed[i] * 32767.0f));
        return m_ring->write(reinterpret_cast<const char *>(converted.data()), qsizetype(converted.size() * sizeof(std::int16_t)), giveUp);
    };

    auto resampleInto = [&](StreamDecoder &s, const AVFrame *f) {
        const int capacity = swr_get_out_samples(s.swr.get(), f ? f->nb_samples : 0);
        if (capacity <= 0)
            return;
        std::vector<float> out(std::size_t(capacity) * channels);
        uint8_t *dst[1] = {reinterpret_cast<uint8_t *>(out.data())};
        const int produced = swr_convert(s.swr.get(), dst, capacity,
            f ? const_cast<const uint8_t **>(f->extended_data) : nullptr, f ? f->nb_samples : 0);
        if (produced <= 0)
            return;
        out.resize(std::size_t(produced) * channels);
        std::size_t skip = 0;
        if (!s.started && f) {
            s.started = true;
            const std::int64_t ts = f->best_effort_timestamp != AV_NOPTS_VALUE ? f->best_effort_timestamp : f->pts;
            if (ts != AV_NOPTS_VALUE) {
                const double offset = targetSeconds - (double(ts) * s.timeBase - startSeconds);
                if (offset > 0)
                    skip = std::size_t(std::llround(offset * m_format.sampleRate)) * channels;
                else if (offset < 0)
                    s.pending.assign(std::size_t(std::llround(std::min(-offset, kMaxLeadingSilenceSeconds) * m_format.sampleRate)) * channels, 0.0f);
            }
        }
        if (skip >= out.size())
            return;
        s.pending.insert(s.pending.end(), out.begin() + qsizetype(skip), out.end());
    };

    auto drainStream = [&](StreamDecoder &s) {
        for (;;) {
            const int rc = avcodec_receive_frame(s.codec.get(), frame.get());
            if (rc == AVERROR_EOF) {
                resampleInto(s, nullptr);
                s.ended = true;
                return;
            }
            if (rc < 0)
                return;
            resampleInto(s, frame.get());
            av_frame_unref(frame.get());
        }
    };

    while (!m_stop.isCancelled()) {
        {
            std::unique_lock lock(m_mutex);
            if (!m_hasRequest && !active)
                m_wake.wait(lock, [this] { return m_stop.isCancelled() || m_hasRequest; });
            if (m_stop.isCancelled())
                break;
            if (m_hasRequest) {
                m_hasRequest = false;
                request = m_latest.load();
                const std::optional<std::int64_t> target = m_target;
                lock.unlock();
                m_ring->clear();
                m_serving = request;
                active = target.has_value();
                if (!active)
                    continue;
                targetSeconds = double(*target) / 1e9;
                const std::int64_t ts = std::llround((targetSeconds + startSeconds) * AV_TIME_BASE);
                const int rc = av_seek_frame(format.get(), -1, ts, AVSEEK_FLAG_BACKWARD);
                if (rc < 0 && !m_stop.isCancelled())
                    zaf::log::error(lcPlayback(), QStringLiteral("cannot seek the audio of %1: %2").arg(m_path, ff::errorString(rc)));
                for (StreamDecoder &s : streams) {
                    avcodec_flush_buffers(s.codec.get());
                    makeResampler(s, m_format);
                    s.pending.clear();
                    s.started = false;
                    s.ended = false;
                }
                draining = false;
                readRetries = 0;
            }
        }

        if (!draining) {
            int rc = av_read_frame(format.get(), packet.get());
            if (rc == AVERROR(EAGAIN)) {
                if (++readRetries < kMaxConsecutiveReadRetries)
                    continue;
                rc = AVERROR_EOF;
            }
            if (rc < 0) {
                if (rc != AVERROR_EOF && !m_stop.isCancelled())
                    zaf::log::error(lcPlayback(), QStringLiteral("reading the audio of %1 stopped: %2").arg(m_path, ff::errorString(rc)));
                draining = true;
                for (StreamDecoder &s : streams) {
                    avcodec_send_packet(s.codec.get(), nullptr);
                    drainStream(s);
                }
                if (writeMix(true) && !giveUp())
                    m_ring->setEnded();
                active = false;
                continue;
            }
            readRetries = 0;
            for (StreamDecoder &s : streams) {
                if (s.index == packet->stream_index) {
                    avcodec_send_packet(s.codec.get(), packet.get());
                    drainStream(s);
                }
            }
            av_packet_unref(packet.get());
            writeMix(false);
        }
    }
}

} // namespace zaf::media::playback
