#pragma once

// Helpers of the export tests: build a session for a file and run it to its end, recording how its
// completion was called.

#include "platform/media/export_session.h"

#include <QCoreApplication>
#include <QThread>

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>

namespace zaf::test {

inline std::shared_ptr<zaf::media::ExportSession> makeSession(const QString &source, const QString &output)
{
    using namespace zaf::media;
    auto session = ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(source)),
                                                         QString::fromLatin1(kExportPresetHighestQuality));
    EXPECT_NE(session, nullptr);
    if (session) {
        session->setOutputURL(QUrl::fromLocalFile(output));
        session->setOutputFileType(QString::fromLatin1(kFileTypeMPEG4));
    }
    return session;
}

// What the completion saw.
struct ExportOutcome {
    int completions = 0;
    bool ranOnMainThread = false;
    zaf::media::ExportStatus statusInCompletion = zaf::media::ExportStatus::Unknown;
};

// Records the completion of one export and waits for it (bounded).
class ExportWaiter {
public:
    std::function<void()> completion(const std::shared_ptr<zaf::media::ExportSession> &session)
    {
        std::weak_ptr<zaf::media::ExportSession> weak = session;
        return [this, weak] {
            std::lock_guard lock(m_mutex);
            ++m_outcome.completions;
            m_outcome.ranOnMainThread = QThread::currentThread() == QCoreApplication::instance()->thread();
            if (auto s = weak.lock())
                m_outcome.statusInCompletion = s->status();
            m_done.notify_all();
        };
    }
    // Waits for the first completion (at most `seconds`), then a moment for any unexpected second one.
    ExportOutcome wait(int seconds = 180)
    {
        std::unique_lock lock(m_mutex);
        const bool finished = m_done.wait_for(lock, std::chrono::seconds(seconds), [this] { return m_outcome.completions > 0; });
        EXPECT_TRUE(finished) << "the export did not complete in " << seconds << " s";
        m_done.wait_for(lock, std::chrono::milliseconds(50), [this] { return m_outcome.completions > 1; });
        return m_outcome;
    }

private:
    std::mutex m_mutex;
    std::condition_variable m_done;
    ExportOutcome m_outcome;
};

// Runs the session's export to its end and returns the final status.
inline zaf::media::ExportStatus runToEnd(const std::shared_ptr<zaf::media::ExportSession> &session)
{
    ExportWaiter waiter;
    session->exportAsynchronously(waiter.completion(session));
    const ExportOutcome outcome = waiter.wait();
    EXPECT_EQ(outcome.completions, 1);
    EXPECT_FALSE(outcome.ranOnMainThread);
    EXPECT_EQ(outcome.statusInCompletion, session->status());
    return session->status();
}

} // namespace zaf::test
