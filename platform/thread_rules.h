#pragma once

// The thread rules, checked at run time at each role's boundary: UI and the Player on the main
// thread, completions of background work on a worker thread.
//
// Debug and sanitizer builds (ZAF_THREAD_CHECKS defined) check every rule: a call on the wrong
// thread logs the rule and the function that broke it, then aborts, so a test under the sanitizers
// fails where the rule was broken instead of racing somewhere later. Release builds compile the
// checks out. A process without a QCoreApplication has no main thread to tell apart (command-line
// tools that only read movies), so there every check passes.

#include <QtGlobal>

namespace zaf::threads {

// True on the main thread, or when there is no application.
bool onMainThreadOrNoApplication();
// True off the main thread, or when there is no application.
bool offMainThreadOrNoApplication();
// Logs the broken rule and aborts.
[[noreturn]] void ruleBroken(const char *rule, const char *function);

} // namespace zaf::threads

#ifdef ZAF_THREAD_CHECKS
#define ZAF_ASSERT_MAIN_THREAD()                                                                     \
    (zaf::threads::onMainThreadOrNoApplication() ? void()                                            \
                                                 : zaf::threads::ruleBroken("main thread only", Q_FUNC_INFO))
#define ZAF_ASSERT_WORKER_THREAD()                                                                   \
    (zaf::threads::offMainThreadOrNoApplication()                                                    \
         ? void()                                                                                    \
         : zaf::threads::ruleBroken("worker thread only, never the main thread", Q_FUNC_INFO))
#else
#define ZAF_ASSERT_MAIN_THREAD() void()
#define ZAF_ASSERT_WORKER_THREAD() void()
#endif
