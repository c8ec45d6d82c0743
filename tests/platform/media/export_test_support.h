#pragma once

// What the ExportSession tests share: sessions, a waiter for their one completion, re-encoded fixtures.

#include "platform/media/export_session.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QFileInfo>
#include <QThread>

#include <gtest/gtest.h>

#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>

namespace zaf::media {

inline constexpr double kAacFrameSeconds = 1024.0 / 48000.0;
// 10 s with two audio tracks (keyframes every 30 frames), and 2 s turned 90 degrees with two tracks.
inline const fixture::FixtureSpec kLong{.seconds = 10, .audioTracks = 2};
inline const fixture::FixtureSpec kRotated{.seconds = 2, .audioTracks = 2, .rotation = 90};

// A time value of a probed stream ("duration", "start_time"), in seconds.
inline double seconds(const QJsonObject &stream, const char *key)
{
    return stream.value(QLatin1String(key)).toString().toDouble();
}

inline MediaTimeRange secondsRange(double start, double end, int timescale = 1000000)
{
    return MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(start, timescale), MediaTime::fromSeconds(end, timescale));
}

// A fixture movie re-encoded by the ffmpeg options `encode`, made once into the fixture cache.
inline QString sharedReencodedFixture(const fixture::FixtureSpec &spec, const char *encode)
{
    return test::sharedFfmpegOutput(QStringList{QStringLiteral("-i"), test::sharedFixtureMovie(spec)} << test::words(encode));
}

inline std::shared_ptr<ExportSession> makeSession(const QString &source, const QString &output)
{
    auto session = ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(source)),
                                                         QString::fromLatin1(kExportPresetHighestQuality));
    EXPECT_NE(session, nullptr);
    session->setOutputURL(QUrl::fromLocalFile(output));
    session->setOutputFileType(QString::fromLatin1(kFileTypeMPEG4));
    return session;
}

// What the completion of one export saw.
struct ExportOutcome {
    int completions = 0;
    bool ranOnMainThread = false;
    ExportStatus statusInCompletion = ExportStatus::Unknown;
};

// Records the completion of one export and waits for it (bounded).
class ExportWaiter {
public:
    std::function<void()> completion(const std::shared_ptr<ExportSession> &session)
    {
        return [this, weak = std::weak_ptr<ExportSession>(session)] {
            std::lock_guard lock(m_mutex);
            ++m_outcome.completions;
            m_outcome.ranOnMainThread = QThread::currentThread() == QCoreApplication::instance()->thread();
            if (auto s = weak.lock())
                m_outcome.statusInCompletion = s->status();
            m_done.notify_all();
        };
    }
    // Waits for the first completion, then a moment for any unexpected second one.
    ExportOutcome wait()
    {
        std::unique_lock lock(m_mutex);
        EXPECT_TRUE(m_done.wait_for(lock, std::chrono::seconds(180), [this] { return m_outcome.completions > 0; }));
        m_done.wait_for(lock, std::chrono::milliseconds(50), [this] { return m_outcome.completions > 1; });
        return m_outcome;
    }

private:
    std::mutex m_mutex;
    std::condition_variable_any m_done;
    ExportOutcome m_outcome;
};

// Runs the export to its end, expecting one completion off the main thread that already sees the
// final status, and returns that status.
inline ExportStatus runToEnd(const std::shared_ptr<ExportSession> &session)
{
    ExportWaiter waiter;
    session->exportAsynchronously(waiter.completion(session));
    const ExportOutcome outcome = waiter.wait();
    EXPECT_EQ(outcome.completions, 1);
    EXPECT_FALSE(outcome.ranOnMainThread);
    EXPECT_EQ(outcome.statusInCompletion, session->status());
    return session->status();
}

// The audio mix that names every audio track of a movie, in order.
inline AudioMix mixOfAllAudioTracks(const QString &path)
{
    AudioMix mix;
    for (const AssetTrack &track : MediaAsset::assetWithURL(QUrl::fromLocalFile(path))->tracksWithMediaType(MediaType::Audio))
        mix.inputParameters.append(AudioMixInputParameters{track.trackID});
    return mix;
}

class ExportTest : public ::testing::Test {
protected:
    // Exports `source` into the scratch directory with `configure` applied, expecting completion.
    QString exported(const QString &source, const QString &name, const std::function<void(ExportSession &)> &configure = {})
    {
        auto session = makeSession(source, scratch.file(name));
        if (configure)
            configure(*session);
        EXPECT_EQ(runToEnd(session), ExportStatus::Completed) << (session->error() ? session->error()->description().toStdString() : "");
        EXPECT_FLOAT_EQ(session->progress(), 1.0f);
        return scratch.file(name);
    }
    // Exports `range` of `source`, expecting completion.
    QString trimmed(const QString &source, const MediaTimeRange &range, const QString &name = QStringLiteral("trimmed.mp4"))
    {
        return exported(source, name, [&](ExportSession &s) { s.setTimeRange(range); });
    }
    test::ScratchDir scratch;
};

} // namespace zaf::media
