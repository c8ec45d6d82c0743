#pragma once

// The sum the player hears of a movie's audio streams. Each stream's resampled, interleaved samples
// wait in a lane of their own until every live lane has audio for the same stretch; that stretch is
// then summed sample by sample and limited to full scale. A lane that has ended does not hold the
// others back, and neither does one that has nothing while another has more than a skew limit
// waiting (the silent one is taken as having a gap). Used on the audio decoder's thread.

#include <cstddef>
#include <cstdint>
#include <vector>

namespace zaf::media::playback {

// A stream that starts later than the requested time is padded with silence, at most this long.
inline constexpr double kMaxLeadingSilenceSeconds = 10;

// How the first audio a stream decodes after a seek lines up with the target: the samples before
// the target are dropped, and a gap up to the first sample is filled with silence (at most
// kMaxLeadingSilenceSeconds of it). Counts are interleaved samples.
struct LeadIn {
    std::size_t dropSamples = 0;
    std::size_t silenceSamples = 0;
};
LeadIn leadIn(double targetSeconds, double firstSampleSeconds, int sampleRate, int channels);

class AudioMix {
public:
    AudioMix(int channels, std::size_t maxSkewFrames);

    // After a seek: `lanes` empty, live lanes.
    void reset(std::size_t lanes);
    void append(std::size_t lane, const float *samples, std::size_t count);
    void appendSilence(std::size_t lane, std::size_t count);
    // No more audio comes into `lane` until the next reset.
    void end(std::size_t lane);

    // Takes the stretch every live lane has audio for (with `all`, everything left) out of the lanes
    // and returns its sum, limited to [-1, 1]; empty when there is nothing to mix yet.
    const std::vector<float> &take(bool all);

private:
    struct Lane {
        std::vector<float> samples;
        bool ended = false;
    };
    const std::size_t m_channels;
    const std::size_t m_maxSkewFrames;
    std::vector<Lane> m_lanes;
    std::vector<float> m_mixed;
};

// Full-scale float samples as signed 16-bit ones.
void toSigned16(const std::vector<float> &samples, std::vector<std::int16_t> &out);

} // namespace zaf::media::playback
