#include "platform/media/player_item.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/core/ffmpeg_ptr.h"
#include "platform/media/core/media_log.h"
#include "platform/media/player.h"
#include "platform/thread_rules.h"

namespace zaf::media {


PlayerItem::PlayerItem(std::shared_ptr<MediaAsset> asset, QObject *parent)
    : QObject(parent)
    , m_asset(std::move(asset))
{
    ZAF_ASSERT_MAIN_THREAD();
    QPointer<PlayerItem> self(this);
    if (!m_asset) {
        dispatch::main([self] {
            if (self)
                self->finishLoading();
        });
        return;
    }
    std::shared_ptr<MediaAsset> loading = m_asset;
    loading->loadAsynchronously([self, loading] {
        dispatch::main([self] {
            if (self)
                self->finishLoading();
        });
    });
}

PlayerItem::~PlayerItem() = default;

void PlayerItem::finishLoading()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_status != Status::Unknown)
        return;
    if (!m_asset) {
        m_error = makeMediaError(kMediaErrorInvalidArgument, QStringLiteral("The player item has no asset."));
    } else if (!m_asset->isPlayable()) {
        m_error = m_asset->loadError();
        if (!m_error)
            m_error = makeMediaError(kMediaErrorNoTracks, QStringLiteral("%1 holds nothing to play.").arg(m_asset->url().toString()));
    } else {
        m_duration = m_asset->duration();
        const QList<AssetTrack> video = m_asset->tracksWithMediaType(MediaType::Video);
        const QSize pictureSize = video.isEmpty() ? QSize() : video.first().naturalSize.toSize();
        if (!m_duration.isNumeric()) {
            m_error = makeMediaError(kMediaErrorCannotOpen,
                QStringLiteral("%1 has no known duration.").arg(m_asset->url().toString()));
        } else if (qint64(pictureSize.width()) * pictureSize.height() > ff::kMaxPixels) {
            // No decoder may allocate such pictures: played, the movie would stay black.
            m_error = makeMediaError(kMediaErrorDecodeFailed, QStringLiteral("%1 has pictures too large to decode (%2x%3).")
                .arg(m_asset->url().toString()).arg(pictureSize.width()).arg(pictureSize.height()));
        }
    }
    if (m_error) {
        zaf::log::error(lcPlayback(), QStringLiteral("Cannot play %1: %2")
                .arg(m_asset ? m_asset->url().toString() : QStringLiteral("(no asset)"), m_error->description()));
        m_status = Status::Failed;
        m_duration = MediaTime::invalid();
    } else {
        m_status = Status::ReadyToPlay;
    }
    Q_EMIT statusChanged();
}

MediaTime PlayerItem::duration() const
{
    return m_status == Status::ReadyToPlay ? m_duration : MediaTime::invalid();
}

MediaTime PlayerItem::currentTime() const
{
    return m_player ? m_player->currentTime() : MediaTime::make(0, 1000000000);
}

} // namespace zaf::media
