#pragma once

// The demo recorder's two audio tracks, synthesized in step with the scene's timeline.
//
// DemoAppSound is the application's own sound: one melody note every time the ball lands (the
// scene's beat), panned where the ball is, with a clock tick on every whole second.
// DemoMicrophone stands for the user's microphone: a soft pink-noise room bed with bursts of
// voice-like syllables (a pitched pulse shaped by vowel formants) in short phrases.
//
// Both render consecutive blocks of interleaved stereo float samples; sample n sounds at
// n / sampleRate seconds on the movie's timeline. They keep a little state between blocks (noise
// filters, the voice's phase), so blocks are rendered in order from sample 0. Not thread-safe; the
// recorder renders on its worker thread.

#include <QtGlobal>

#include <cstdint>

namespace zaf::demo {

class DemoAppSound {
public:
    explicit DemoAppSound(int sampleRate);
    // Writes `frames` stereo sample frames (2 * frames floats) starting at sample `first`.
    void render(qint64 first, qint64 frames, float *interleavedStereo);

private:
    int m_sampleRate;
};

class DemoMicrophone {
public:
    explicit DemoMicrophone(int sampleRate);
    void render(qint64 first, qint64 frames, float *interleavedStereo);

private:
    float nextWhite();
    float nextPink();

    int m_sampleRate;
    std::uint32_t m_noiseState = 0x9e3779b9u;
    float m_pink[7] = {};
    double m_voicePhase = 0; // of the voice's fundamental, in cycles
    qint64 m_nextSample = 0;
};

} // namespace zaf::demo
