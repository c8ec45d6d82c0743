#pragma once

// Shared by the player tests: waiting on the event loop (for loading and decoding, never for
// playback, whose clock the tests advance) and players made ready on a manual clock.

#include "platform/media/player.h"

#include <QEventLoop>
#include <QTimer>
#include <QUrl>

#include <gtest/gtest.h>

#include <functional>
#include <memory>

namespace zaf::media::test {

// Runs the event loop until `done` holds or the bound passes.
inline bool runUntil(const std::function<bool()> &done, int boundMs = 15000)
{
    for (int waited = 0; !done(); waited += 10) {
        if (waited >= boundMs)
            return false;
        QEventLoop loop;
        QTimer::singleShot(10, &loop, &QEventLoop::quit);
        loop.exec();
    }
    return true;
}

inline MediaTime seconds(double s)
{
    return MediaTime::fromSeconds(s, 1000000000);
}

// A Player of the movie at `path` driven by `clock`, with its item ready.
inline std::unique_ptr<Player> readyPlayerOn(const QString &path, const std::shared_ptr<TimeSource> &clock)
{
    auto item = std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
    auto player = std::make_unique<Player>(item);
    player->setTimeSource(clock);
    EXPECT_TRUE(runUntil([&] { return item->status() != PlayerItem::Status::Unknown; }));
    EXPECT_EQ(item->status(), PlayerItem::Status::ReadyToPlay);
    return player;
}

} // namespace zaf::media::test
