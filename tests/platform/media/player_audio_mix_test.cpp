// The audio stage on its own (no device needed): every audio track decoded, resampled to stereo
// and summed at unity gain into the ring, starting at the requested time.
#include "platform/media/playback_audio_decoder.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QDeadlineTimer>
#include <QThread>

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <vector>

namespace zaf::media::playback {
namespace {

// Amplitude of `frequency` in one channel of interleaved stereo float samples.
double amplitude(const std::vector<float> &stereo, int channel, double frequency, int rate)
{
    double re = 0, im = 0;
    const std::size_t frames = stereo.size() / 2;
    for (std::size_t i = 0; i < frames; ++i) {
        const double phase = 2 * std::numbers::pi * frequency * double(i) / rate;
        re += stereo[i * 2 + channel] * std::cos(phase);
        im += stereo[i * 2 + channel] * std::sin(phase);
    }
    return 2 * std::hypot(re, im) / double(frames);
}

TEST(PlayerAudioMixTest, DecoderSumsEveryTrackAtUnityGainFromRequestedTime)
{
    zaf::test::ScratchDir dir;
    zaf::fixture::FixtureSpec spec;
    spec.seconds = 2;
    spec.width = 64;
    spec.height = 48;
    spec.audioTracks = 2;
    const QString path = zaf::test::makeFixtureMovie(dir.path(), spec);
    ASSERT_FALSE(path.isEmpty());
    const QList<QJsonObject> audio = zaf::test::probeStreams(zaf::test::ffprobe(path), QStringLiteral("audio"));
    ASSERT_EQ(audio.size(), 2);

    AudioOutputFormat format{44100, 2, true};
    AudioRing ring(format.sampleRate * format.bytesPerFrame()); // one second
    QString failure;
    AudioDecoder decoder(path, {audio[0].value(QStringLiteral("index")).toInt(), audio[1].value(QStringLiteral("index")).toInt()},
        format, &ring, [&](const QString &message) { failure = message; });
    const std::uint64_t request = decoder.start(1'500'000'000); // 1.5 s: 0.5 s left

    std::vector<float> samples;
    QDeadlineTimer deadline(15000);
    while (!deadline.hasExpired() && !(decoder.servingRequest() == request && ring.ended() && ring.available() == 0)) {
        std::vector<float> chunk(4096);
        const qsizetype got = ring.read(reinterpret_cast<char *>(chunk.data()), qsizetype(chunk.size() * sizeof(float)));
        if (decoder.servingRequest() == request)
            samples.insert(samples.end(), chunk.begin(), chunk.begin() + got / qsizetype(sizeof(float)));
        if (got == 0)
            QThread::msleep(5);
    }
    EXPECT_TRUE(failure.isEmpty()) << failure.toStdString();
    ASSERT_TRUE(ring.ended());
    // 0.5 s of stereo, within a few milliseconds (the tail of the AAC stream).
    EXPECT_NEAR(double(samples.size()) / 2 / format.sampleRate, 0.5, 0.03);
    for (int channel : {0, 1}) {
        EXPECT_NEAR(amplitude(samples, channel, zaf::fixture::toneFrequency(0), format.sampleRate), zaf::fixture::kToneAmplitude, 0.05);
        EXPECT_NEAR(amplitude(samples, channel, zaf::fixture::toneFrequency(1), format.sampleRate), zaf::fixture::kToneAmplitude, 0.05);
    }
    for (float v : samples)
        ASSERT_LE(std::fabs(v), 1.0f);
}

} // namespace
} // namespace zaf::media::playback
