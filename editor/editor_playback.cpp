// Playback: readiness of the movie, the playhead, play and pause with their toolbar items, the end
// of playback, loading another movie, and two measurements of the loaded movie.
#include "editor/editor.h"

#include "overlay/video_overlay_button.h"
#include "platform/media/media_asset.h"
#include "platform/media/player_item.h"
#include "platform/media/player_layer.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/view_animation.h"

#include <cmath>

using namespace zaf::media;
using namespace zaf::ui;

ZafVideoEditorViewController::MediaTime ZafVideoEditorViewController::mediaTimeFromSeconds(double seconds) const
{
    // Seconds become a time in the timescale of the player's current time (0 without a player).
    const std::int32_t timescale = m_mvPlayer ? m_mvPlayer->currentTime().timescale : 0;
    return MediaTime::fromSeconds(seconds, timescale);
}

void ZafVideoEditorViewController::observeStatusOfCurrentItem()
{
    const std::shared_ptr<PlayerItem> item = m_mvPlayer->currentItem();
    if (!item)
        return;
    PlayerItem *raw = item.get();
    m_statusObservation.append(connect(raw, &PlayerItem::statusChanged, this, [this, raw] {
        observeValueForKeyPathOfObjectChangeContext(QStringLiteral("status"), raw, {}, nullptr);
    }));
}

void ZafVideoEditorViewController::stopObservingStatusOfCurrentItem()
{
    for (const QMetaObject::Connection &c : std::as_const(m_statusObservation))
        disconnect(c);
    m_statusObservation.clear();
}

void ZafVideoEditorViewController::registerForEndOfPlayback()
{
    PlayerItem *raw = m_mvPlayerItem.get();
    m_notificationRegistrations.append(
        connect(raw, &PlayerItem::didPlayToEndTime, this, [this, raw] { itemDidFinishPlaying(raw); }));
}

void ZafVideoEditorViewController::removeAllNotificationRegistrations()
{
    for (const QMetaObject::Connection &c : std::as_const(m_notificationRegistrations))
        disconnect(c);
    m_notificationRegistrations.clear();
}

void ZafVideoEditorViewController::observeValueForKeyPathOfObjectChangeContext(const QString &keyPath, QObject *object,
                                                                               const QVariantMap &, void *)
{
    const std::shared_ptr<PlayerItem> current = m_mvPlayer ? m_mvPlayer->currentItem() : nullptr;
    if (!current || object != current.get() || keyPath != QLatin1String("status"))
        return;
    if (currentItemIsUnplayable()) {
        showUnplayableMovieMessage();
        return;
    }
    if (current->status() != PlayerItem::Status::ReadyToPlay)
        return;
    m_thumbnailGenerator.reset();
    m_cachedTimeStamps.reset();
    m_mvTrimmer->setDelegate(this);
    m_mvTrimmer->setDataSource(this);
    m_editStartTime = 0;
    m_editEndTime = getPlayerDuration();
    m_mvTrimmer->reloadData();
}

void ZafVideoEditorViewController::playAction()
{
    if (m_movieUnplayable)
        return;
    if (m_trimming) {
        m_mvPlayer->seekToTime(mediaTimeFromSeconds(m_editStartTime));
        // Playback stops at the end of the range. Earlier boundary observers are removed first, so
        // only the current end of the range can stop playback.
        if (m_timeObserver != 0)
            m_mvPlayer->removeTimeObserver(m_timeObserver);
        QPointer<ZafVideoEditorViewController> weakSelf(this);
        m_timeObserver = m_mvPlayer->addBoundaryTimeObserver({mediaTimeFromSeconds(m_editEndTime)}, [weakSelf] {
            if (weakSelf)
                weakSelf->pauseAction();
        });
    }
    m_mvPlayer->play();
    if (!m_uiHidden)
        hideUI();
    if (m_introMode) {
        removeFromSuperview(m_videoOverlayPlayButton->widget());
        m_introMode = false;
    }
    if (!m_padMode) {
        setToolbarItems(m_bottomToolBar, {m_shareButton, m_flexSpace, m_pauseButton, m_flexSpace});
    } else if (m_trimming) {
        setToolbarItems(m_topToolBar, {m_cancelTrimButton, m_flexSpace, m_titleButton, m_flexSpace, m_pauseButton,
                                       m_fixSpace, m_shareButton, m_fixSpace, m_trimButton});
    } else {
        setToolbarItems(m_topToolBar, {m_cancelButton, m_flexSpace, m_titleButton, m_flexSpace, m_pauseButton,
                                       m_fixSpace, m_shareButton, m_fixSpace, m_saveButton});
    }
}

