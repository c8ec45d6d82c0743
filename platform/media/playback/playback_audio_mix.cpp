#include "platform/media/playback/playback_audio_mix.h"

#include <algorithm>
#include <cmath>
#include <cstdint>

namespace zaf::media::playback {

LeadIn leadIn(double targetSeconds, double firstSampleSeconds, int sampleRate, int channels)
{
    const double offset = targetSeconds - firstSampleSeconds;
    LeadIn lead;
    if (offset > 0)
        lead.dropSamples = std::size_t(std::llround(offset * sampleRate)) * channels;
    else if (offset < 0)
        lead.silenceSamples = std::size_t(std::llround(std::min(-offset, kMaxLeadingSilenceSeconds) * sampleRate)) * channels;
    return lead;
}

AudioMix::AudioMix(int channels, std::size_t maxSkewFrames)
    : m_channels(std::size_t(std::max(1, channels)))
    , m_maxSkewFrames(maxSkewFrames)
{
}

void AudioMix::reset(std::size_t lanes)
{
    m_lanes.assign(lanes, Lane{});
}

void AudioMix::append(std::size_t lane, const float *samples, std::size_t count)
{
    m_lanes[lane].samples.insert(m_lanes[lane].samples.end(), samples, samples + count);
}

void AudioMix::appendSilence(std::size_t lane, std::size_t count)
{
    m_lanes[lane].samples.resize(m_lanes[lane].samples.size() + count, 0.0f);
}

void AudioMix::end(std::size_t lane)
{
    m_lanes[lane].ended = true;
}

const std::vector<float> &AudioMix::take(bool all)
{
    std::size_t frames = SIZE_MAX;
    std::size_t most = 0;
    for (const Lane &lane : m_lanes) {
        most = std::max(most, lane.samples.size() / m_channels);
        if (!lane.ended)
            frames = std::min(frames, lane.samples.size() / m_channels);
    }
    if (all || frames == SIZE_MAX || most > m_maxSkewFrames)
        frames = most;
    m_mixed.assign(frames * m_channels, 0.0f);
    for (Lane &lane : m_lanes) {
        const std::size_t count = std::min(m_mixed.size(), lane.samples.size());
        for (std::size_t i = 0; i < count; ++i)
            m_mixed[i] += lane.samples[i];
        lane.samples.erase(lane.samples.begin(), lane.samples.begin() + std::ptrdiff_t(count));
    }
    for (float &v : m_mixed)
        v = std::clamp(v, -1.0f, 1.0f);
    return m_mixed;
}

void toSigned16(const std::vector<float> &samples, std::vector<std::int16_t> &out)
{
    out.resize(samples.size());
    for (std::size_t i = 0; i < samples.size(); ++i)
        out[i] = std::int16_t(std::lrint(samples[i] * 32767.0f));
}

} // namespace zaf::media::playback
