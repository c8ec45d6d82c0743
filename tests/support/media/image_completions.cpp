#include "tests/support/media/image_completions.h"

#include "platform/dispatch.h"

#include <chrono>

namespace zaf::test {

zaf::media::ImageGenerator::Handler ImageCompletions::handler()
{
    return [this](const zaf::media::MediaTime &requested, const QImage &image, const zaf::media::MediaTime &actual,
                  zaf::media::ImageGenerator::Result result, const zaf::OptionalError &error) {
        const bool onMain = zaf::dispatch::isMainThread();
        std::lock_guard lock(m_mutex);
        m_completions.append(ImageCompletion{requested, image, actual, result, error, onMain});
        m_arrived.notify_all();
    };
}

bool ImageCompletions::waitFor(int count, int timeoutMs)
{
    std::unique_lock lock(m_mutex);
    return m_arrived.wait_for(lock, std::chrono::milliseconds(timeoutMs), [&] { return m_completions.size() >= count; });
}

QList<ImageCompletion> ImageCompletions::all() const
{
    std::lock_guard lock(m_mutex);
    return m_completions;
}

} // namespace zaf::test
