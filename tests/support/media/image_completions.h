#pragma once

// Collects ImageGenerator completions, which arrive on worker threads, for assertions on the test
// thread.

#include "platform/media/image_generator.h"

#include <QList>

#include <condition_variable>
#include <mutex>

namespace zaf::test {

struct ImageCompletion {
    zaf::media::MediaTime requestedTime;
    QImage image;
    zaf::media::MediaTime actualTime;
    zaf::media::ImageGenerator::Result result;
    zaf::OptionalError error;
    bool onMainThread = false;
};

class ImageCompletions {
public:
    // A handler that records into this collector (callable from any thread).
    zaf::media::ImageGenerator::Handler handler();
    // Waits until `count` completions have arrived (false after `timeoutMs`).
    bool waitFor(int count, int timeoutMs = 30000);
    QList<ImageCompletion> all() const;

private:
    mutable std::mutex m_mutex;
    std::condition_variable_any m_arrived;
    QList<ImageCompletion> m_completions;
};

} // namespace zaf::test
