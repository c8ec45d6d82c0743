#include "platform/media/player_layer.h"

#include "platform/media/player.h"
#include "platform/thread_rules.h"

#include <QPainter>
#include <QPaintEvent>
#include <QTransform>

namespace zaf::media {

PlayerLayer::PlayerLayer(QWidget *parent)
    : QWidget(parent)
{
    ZAF_ASSERT_MAIN_THREAD();
    setAttribute(Qt::WA_OpaquePaintEvent);
}

PlayerLayer::~PlayerLayer() = default;

void PlayerLayer::setPlayer(Player *player)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_player == player)
        return;
    QObject::disconnect(m_frameConnection);
    m_player = player;
    if (player)
        m_frameConnection = connect(player, &Player::videoFrameChanged, this, qOverload<>(&QWidget::update));
    update();
}

AffineTransform PlayerLayer::trackTransform() const
{
    if (!m_player || !m_player->currentItem() || !m_player->currentItem()->asset())
        return AffineTransform::identity();
    const std::shared_ptr<MediaAsset> asset = m_player->currentItem()->asset();
    if (!asset->isLoaded())
        return AffineTransform::identity();
    const QList<AssetTrack> video = asset->tracksWithMediaType(MediaType::Video);
    return video.isEmpty() ? AffineTransform::identity() : video.first().preferredTransform;
}

QRectF PlayerLayer::videoRect() const
{
    if (!m_player)
        return {};
    const QImage frame = m_player->currentVideoFrame();
    if (frame.isNull())
        return {};
    const QSizeF upright = trackTransform().mapSize(QSizeF(frame.size()));
    if (upright.isEmpty() || width() <= 0 || height() <= 0)
        return {};
    const QSizeF fitted = upright.scaled(QSizeF(size()), Qt::KeepAspectRatio);
    return QRectF(QPointF((width() - fitted.width()) / 2, (height() - fitted.height()) / 2), fitted);
}

void PlayerLayer::paintEvent(QPaintEvent *event)
{
    QPainter painter(this);
    painter.fillRect(event->rect(), Qt::black);
    const QRectF target = videoRect();
    if (target.isEmpty())
        return;
    const QImage frame = m_player->currentVideoFrame();
    const AffineTransform t = trackTransform();
    const QSizeF upright = t.mapSize(QSizeF(frame.size()));
    // Picture pixels -> upright picture (the track transform, in the picture's own pixel grid),
    // then -> the fitted rectangle of the widget.
    const QTransform orient(t.a, t.b, t.c, t.d, t.tx, t.ty);
    QTransform toWidget;
    toWidget.translate(target.x(), target.y());
    toWidget.scale(target.width() / upright.width(), target.height() / upright.height());
    painter.setRenderHint(QPainter::SmoothPixmapTransform);
    painter.setTransform(orient * toWidget);
    painter.drawImage(QPointF(0, 0), frame);
}

} // namespace zaf::media
