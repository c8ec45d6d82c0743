#include "platform/media/playback/playback_audio_output.h"

#include <QAudioFormat>
#include <QAudioSink>
#include <QIODevice>
#include <QMediaDevices>

#include <cstring>

namespace zaf::media::playback {

namespace {

// The device starts once this much audio is waiting, so it does not begin with an underrun.
constexpr double kPrefillSeconds = 0.1;
// The ring holds this much mixed audio.
constexpr double kRingSeconds = 0.5;

// The sink's pull source: what the ring holds; silence after the end mark.
class RingDevice : public QIODevice {
public:
    explicit RingDevice(AudioRing *ring) : m_ring(ring) {}
    bool isSequential() const override { return true; }
    qint64 bytesAvailable() const override { return m_ring->available() + QIODevice::bytesAvailable(); }

protected:
    qint64 readData(char *data, qint64 maxSize) override
    {
        const qsizetype n = m_ring->read(data, qsizetype(maxSize));
        if (n == 0 && m_ring->ended() && maxSize > 0) {
            std::memset(data, 0, size_t(maxSize));
            return maxSize;
        }
        return n;
    }
    qint64 writeData(const char *, qint64) override { return -1; }

private:
    AudioRing *m_ring;
};

} // namespace

QAudioDevice AudioOutput::defaultDevice()
{
    return QMediaDevices::defaultAudioOutput();
}

AudioOutput::AudioOutput(const QAudioDevice &device, QObject *parent)
    : TimeSource(parent)
    , m_device(device)
{
    const QAudioFormat preferred = device.preferredFormat();
    m_format.sampleRate = preferred.sampleRate() > 0 ? preferred.sampleRate() : 48000;
    m_format.channels = 2;
    QAudioFormat wanted;
    wanted.setSampleRate(m_format.sampleRate);
    wanted.setChannelCount(2);
    wanted.setSampleFormat(QAudioFormat::Float);
    m_format.float32 = device.isFormatSupported(wanted);
    m_ring = std::make_unique<AudioRing>(qsizetype(kRingSeconds * m_format.sampleRate) * m_format.bytesPerFrame());
    m_ticker.setTimerType(Qt::PreciseTimer);
    m_ticker.setInterval(10);
    connect(&m_ticker, &QTimer::timeout, this, &AudioOutput::tick);
}

AudioOutput::~AudioOutput()
{
    stopDevice();
}

double AudioOutput::now() const
{
    return m_playedBefore + (m_sink ? double(m_sink->processedUSecs()) / 1e6 : 0.0);
}

void AudioOutput::setActive(bool active)
{
    TimeSource::setActive(active);
    if (active) {
        m_ticker.start();
        tick();
    } else {
        m_ticker.stop();
        stopDevice();
    }
}

void AudioOutput::tick()
{
    if (!isActive())
        return;
    if (!m_sink) {
        const bool ready = !m_readyCheck || m_readyCheck();
        const qsizetype prefill = qsizetype(kPrefillSeconds * m_format.sampleRate) * m_format.bytesPerFrame();
        if (ready && (m_ring->available() >= prefill || m_ring->ended()))
            startDevice();
    }
    Q_EMIT advanced();
}

void AudioOutput::startDevice()
{
    QAudioFormat format;
    format.setSampleRate(m_format.sampleRate);
    format.setChannelCount(m_format.channels);
    format.setSampleFormat(m_format.float32 ? QAudioFormat::Float : QAudioFormat::Int16);
    m_source = std::make_unique<RingDevice>(m_ring.get());
    m_source->open(QIODevice::ReadOnly);
    m_sink = std::make_unique<QAudioSink>(m_device, format);
    m_sink->start(m_source.get());
}

void AudioOutput::stopDevice()
{
    if (m_sink) {
        m_playedBefore += double(m_sink->processedUSecs()) / 1e6;
        m_sink->stop();
        m_sink.reset();
    }
    m_source.reset();
}

} // namespace zaf::media::playback
