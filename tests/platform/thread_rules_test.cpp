// The run-time thread rules: a check on the right thread passes, one on the wrong thread stops the
// process with the rule it broke. Only builds with the checks on (debug and sanitizer builds) can
// show the second; release builds skip it.
#include "platform/thread_rules.h"

#include <gtest/gtest.h>

#include <thread>

namespace zaf::test {
namespace {

void onWorker(void (*check)())
{
    std::thread worker(check);
    worker.join();
}

TEST(ThreadRules, ChecksOnTheirOwnThreadPass)
{
    ZAF_ASSERT_MAIN_THREAD();
    onWorker([] { ZAF_ASSERT_WORKER_THREAD(); });
}

#ifdef ZAF_THREAD_CHECKS
struct BrokenRule {
    const char *name;
    void (*breakIt)();
    const char *message;
};

class ThreadRulesDeathTest : public testing::TestWithParam<BrokenRule> {};

TEST_P(ThreadRulesDeathTest, BreakingARuleAbortsNamingIt)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_DEATH(GetParam().breakIt(), GetParam().message);
}

INSTANTIATE_TEST_SUITE_P(
    Rules, ThreadRulesDeathTest,
    testing::Values(BrokenRule{"MainThreadCheckOnAWorker", [] { onWorker([] { ZAF_ASSERT_MAIN_THREAD(); }); },
                               "main thread only"},
                    BrokenRule{"WorkerCheckOnTheMainThread", [] { ZAF_ASSERT_WORKER_THREAD(); },
                               "worker thread only"}),
    [](const testing::TestParamInfo<BrokenRule> &info) { return std::string(info.param.name); });
#endif

} // namespace
} // namespace zaf::test
