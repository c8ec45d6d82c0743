#include "platform/dispatch.h"

#include <QCoreApplication>
#include <QThread>
#include <QThreadPool>
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

TEST(Dispatch, MainSyncRunsInlineOnMainAndBlocksFromWorkers)
{
    bool inlineRan = false;
    mainSync([&] { inlineRan = true; });
    EXPECT_TRUE(inlineRan);

    std::atomic<bool> onMain{false}, workerDone{false};
    async(Priority::Default, [&] {
        mainSync([&] { onMain = isMainThread(); });
        workerDone = true;
    });
    while (!workerDone)
        QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
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

} // namespace
} // namespace zaf::dispatch
