#include "platform/thread_rules.h"

#include <QCoreApplication>
#include <QThread>

#include <cstdio>
#include <cstdlib>

namespace zaf::threads {

namespace {

bool hasApplication()
{
    return QCoreApplication::instance() != nullptr;
}

bool onMainThread()
{
    return QThread::currentThread() == QCoreApplication::instance()->thread();
}

} // namespace

bool onMainThreadOrNoApplication()
{
    return !hasApplication() || onMainThread();
}

bool offMainThreadOrNoApplication()
{
    return !hasApplication() || !onMainThread();
}

void ruleBroken(const char *rule, const char *function)
{
    // Straight to stderr and abort: the logging framework may itself be what runs on the wrong
    // thread, and the point is to stop where the rule broke.
    std::fprintf(stderr, "thread rule broken (%s) in %s\n", rule, function);
    std::fflush(stderr);
    std::abort();
}

} // namespace zaf::threads
