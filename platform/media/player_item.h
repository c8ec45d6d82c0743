#pragma once

// PlayerItem: the playback state of one MediaAsset.
//
// Created, used and destroyed on the main thread. The constructor starts loading the asset on a
// global queue; when the load ends, status() becomes ReadyToPlay or Failed (with error()) and
// statusChanged() is emitted once on the main thread. A Player plays the item; currentTime() is that
// Player's time.

#include "platform/error.h"
#include "platform/media/media_asset.h"
#include "platform/media/media_time.h"

#include <QObject>
#include <QPointer>

#include <memory>

namespace zaf::media {

class Player;

class PlayerItem : public QObject {
    Q_OBJECT
public:
    enum class Status { Unknown = 0, ReadyToPlay = 1, Failed = 2 };

    // Loads the asset off the main thread. A null asset fails at once (on a later pass of the
    // event loop, so observers connected after construction see the change).
    explicit PlayerItem(std::shared_ptr<MediaAsset> asset, QObject *parent = nullptr);
    ~PlayerItem() override;

    std::shared_ptr<MediaAsset> asset() const { return m_asset; }
    Status status() const { return m_status; }
    OptionalError error() const { return m_error; }
    // The asset's duration; invalid until ReadyToPlay.
    MediaTime duration() const;
    // The time of the Player that plays this item; zero when none does.
    MediaTime currentTime() const;

Q_SIGNALS:
    // Main thread, once per change of status().
    void statusChanged();
    // Main thread: playback reached the end of the item; once each time it gets there.
    void didPlayToEndTime();

private:
    friend class Player;
    void finishLoading();
    void setPlayer(Player *player) { m_player = player; }

    std::shared_ptr<MediaAsset> m_asset;
    Status m_status = Status::Unknown;
    OptionalError m_error;
    MediaTime m_duration;
    QPointer<Player> m_player;
};

} // namespace zaf::media
