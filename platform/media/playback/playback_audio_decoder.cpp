#include "platform/media/playback/playback_audio_decoder.h"

#include "platform/log.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/media_input.h"
#include "platform/media/core/media_log.h"
#include "platform/media/playback/playback_audio_mix.h"

#include <algorithm>
#include <cmath>
#include <vector>

namespace zaf::media::playback {

namespace {

// A stalled source (EAGAIN over and over) ends the stream after this many attempts in a row.
constexpr int kMaxConsecutiveReadRetries = 1000;
// When one stream has this much audio waiting while another has none, the silent one is taken as
// having a gap and the mix goes on without it.
constexpr double kMaxStreamSkewSeconds = 2;

// One audio stream of the movie, decoded and resampled to the output format.
struct AudioStream {
    int index = -1;
    double timeBase = 0;
    ff::CodecContextPtr codec;
    ff::SwrContextPtr swr;
    bool started = false; // a frame arrived since the last seek
};

bool makeResampler(AudioStream &s, const AudioOutputFormat &out)
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

// One run of the decoder thread: the opened input and its audio streams, the mix of what they
// decoded, and where the request under way stands. Every step runs on the decoder thread.
struct AudioDecoder::DecodeRun {
    explicit DecodeRun(AudioDecoder &owner)
        : d(owner)
        , mix(owner.m_format.channels, std::size_t(kMaxStreamSkewSeconds * owner.m_format.sampleRate))
    {
    }

    // Opens the input and a decoder and resampler for each of the requested audio streams that has
    // them; says why not through `failed` when none has.
    bool open();
    // Takes a new request, if one came: empties the ring and seeks to a start's target; while there
    // is nothing to decode, waits for one. False once the thread is to stop.
    bool takeRequest();
    void seek(std::int64_t targetNs);
    enum class Read { Packet, Retry, Ended };
    // Reads the next packet; a stalled read is to be tried again, up to a limit.
    Read readPacket();
    // Decodes the packet read into its stream, then mixes and writes what every stream has.
    void decodePacket();
    // The end of the input: drains every stream, writes all that is left and marks the ring's end.
    void endOfInput();
    // Receives the frames the stream's decoder has ready into its lane of the mix.
    void receive(std::size_t lane);
    void resample(std::size_t lane, const AVFrame *frame);
    // Writes the mix into the ring, waiting for room. False when abandoned while waiting.
    bool writeMix(bool all);
    bool abandoned() const { return d.m_thread.stopping() || d.m_thread.hasNewerRequest(); }

    AudioDecoder &d;

    // The input, from open() on.
    ff::InputFormatContextPtr format;
    std::vector<AudioStream> streams; // the lanes of the mix, in this order
    double startSeconds = 0;
    ff::AVPacketPtr packet;
    ff::AVFramePtr frame;

