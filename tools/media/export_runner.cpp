#include "tools/media/export_runner.h"

#include "platform/media/export_session.h"
#include "tools/media/commands.h"

#include <QElapsedTimer>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <mutex>
#include <unistd.h>

namespace zaf::tools {

namespace {

std::atomic<bool> g_interrupted{false};

void onInterrupt(int)
{
    g_interrupted = true;
}

void drawProgress(const char *verb, float progress, double seconds)
{
    constexpr int kWidth = 40;
    const int filled = int(progress * kWidth + 0.5f);
    char bar[kWidth + 1];
    for (int i = 0; i < kWidth; ++i)
        bar[i] = i < filled ? '#' : '-';
    bar[kWidth] = '\0';
    std::fprintf(stderr, "\r%s [%s] %3d%%  %.1fs", verb, bar, int(progress * 100 + 0.5f), seconds);
    std::fflush(stderr);
}

} // namespace

int runExport(const std::shared_ptr<zaf::media::ExportSession> &session, const char *verb)
{
    using zaf::media::ExportStatus;
    std::mutex mutex;
    std::condition_variable_any done;
    bool finished = false;

    g_interrupted = false;
    auto previous = std::signal(SIGINT, onInterrupt);
    QElapsedTimer timer;
    timer.start();
    session->exportAsynchronously([&] {
        std::lock_guard lock(mutex);
        finished = true;
        done.notify_one();
    });

    const bool terminal = ::isatty(STDERR_FILENO);
    bool cancelRequested = false;
    {
        std::unique_lock lock(mutex);
        while (!done.wait_for(lock, std::chrono::milliseconds(100), [&] { return finished; })) {
            if (g_interrupted && !cancelRequested) {
                cancelRequested = true;
                session->cancelExport();
            }
            if (terminal)
                drawProgress(verb, session->progress(), timer.elapsed() / 1000.0);
        }
    }
    std::signal(SIGINT, previous);
    if (terminal) {
        drawProgress(verb, session->status() == ExportStatus::Completed ? 1.0f : session->progress(),
                     timer.elapsed() / 1000.0);
        std::fputc('\n', stderr);
    }

    switch (session->status()) {
    case ExportStatus::Completed:
        return 0;
    case ExportStatus::Cancelled:
        return fail(QStringLiteral("%1 cancelled").arg(QString::fromLatin1(verb)));
    default: {
        const zaf::OptionalError error = session->error();
        return fail(QStringLiteral("%1 failed: %2")
                        .arg(QString::fromLatin1(verb), error ? error->message : QStringLiteral("unknown error")));
    }
    }
}

} // namespace zaf::tools
