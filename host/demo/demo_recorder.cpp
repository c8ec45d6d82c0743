#include "host/demo/demo_recorder.h"

#include "host/demo/demo_sound.h"
#include "platform/log.h"
#include "platform/media/movie_writer.h"

#include <QLoggingCategory>

#include <vector>

Q_LOGGING_CATEGORY(lcDemoRecorder, "zaf.demo.recorder")

namespace zaf::demo {

namespace {

Error recorderError(const QString &message)
{
    return Error{QStringLiteral("zaf.demo"), 1, message};
}

} // namespace

DemoRecorder::DemoRecorder(const Settings &settings, QObject *parent)
    : QObject(parent)
    , m_settings(settings)
{
}

DemoRecorder::DemoRecorder(QObject *parent)
    : DemoRecorder(Settings{}, parent)
{
}

DemoRecorder::~DemoRecorder()
{
    {
        std::lock_guard lock(m_mutex);
        if (!m_finishRequested)
            m_abandon = true;
    }
    stopWorker();
}

qint64 DemoRecorder::samplesThrough(qint64 videoFrames, int sampleRate, int frameRate)
{
    return frameRate > 0 ? videoFrames * sampleRate / frameRate : 0;
}

OptionalError DemoRecorder::start(const QString &path)
{
    {
        std::lock_guard lock(m_mutex);
        if (m_started)
            return recorderError(QStringLiteral("the recorder has already been started"));
        if (m_settings.frameRate <= 0 || m_settings.sampleRate <= 0 || m_settings.queueCapacity <= 0)
            return recorderError(QStringLiteral("invalid recorder settings"));
        m_started = true;
    }
    m_path = path;
    auto created = std::make_shared<std::promise<OptionalError>>();
    std::future<OptionalError> result = created->get_future();
    m_worker = std::thread([this, created] { run(created); });
    OptionalError error = result.get();
    if (error) {
        m_worker.join();
        std::lock_guard lock(m_mutex);
        m_done = true;
        m_error = error;
    }
    return error;
}

bool DemoRecorder::isRecording() const
{
    std::lock_guard lock(m_mutex);
    return m_started && !m_finishRequested && !m_done && !m_error;
}

qint64 DemoRecorder::framesAppended() const
{
    std::lock_guard lock(m_mutex);
    return m_framesAppended;
}

double DemoRecorder::secondsAppended() const
{
    return double(framesAppended()) / m_settings.frameRate;
}

OptionalError DemoRecorder::error() const
{
    std::lock_guard lock(m_mutex);
    return m_error;
}

bool DemoRecorder::tryAppendFrame(const QImage &frame)
{
    return !enqueue(frame, false);
}

OptionalError DemoRecorder::appendFrame(const QImage &frame)
{
    return enqueue(frame, true);
}

OptionalError DemoRecorder::enqueue(const QImage &frame, bool wait)
{
    std::unique_lock lock(m_mutex);
    auto recording = [this] { return m_started && !m_finishRequested && !m_done && !m_error; };
    if (wait) {
        m_jobsChanged.wait(lock, [&] { return !recording() || int(m_jobs.size()) < m_settings.queueCapacity; });
    }
    if (m_error)
        return m_error;
    if (!recording())
        return recorderError(QStringLiteral("the recorder is not recording"));
    if (int(m_jobs.size()) >= m_settings.queueCapacity)
        return recorderError(QStringLiteral("the frame queue is full"));
    m_jobs.push_back(Job{frame, m_framesAppended++});
    lock.unlock();
    m_jobsChanged.notify_all();
    return std::nullopt;
}

void DemoRecorder::finish()
{
    {
        std::lock_guard lock(m_mutex);
        if (!m_started || m_finishRequested)
            return;
        m_finishRequested = true;
    }
    m_jobsChanged.notify_all();
}

OptionalError DemoRecorder::waitForFinished()
{
    {
        std::lock_guard lock(m_mutex);
        if (!m_started)
            return recorderError(QStringLiteral("the recorder has not been started"));
    }
    finish();
    stopWorker();
    std::lock_guard lock(m_mutex);
    return m_error;
}

void DemoRecorder::stopWorker()
{
    m_jobsChanged.notify_all();
    if (m_worker.joinable())
        m_worker.join();
}

void DemoRecorder::run(std::shared_ptr<std::promise<OptionalError>> created)
{
    media::MovieWriter::Settings writerSettings;
    writerSettings.videoSize = m_settings.videoSize;
    writerSettings.frameRate = m_settings.frameRate;
    writerSettings.audioTracks = kAudioTracks;
    writerSettings.sampleRate = m_settings.sampleRate;
    writerSettings.channels = 2;
    writerSettings.crf = m_settings.crf;
    writerSettings.preset = m_settings.preset;
    writerSettings.gopLength = m_settings.frameRate;
    auto writerResult = media::MovieWriter::create(m_path, writerSettings);
    if (!writerResult.ok()) {
        created->set_value(writerResult.error);
        return;
    }
    std::unique_ptr<media::MovieWriter> writer = std::move(*writerResult.value);
    created->set_value(std::nullopt);
    zaf::log::info(lcDemoRecorder(), QStringLiteral("Recording to %1").arg(m_path));

    DemoAppSound appSound(m_settings.sampleRate);
    DemoMicrophone microphone(m_settings.sampleRate);
    std::vector<float> buffer;
    OptionalError failure;

    for (;;) {
        Job job;
        {
            std::unique_lock lock(m_mutex);
            m_jobsChanged.wait(lock, [this] { return m_abandon || m_finishRequested || !m_jobs.empty(); });
            if (m_abandon)
                break;
            if (m_jobs.empty()) // finish requested and everything written
                break;
            job = std::move(m_jobs.front());
            m_jobs.pop_front();
        }
        m_jobsChanged.notify_all(); // room for the producer

        if (failure)
            continue; // drain without encoding; the producer already sees the error
        failure = writer->appendVideoFrame(job.frame);
        if (!failure) {
            const qint64 from = samplesThrough(job.number, m_settings.sampleRate, m_settings.frameRate);
            const qint64 until = samplesThrough(job.number + 1, m_settings.sampleRate, m_settings.frameRate);
            const qint64 count = until - from;
            buffer.resize(size_t(count * 2));
            appSound.render(from, count, buffer.data());
            failure = writer->appendAudio(0, buffer.data(), count);
            if (!failure) {
                microphone.render(from, count, buffer.data());
                failure = writer->appendAudio(1, buffer.data(), count);
            }
        }
        if (failure) {
            zaf::log::error(lcDemoRecorder(), QStringLiteral("Recording failed: %1").arg(failure->description()));
            {
                std::lock_guard lock(m_mutex);
                m_error = failure;
            }
            m_jobsChanged.notify_all();
        }
    }

    bool abandoned;
    {
        std::lock_guard lock(m_mutex);
        abandoned = m_abandon;
    }
    if (abandoned) {
        writer.reset(); // removes the temporary file
        std::lock_guard lock(m_mutex);
        m_done = true;
        return;
    }

    if (!failure)
        failure = writer->finish();
    const qint64 frames = writer->videoFramesWritten();
    writer.reset();
    {
        std::lock_guard lock(m_mutex);
        m_done = true;
        if (failure && !m_error)
            m_error = failure;
    }
    m_jobsChanged.notify_all();
    if (failure) {
        Q_EMIT finished(m_path, failure->message);
    } else {
        zaf::log::info(lcDemoRecorder(), QStringLiteral("Recorded %1 frames to %2").arg(frames).arg(m_path));
        Q_EMIT finished(m_path, QString());
    }
}

} // namespace zaf::demo