    // The request under way.
    bool active = false; // false: nothing to decode until the next request
    double targetSeconds = 0;
    int readRetries = 0;
    AudioMix mix;
    std::vector<float> resampled;
    std::vector<std::int16_t> converted;
};

AudioDecoder::AudioDecoder(QString path, QList<int> streamIndexes, AudioOutputFormat format, AudioRing *ring,
    std::function<void(const QString &)> failed)
    : m_path(std::move(path))
    , m_streams(std::move(streamIndexes))
    , m_format(format)
    , m_ring(ring)
    , m_failed(std::move(failed))
    , m_thread([this] { m_ring->wake(); })
{
    m_thread.start([this] { run(); });
}

AudioDecoder::~AudioDecoder()
{
    m_thread.stop();
}

std::uint64_t AudioDecoder::start(std::int64_t targetNs)
{
    return m_thread.post(Request{targetNs});
}

void AudioDecoder::stop()
{
    m_thread.post(Request{std::nullopt});
}

void AudioDecoder::run()
{
    DecodeRun run(*this);
    if (!run.open())
        return;
    while (run.takeRequest()) {
        if (!run.active)
            continue;
        switch (run.readPacket()) {
        case DecodeRun::Read::Retry:
            break;
        case DecodeRun::Read::Ended:
            run.endOfInput();
            break;
        case DecodeRun::Read::Packet:
            run.decodePacket();
            break;
        }
    }
}

bool AudioDecoder::DecodeRun::open()
{
    QString error;
    format = openInput(d.m_path, d.m_thread.stopToken(), &error);
    if (!format) {
        if (!d.m_thread.stopping())
            d.m_failed(QStringLiteral("no audio playback: %1").arg(error));
        return false;
    }
    for (int index : d.m_streams) {
        if (index < 0 || index >= int(format->nb_streams) || format->streams[index]->codecpar->codec_type != AVMEDIA_TYPE_AUDIO)
            continue;
        AudioStream s;
        s.index = index;
        s.timeBase = av_q2d(format->streams[index]->time_base);
        s.codec = openDecoder(format->streams[index], DecoderOptions{2}, &error);
        if (!s.codec) {
            zaf::log::error(lcPlayback(), QStringLiteral("audio stream %1 of %2 is skipped: %3").arg(index).arg(d.m_path, error));
            continue;
        }
        if (!makeResampler(s, d.m_format)) {
            zaf::log::error(lcPlayback(), QStringLiteral("audio stream %1 of %2 cannot be resampled").arg(index).arg(d.m_path));
            continue;
        }
        streams.push_back(std::move(s));
    }
    if (streams.empty()) {
        d.m_failed(QStringLiteral("%1 has no playable audio").arg(d.m_path));
        return false;
    }
    for (unsigned i = 0; i < format->nb_streams; ++i) {
        const bool used = std::any_of(streams.begin(), streams.end(), [i](const AudioStream &s) { return s.index == int(i); });
        if (!used)
            format->streams[i]->discard = AVDISCARD_ALL;
    }
    startSeconds = containerStartSeconds(format.get());
    packet = ff::makePacket();
    frame = ff::makeFrame();
    return packet && frame;
}

bool AudioDecoder::DecodeRun::takeRequest()
{
    const std::optional<DecoderThread<Request>::Taken> next = d.m_thread.take(!active);
    if (d.m_thread.stopping())
        return false;
    if (!next)
        return true;
    d.m_ring->clear();
    d.m_serving = next->number;
    active = next->request.targetNs.has_value();
    if (active)
        seek(*next->request.targetNs);
    return true;
}

// The demuxer goes to the packet before the target; each stream's first frame is then lined up
// with the target sample by sample (see resample()).
void AudioDecoder::DecodeRun::seek(std::int64_t targetNs)
{
    targetSeconds = double(targetNs) / 1e9;
    const std::int64_t ts = std::llround((targetSeconds + startSeconds) * AV_TIME_BASE);
    const int rc = av_seek_frame(format.get(), -1, ts, AVSEEK_FLAG_BACKWARD);
    if (rc < 0 && !d.m_thread.stopping())
        zaf::log::error(lcPlayback(), QStringLiteral("cannot seek the audio of %1: %2").arg(d.m_path, ff::errorString(rc)));
    for (AudioStream &s : streams) {
        avcodec_flush_buffers(s.codec.get());
        makeResampler(s, d.m_format);
        s.started = false;
    }
    mix.reset(streams.size());
    readRetries = 0;
}

AudioDecoder::DecodeRun::Read AudioDecoder::DecodeRun::readPacket()
{
    const int rc = av_read_frame(format.get(), packet.get());
    if (rc == AVERROR(EAGAIN) && ++readRetries < kMaxConsecutiveReadRetries)
        return Read::Retry;
    if (rc < 0) {
        if (rc != AVERROR_EOF && rc != AVERROR(EAGAIN) && !d.m_thread.stopping())
            zaf::log::error(lcPlayback(), QStringLiteral("reading the audio of %1 stopped: %2").arg(d.m_path, ff::errorString(rc)));
        return Read::Ended;
    }
    readRetries = 0;
    return Read::Packet;
}

void AudioDecoder::DecodeRun::decodePacket()
{
    for (std::size_t lane = 0; lane < streams.size(); ++lane) {
        if (streams[lane].index == packet->stream_index) {
            avcodec_send_packet(streams[lane].codec.get(), packet.get());
            receive(lane);
        }
    }
    av_packet_unref(packet.get());
    writeMix(false);
}

void AudioDecoder::DecodeRun::endOfInput()
{
    for (std::size_t lane = 0; lane < streams.size(); ++lane) {
        avcodec_send_packet(streams[lane].codec.get(), nullptr);
        receive(lane);
    }
    if (writeMix(true) && !abandoned())
        d.m_ring->setEnded();
    active = false;
}

void AudioDecoder::DecodeRun::receive(std::size_t lane)
{
    for (;;) {
        const int rc = avcodec_receive_frame(streams[lane].codec.get(), frame.get());
        if (rc == AVERROR_EOF) {
            resample(lane, nullptr); // what the resampler still holds
            mix.end(lane);
            return;
        }
        if (rc < 0)
            return;
        resample(lane, frame.get());
        av_frame_unref(frame.get());
    }
}

void AudioDecoder::DecodeRun::resample(std::size_t lane, const AVFrame *decoded)
{
    AudioStream &s = streams[lane];
    const int channels = d.m_format.channels;
    const int capacity = swr_get_out_samples(s.swr.get(), decoded ? decoded->nb_samples : 0);
    if (capacity <= 0)
        return;
    resampled.resize(std::size_t(capacity) * channels);
    uint8_t *dst[1] = {reinterpret_cast<uint8_t *>(resampled.data())};
    const int produced = swr_convert(s.swr.get(), dst, capacity,
        decoded ? const_cast<const uint8_t **>(decoded->extended_data) : nullptr, decoded ? decoded->nb_samples : 0);
    if (produced <= 0)
        return;
    const std::size_t count = std::size_t(produced) * channels;
    std::size_t skip = 0;
    if (!s.started && decoded) {
        s.started = true;
        const std::int64_t ts = decoded->best_effort_timestamp != AV_NOPTS_VALUE ? decoded->best_effort_timestamp : decoded->pts;
        if (ts != AV_NOPTS_VALUE) {
            const LeadIn lead = leadIn(targetSeconds, double(ts) * s.timeBase - startSeconds, d.m_format.sampleRate, channels);
            mix.appendSilence(lane, lead.silenceSamples);
            skip = lead.dropSamples;
        }
    }
    if (skip >= count)
        return;
    mix.append(lane, resampled.data() + skip, count - skip);
}

bool AudioDecoder::DecodeRun::writeMix(bool all)
{
    const std::vector<float> &mixed = mix.take(all);
    if (mixed.empty())
        return true;
    const auto giveUp = [this] { return abandoned(); };
    if (d.m_format.float32)
        return d.m_ring->write(reinterpret_cast<const char *>(mixed.data()), qsizetype(mixed.size() * sizeof(float)), giveUp);
    toSigned16(mixed, converted);
    return d.m_ring->write(reinterpret_cast<const char *>(converted.data()), qsizetype(converted.size() * sizeof(std::int16_t)), giveUp);
}

} // namespace zaf::media::playback
