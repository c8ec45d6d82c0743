#pragma once

// PlayerLayer: the video surface of a Player.
//
// A widget, created and used on the main thread. It paints the Player's current picture scaled to
// fit (aspect kept, centred) on black, turned upright by the preferred transform of the item's
// first video track. Painting happens in device pixels, so high-DPI screens get a sharp picture.

#include "platform/media/media_asset.h"

#include <QPointer>
#include <QWidget>

namespace zaf::media {

class Player;

class PlayerLayer : public QWidget {
    Q_OBJECT
public:
    explicit PlayerLayer(QWidget *parent = nullptr);
    ~PlayerLayer() override;

    // Not owned; nullptr clears the surface to black. The layer follows the Player's
    // videoFrameChanged() and forgets a Player that is destroyed.
    void setPlayer(Player *player);
    Player *player() const { return m_player; }

    // The rectangle, in widget coordinates, the upright picture takes (empty when none is shown).
    QRectF videoRect() const;

protected:
    void paintEvent(QPaintEvent *event) override;

private:
    AffineTransform trackTransform() const;

    QPointer<Player> m_player;
    QMetaObject::Connection m_frameConnection;
};

} // namespace zaf::media
