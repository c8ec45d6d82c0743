#pragma once

// What every fuzz target shares: the one-time set-up and the invariant check.
//
// The readers log what they refuse; on a fuzzer's millions of inputs that would be nothing but
// noise and slowness, so the messages are dropped unless ZAF_FUZZ_LOG is set (useful when
// replaying one crashing input). Fatal messages are always printed.

#include <QCoreApplication>
#include <QtGlobal>

#include <cstdio>
#include <cstdlib>

namespace zaf::fuzz {

inline void dropMessage(QtMsgType type, const QMessageLogContext &, const QString &message)
{
    if (type == QtFatalMsg)
        std::fprintf(stderr, "%s\n", qPrintable(message));
}

// Creates the process's QCoreApplication (kept for the whole run) and silences logging. Call it
// from LLVMFuzzerInitialize.
inline void setUpOnce()
{
    static const bool done = [] {
        if (qEnvironmentVariableIsEmpty("ZAF_FUZZ_LOG"))
            qInstallMessageHandler(dropMessage);
        static int argc = 1;
        static char name[] = "zaf-fuzz";
        static char *argv[] = {name, nullptr};
        // Reachable through qApp until the process ends: not a leak.
        new QCoreApplication(argc, argv);
        return true;
    }();
    Q_UNUSED(done);
}

} // namespace zaf::fuzz

// An invariant of a reader's result that must hold for every input: a violation aborts, which the
// fuzzer records as a finding with the input that caused it.
#define ZAF_FUZZ_CHECK(condition)                                                                   \
    do {                                                                                           \
        if (!(condition)) {                                                                        \
            std::fprintf(stderr, "invariant broken: %s (%s:%d)\n", #condition, __FILE__, __LINE__); \
            std::abort();                                                                          \
        }                                                                                          \
    } while (0)
