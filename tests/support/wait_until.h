#pragma once

// Runs the event loop until a condition holds or the bound passes; returns the condition.

#include <QEventLoop>
#include <QTimer>

#include <functional>

namespace zaf::test {

inline bool waitUntil(const std::function<bool()> &condition, int milliseconds = 60000)
{
    QEventLoop loop;
    QTimer poll;
    QTimer timeout;
    timeout.setSingleShot(true);
    QObject::connect(&poll, &QTimer::timeout, &loop, [&] {
        if (condition())
            loop.quit();
    });
    QObject::connect(&timeout, &QTimer::timeout, &loop, &QEventLoop::quit);
    poll.start(5);
    timeout.start(milliseconds);
    if (!condition())
        loop.exec();
    return condition();
}

} // namespace zaf::test
