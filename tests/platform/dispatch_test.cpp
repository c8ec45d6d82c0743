#include "platform/dispatch.h"
#include "tests/support/wait_until.h"

#include <QCoreApplication>
#include <QThread>
#include <gtest/gtest.h>

#include <atomic>

namespace zaf::dispatch {
namespace {

TEST(Dispatch, MainQueueRunsOnALaterPassOfTheMainLoop)
{
    bool ran = false;
    main([&] { ran = true; });
    EXPECT_FALSE(ran);
    QCoreApplication::processEvents();
    EXPECT_TRUE(ran);
}

TEST(Dispatch, MainSyncRunsInlineOnTheMainThread)
{
    bool inlineRan = false;
    mainSync([&] { inlineRan = true; });
    EXPECT_TRUE(inlineRan);
}

TEST(Dispatch, MainSyncFromAWorkerRunsOnTheMainThread)
{
    std::atomic<bool> onMain{false}, workerDone{false};
    async(Priority::Default, [&] {
        mainSync([&] { onMain = isMainThread(); });
        workerDone = true;
    });
    ASSERT_TRUE(test::waitUntil([&] { return workerDone.load(); }));
    EXPECT_TRUE(onMain);
}

TEST(Dispatch, GlobalQueuesRunConcurrentlyOffTheMainThread)
{
    std::atomic<int> offMain{0};
    for (int i = 0; i < 8; ++i) {
        async(Priority::Background, [&] { offMain += !isMainThread(); });
        async(Priority::Default, [&] { offMain += !isMainThread(); });
    }
    waitForGlobalQueue(Priority::Background);
    waitForGlobalQueue(Priority::Default);
    EXPECT_EQ(offMain.load(), 16);
    EXPECT_NE(&globalQueue(Priority::Background), &globalQueue(Priority::Default));
}

// A worker blocked in its hop returns when the main thread closes the gate instead of reaching
// its event loop, and the work never runs; an open gate runs the work on the main thread.
TEST(Dispatch, MainGateRunsHopsUntilClosedAndReleasesAWaitingWorker)
{
    auto gate = MainGate::create();
    EXPECT_TRUE(gate->runSync([] {}));
    std::atomic<int> ranOnMain{0}, result{-1};
    std::atomic<bool> workerDone{false};
    async(Priority::Default, [&] {
        result = gate->runSync([&] { ranOnMain += isMainThread(); }) ? 1 : 0;
        workerDone = true;
    });
    ASSERT_TRUE(test::waitUntil([&] { return workerDone.load(); }));
    EXPECT_EQ(result.load(), 1);
    EXPECT_EQ(ranOnMain.load(), 1);

    std::atomic<bool> ran{false};
    workerDone = false;
    async(Priority::Default, [&] {
        result = gate->runSync([&] { ran = true; }) ? 1 : 0;
        workerDone = true;
    });
    QThread::msleep(50); // the worker now waits for a main thread that does not come
    gate->close();
    // The main thread waits for the worker without handling events, as an owner's destructor does.
    for (int i = 0; i < 500 && !workerDone; ++i)
        QThread::msleep(10);
    EXPECT_TRUE(workerDone);
    EXPECT_EQ(result.load(), 0);
    QCoreApplication::processEvents();
    EXPECT_FALSE(ran);
    EXPECT_FALSE(gate->runSync([&] { ran = true; }));
    EXPECT_FALSE(ran);
}

} // namespace
} // namespace zaf::dispatch
