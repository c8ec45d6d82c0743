#include "platform/media/playback/playback_audio_output.h"

#include <QAudioFormat>
#include <QAudioSink>
#include <QIODevice>
#include <QMediaDevices>
#include <QPointer>

#include <algorithm>
#include <vector>

namespace zaf::media::playback {

namespace {

// How the device is driven, from what Qt 6.4's PulseAudio sink was seen to do on a null sink:
// - Pulled by the sink, audio is read in 20 ms periods, and only while a whole period is free.
//   With the buffer the server picks (145 ms there) the sink never wrote the last partial period, so
//   the stream never reached the amount it waits for before playing: processedUSecs() stood at
//   140 ms for over a second, and the picture, following it, crawled. A pull source that runs dry
//   also stops the sink's reading until it signals readyRead.
// - processedUSecs() is the server's read position less the latency it reports for the device,
//   moved on by the time since the last report, never more than what was written and never
//   backwards: the position of the sound being heard, which is the clock the picture needs.
// - bufferSize() becomes the buffer the server granted (70 ms for the 100 ms asked), bytesFree()
//   the room left in it; a dead server turns the sink to StoppedState with FatalError.
// So the output pushes: it asks for a buffer of a fixed size, fills all of it at once from audio
// waiting in the ring, and tops it up every tick with exactly the room there is. The device then
// plays at once and the clock, read from processedUSecs(), runs at rate within a few ticks; until it
// moves, the picture waits for the sound. (Measured: the thirtieth picture 2.7-3.0 s after play()
// when pulled, about 1.03 s when pushed, with the sound heard about 12 ms before its picture.)
//
// The device starts once this much audio is waiting, so that its buffer is full from the start.
constexpr double kPrefillSeconds = 0.1;
// The device's own buffer: small enough to start and stop promptly, large enough for a tick late by
// several periods on a loaded machine.
constexpr double kDeviceBufferSeconds = 0.1;
// The ring holds this much mixed audio.
constexpr double kRingSeconds = 0.5;

QString describe(QAudio::Error error)
{
    switch (error) {
    case QAudio::OpenError:
        return QStringLiteral("the audio device cannot be opened");
    case QAudio::IOError:
        return QStringLiteral("the audio device cannot be written to");
    case QAudio::FatalError:
        return QStringLiteral("the audio device is gone");
    case QAudio::UnderrunError:
    case QAudio::NoError:
        break;
    }
    return QStringLiteral("the audio device stopped by itself");
}

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
    m_steady.start();
}

AudioOutput::~AudioOutput()
{
    stopDevice();
}

double AudioOutput::now() const
{
    if (m_failed)
        return m_failedAtClock + (isActive() ? double(m_steady.nsecsElapsed() - m_failedAtSteadyNs) / 1e9 : 0.0);
    return m_playedBefore + devicePlayedSeconds();
}

// What the current run of the device has played. A sink that stopped reports nothing: its last
// reading stands.
double AudioOutput::devicePlayedSeconds() const
{
    if (m_sink && m_sink->state() != QAudio::StoppedState)
        m_deviceSeconds = std::max(m_deviceSeconds, double(m_sink->processedUSecs()) / 1e6);
    return m_deviceSeconds;
}

void AudioOutput::setActive(bool active)
{
    if (m_failed && active != isActive()) {
        // The steady clock that replaced the device pauses and resumes with playback.
        m_failedAtClock = now();
        m_failedAtSteadyNs = m_steady.nsecsElapsed();
    }
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
    if (!m_sink && !m_failed) {
        const bool ready = !m_readyCheck || m_readyCheck();
        const qsizetype prefill = qsizetype(kPrefillSeconds * m_format.sampleRate) * m_format.bytesPerFrame();
        if (ready && (m_ring->available() >= prefill || m_ring->ended()))
            startDevice();
    } else if (m_sink) {
        feed();
    }
    Q_EMIT advanced();
}

void AudioOutput::startDevice()
{
    QAudioFormat format;
    format.setSampleRate(m_format.sampleRate);
    format.setChannelCount(m_format.channels);
    format.setSampleFormat(m_format.float32 ? QAudioFormat::Float : QAudioFormat::Int16);
    m_sink = std::make_unique<QAudioSink>(m_device, format);
    m_sink->setBufferSize(qsizetype(kDeviceBufferSeconds * m_format.sampleRate) * m_format.bytesPerFrame());
    connect(m_sink.get(), &QAudioSink::stateChanged, this, &AudioOutput::deviceStateChanged);
    m_sinkInput = m_sink->start();
    if (!m_sinkInput || m_sink->error() != QAudio::NoError) {
        fail(describe(m_sink->error() == QAudio::NoError ? QAudio::OpenError : m_sink->error()));
        return;
    }
    feed();
}

// Writes what the device has room for: the ring's audio, or silence once the ring has ended.
void AudioOutput::feed()
{
    const qsizetype frameBytes = m_format.bytesPerFrame();
    qsizetype room = m_sink->bytesFree() / frameBytes * frameBytes;
    if (room <= 0)
        return;
    std::vector<char> block(static_cast<size_t>(room));
    qsizetype n = m_ring->read(block.data(), room) / frameBytes * frameBytes;
    if (n == 0 && m_ring->ended()) {
        std::fill(block.begin(), block.end(), 0);
        n = room;
    }
    if (n > 0 && m_sinkInput->write(block.data(), n) < 0)
        fail(describe(QAudio::IOError));
}

void AudioOutput::deviceStateChanged(QAudio::State state)
{
    if (m_stopping || !m_sink)
        return;
    const QAudio::Error error = m_sink->error();
    if (state == QAudio::StoppedState || error == QAudio::OpenError || error == QAudio::IOError || error == QAudio::FatalError)
        fail(describe(error));
}

void AudioOutput::fail(const QString &why)
{
    if (m_failed)
        return;
    m_failedAtClock = now();
    m_failedAtSteadyNs = m_steady.nsecsElapsed();
    m_failed = true;
    // Not here: this runs inside the sink's own signal or call, and the handler may end the sink.
    QMetaObject::invokeMethod(this, [this] { stopDevice(); }, Qt::QueuedConnection);
    if (m_failureHandler) {
        QPointer<AudioOutput> self(this);
        QMetaObject::invokeMethod(this, [self, why] {
            if (self && self->m_failureHandler)
                self->m_failureHandler(why);
        }, Qt::QueuedConnection);
    }
}

void AudioOutput::stopDevice()
{
    if (m_sink) {
        m_playedBefore += devicePlayedSeconds();
        m_deviceSeconds = 0;
        m_stopping = true;
        m_sink->stop();
        m_stopping = false;
        m_sink.reset();
        m_sinkInput = nullptr;
    }
}

} // namespace zaf::media::playback
