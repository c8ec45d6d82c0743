#include "host/demo/demo_sound.h"

#include "host/demo/demo_scene.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace zaf::demo {

namespace {

constexpr double kTwoPi = 2 * M_PI;

// One plucked note: three harmonics under a fast attack and an exponential decay.
double pluck(double frequency, double since)
{
    if (since < 0)
        return 0;
    const double attack = std::min(1.0, since / 0.004);
    const double envelope = attack * std::exp(-since * 5.5);
    const double x = kTwoPi * frequency * since;
    return envelope * (std::sin(x) + 0.35 * std::sin(2 * x) + 0.12 * std::sin(3 * x));
}

// The clock's tick: a short, bright burst.
double tick(double since)
{
    if (since < 0 || since > 0.03)
        return 0;
    return std::exp(-since * 260) * std::sin(kTwoPi * 1900 * since);
}

struct Vowel {
    double f1, f2;
};
constexpr std::array<Vowel, 5> kVowels = {{{780, 1250}, {480, 1900}, {310, 2250}, {520, 900}, {340, 820}}};

double resonance(double frequency, double centre, double bandwidth)
{
    const double d = (frequency - centre) / bandwidth;
    return 1 / (1 + d * d);
}

// A stable per-index hash for the phrase layout.
std::uint32_t mix(std::uint32_t x)
{
    x ^= x >> 16;
    x *= 0x7feb352du;
    x ^= x >> 15;
    x *= 0x846ca68bu;
    x ^= x >> 16;
    return x;
}

// Where the voice is at time t: which syllable (or none) and how far into it.
struct VoiceAt {
    bool voiced = false;
    double sinceStart = 0;  // seconds into the syllable
    double untilEnd = 0;    // seconds left in it
    double pitch = 0;       // fundamental, Hz
    Vowel vowel{};
};

constexpr double kPhraseCycle = 2.4;     // a phrase starts every 2.4 s
constexpr double kPhraseOffset = 0.35;   // ...this far into its cycle
constexpr double kSyllable = 0.17;
constexpr double kSyllableGap = 0.07;

VoiceAt voiceAt(double t)
{
    VoiceAt v;
    const auto cycle = std::uint32_t(std::floor(t / kPhraseCycle));
    const double inCycle = t - cycle * kPhraseCycle - kPhraseOffset;
    const std::uint32_t h = mix(cycle + 17);
    const int syllables = 3 + int(h % 4);
    if (inCycle < 0 || inCycle >= syllables * (kSyllable + kSyllableGap))
        return v;
    const int index = int(inCycle / (kSyllable + kSyllableGap));
    const double inSyllable = inCycle - index * (kSyllable + kSyllableGap);
    if (inSyllable >= kSyllable)
        return v;
    v.voiced = true;
    v.sinceStart = inSyllable;
    v.untilEnd = kSyllable - inSyllable;
    // Falling phrase intonation with a small rise inside each syllable.
    const double phraseProgress = inCycle / (syllables * (kSyllable + kSyllableGap));
    v.pitch = 150 - 30 * phraseProgress + 12 * std::sin(M_PI * inSyllable / kSyllable) + (h >> 8) % 15;
    v.vowel = kVowels[mix(h + std::uint32_t(index)) % kVowels.size()];
    return v;
}

} // namespace

DemoAppSound::DemoAppSound(int sampleRate)
    : m_sampleRate(sampleRate)
{
}

void DemoAppSound::render(qint64 first, qint64 frames, float *out)
{
    for (qint64 i = 0; i < frames; ++i) {
        const double t = double(first + i) / m_sampleRate;
        const auto beat = qint64(std::floor(t / kBeatSeconds));
        const double since = t - beat * kBeatSeconds;
        double melody = pluck(melodyFrequency(beat), since) + pluck(melodyFrequency(beat - 1), since + kBeatSeconds);
        // A low note under the first beat of every bar of four.
        const qint64 bar = beat / 4;
        const double sinceBar = t - bar * 4 * kBeatSeconds;
        melody += 0.6 * pluck(melodyFrequency(bar * 4) / 2, sinceBar);
        const double clockTick = tick(t - std::floor(t));

        // Pan the melody where the ball is, kept away from the hard edges.
        const double x = 0.2 + 0.6 * ballPosition(t).x();
        const double left = std::cos(x * M_PI / 2);
        const double right = std::sin(x * M_PI / 2);
        out[2 * i] = float(0.28 * melody * left + 0.22 * clockTick);
        out[2 * i + 1] = float(0.28 * melody * right + 0.22 * clockTick);
    }
}

DemoMicrophone::DemoMicrophone(int sampleRate)
    : m_sampleRate(sampleRate)
{
}

float DemoMicrophone::nextWhite()
{
    // xorshift32: fast, deterministic, good enough for a noise bed.
    m_noiseState ^= m_noiseState << 13;
    m_noiseState ^= m_noiseState >> 17;
    m_noiseState ^= m_noiseState << 5;
    return float(m_noiseState) / 2147483648.0f - 1.0f;
}

float DemoMicrophone::nextPink()
{
    // Paul Kellet's refined pink filter over white noise.
    const float white = nextWhite();
    m_pink[0] = 0.99886f * m_pink[0] + white * 0.0555179f;
    m_pink[1] = 0.99332f * m_pink[1] + white * 0.0750759f;
    m_pink[2] = 0.96900f * m_pink[2] + white * 0.1538520f;
    m_pink[3] = 0.86650f * m_pink[3] + white * 0.3104856f;
    m_pink[4] = 0.55000f * m_pink[4] + white * 0.5329522f;
    m_pink[5] = -0.7616f * m_pink[5] - white * 0.0168980f;
    const float pink = m_pink[0] + m_pink[1] + m_pink[2] + m_pink[3] + m_pink[4] + m_pink[5] + m_pink[6] + white * 0.5362f;
    m_pink[6] = white * 0.115926f;
    return pink * 0.11f;
}

void DemoMicrophone::render(qint64 first, qint64 frames, float *out)
{
    if (first != m_nextSample) {
        // Out of order: start the voice afresh; the noise simply carries on.
        m_voicePhase = 0;
    }
    for (qint64 i = 0; i < frames; ++i) {
        const double t = double(first + i) / m_sampleRate;
        double sample = 0.045 * nextPink();

        const VoiceAt v = voiceAt(t);
        if (v.voiced) {
            m_voicePhase += v.pitch / m_sampleRate;
            m_voicePhase -= std::floor(m_voicePhase);
            const double envelope = std::min({1.0, v.sinceStart / 0.025, v.untilEnd / 0.045});
            double voice = 0;
            for (int k = 1; k * v.pitch < 4200; ++k) {
                const double f = k * v.pitch;
                const double amplitude = (resonance(f, v.vowel.f1, 110) + 0.7 * resonance(f, v.vowel.f2, 160) + 0.04)
                                         / std::pow(k, 0.6);
                voice += amplitude * std::sin(kTwoPi * k * m_voicePhase);
            }
            // A breathy consonant at the start of each syllable.
            const double consonant = v.sinceStart < 0.03 ? (1 - v.sinceStart / 0.03) * 0.5 * nextWhite() : 0;
            sample += 0.16 * envelope * voice + 0.12 * consonant;
        }
        out[2 * i] = float(sample);
        out[2 * i + 1] = float(sample);
    }
    m_nextSample = first + frames;
}

} // namespace zaf::demo