void ZafVideoEditorViewController::pauseAction()
{
    m_mvPlayer->pause();
    if (!m_padMode) {
        setToolbarItems(m_bottomToolBar, {m_shareButton, m_flexSpace, m_playButton, m_flexSpace});
    } else if (m_trimming) {
        setToolbarItems(m_topToolBar, {m_cancelTrimButton, m_flexSpace, m_titleButton, m_flexSpace, m_playButton,
                                       m_fixSpace, m_shareButton, m_fixSpace, m_trimButton});
    } else {
        setToolbarItems(m_topToolBar, {m_cancelButton, m_flexSpace, m_titleButton, m_flexSpace, m_playButton,
                                       m_fixSpace, m_shareButton, m_fixSpace, m_saveButton});
    }
}

void ZafVideoEditorViewController::itemDidFinishPlaying(QObject *)
{
    pauseAction();
    if (m_uiHidden)
        showUI();
    m_mvPlayer->seekToTime(MediaTime::zero());
}

void ZafVideoEditorViewController::reloadMvLayerWithURL(const QUrl &url)
{
    if (m_trimming)
        m_mvTrimmer->delegate()->movieScrubberDidCancelEditing(m_mvTrimmer);
    m_videoURL = url;
    stopObservingStatusOfCurrentItem();

    // The observers of the player being replaced go with it: they can never fire again.
    if (m_mvPlayer) {
        m_mvPlayer->removeTimeObserver(m_playbackTimeObserver);
        if (m_timeObserver != 0)
            m_mvPlayer->removeTimeObserver(m_timeObserver);
        m_timeObserver = 0;
    }
    m_mvAsset = MediaAsset::assetWithURL(url);
    m_mvPlayerItem = std::make_shared<PlayerItem>(m_mvAsset);
    std::unique_ptr<Player> previous = std::move(m_mvPlayer);
    m_mvPlayer = std::make_unique<Player>(m_mvPlayerItem);
    m_mvPlayer->setActionAtItemEnd(ActionAtItemEnd::Pause);
    m_mvPlayer->seekToTime(MediaTime::zero());
    m_mvPlayerLayer->setPlayer(m_mvPlayer.get());
    previous.reset();
    observeStatusOfCurrentItem();
    m_scrubbing = false;
    addPlaybackTimeObserver();
}

double ZafVideoEditorViewController::getPlayerDuration() const
{
    const std::shared_ptr<PlayerItem> item = m_mvPlayer ? m_mvPlayer->currentItem() : nullptr;
    if (!item || item->status() != PlayerItem::Status::ReadyToPlay)
        return MediaTime::invalid().seconds();
    return item->duration().seconds();
}

QSizeF ZafVideoEditorViewController::getVideoSize() const
{
    const std::shared_ptr<PlayerItem> item = m_mvPlayer ? m_mvPlayer->currentItem() : nullptr;
    if (!item)
        return QSizeF(0, 0);
    const QList<AssetTrack> tracks = item->asset()->tracksWithMediaType(MediaType::Video);
    if (tracks.isEmpty())
        return QSizeF(0, 0);
    const QSizeF natural = tracks.first().naturalSize;
    const AffineTransform &t = tracks.first().preferredTransform;
    return QSizeF(std::fabs(natural.width() * t.a + natural.height() * t.c),
                  std::fabs(natural.width() * t.b + natural.height() * t.d));
}
