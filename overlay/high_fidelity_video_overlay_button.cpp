#include "overlay/high_fidelity_video_overlay_button.h"

#include "overlay/overlay_image_button.h"
#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include "platform/ui/autoresizing.h"
#include "platform/ui/backdrop_view.h"

#include <QCoreApplication>
#include <QLabel>
#include <QMouseEvent>
#include <QPixmap>

namespace {

// The backdrop look of the overlay button: the translucent light blur.
constexpr int kBackdropStyle = 2010;
// Mask flags: the background mask shapes the whole backdrop; the glyph shapes its tint.
constexpr int kBackgroundMaskFlags = 7;
constexpr int kGlyphMaskFlags = 3;

} // namespace

ZafHighFidelityVideoOverlayButton::ZafHighFidelityVideoOverlayButton(std::int64_t style, QWidget *parent)
    : QWidget(parent)
    , ZafVideoOverlayButton(style)
    , _button(new zaf::overlay::OverlayImageButton(this))
{
    // The glyph, and the inner button fitted to it at the origin; no image for the pressed state.
    const QImage glyph = zaf::overlay::imageNamed(QLatin1String(ZafVideoOverlayGlyphMaskImageName));
    _button->setNormalImage(glyph);
    _button->sizeToFit();
    _button->setAccessibleName(QCoreApplication::translate("ZafVideoOverlayButton", "Play"));

    // This widget takes the inner button's frame and keeps that size; its owner positions it.
    setGeometry(_button->geometry());
    setFixedSize(_button->size());

    // The inner button's control events: a tap calls the action; a press, and dragging back in,
    // show the pressed look; dragging out shows the rest look.
    connect(_button, &zaf::overlay::OverlayImageButton::touchUpInside, this,
            &ZafHighFidelityVideoOverlayButton::_playButtonTapped);
    connect(_button, &zaf::overlay::OverlayImageButton::touchDown, this,
            &ZafHighFidelityVideoOverlayButton::_playButtonActivate);
    connect(_button, &zaf::overlay::OverlayImageButton::touchDragInside, this,
            &ZafHighFidelityVideoOverlayButton::_playButtonActivate);
    connect(_button, &zaf::overlay::OverlayImageButton::touchDragOutside, this,
            &ZafHighFidelityVideoOverlayButton::_playButtonDeactivate);
    setAttribute(Qt::WA_NoMousePropagation);

    // The size stays; the position follows the container.
    zaf::ui::setAutoresizingMask(this, zaf::ui::kFlexibleMargins);

    if (style == 0) {
        const QImage background = zaf::overlay::imageNamed(QLatin1String(ZafVideoOverlayBackgroundMaskImageName));
        m_maskImageView = new QLabel(this);
        m_maskImageView->setPixmap(QPixmap::fromImage(background));
        m_maskImageView->setGeometry(QRect(QPoint(0, 0), zaf::overlay::sizeInPoints(background).toSize()));
        // The mask view only shapes the backdrop: it never takes a press, and it paints its image and
        // nothing else (no background), since its pixels are the shape the backdrop reads.
        m_maskImageView->setAttribute(Qt::WA_TransparentForMouseEvents);
        m_maskImageView->setAttribute(Qt::WA_NoSystemBackground);

        // The backdrop covers this widget's bounds, the area its mask views shape.
        _backdropView = new zaf::ui::BackdropView(kBackdropStyle, this);
        _backdropView->setGeometry(rect());
        _backdropView->setAttribute(Qt::WA_TransparentForMouseEvents);

        // Back to front: backdrop, inner button, mask image view.
        _backdropView->stackUnder(_button);
        m_maskImageView->raise();

        // The mask view is invisible (alpha 0): the backdrop reads its shape and never lets it paint
        // on screen. It gets no opacity effect, which would also empty the shape the backdrop reads.
        zaf::ui::BackdropView::setBackdropMaskFlags(m_maskImageView, kBackgroundMaskFlags);
        _backdropView->addMaskView(m_maskImageView);
        zaf::ui::BackdropView::setBackdropMaskFlags(_button, kGlyphMaskFlags);
        _backdropView->addMaskView(_button);
    }

    _playButtonDeactivate(this);
}

ZafHighFidelityVideoOverlayButton::~ZafHighFidelityVideoOverlayButton() = default;

double ZafHighFidelityVideoOverlayButton::glyphAlpha() const
{
    return _button->imageOpacity();
}

void ZafHighFidelityVideoOverlayButton::_playButtonActivate(QObject *)
{
    setGlyphAlpha(ZafVideoOverlayHighlightedGlyphAlpha);
}

void ZafHighFidelityVideoOverlayButton::_playButtonDeactivate(QObject *)
{
    setGlyphAlpha(ZafVideoOverlayDefaultGlyphAlpha);
}

void ZafHighFidelityVideoOverlayButton::_playButtonTapped(QObject *)
{
    _playButtonDeactivate(_button);
    sendAction();
}

void ZafHighFidelityVideoOverlayButton::setGlyphAlpha(double alpha)
{
    // With the backdrop the glyph is one of its masks and is not drawn itself: its alpha sets how
    // deep it cuts into the tint, so the video shows through the play shape. Without a backdrop it
    // is drawn with that alpha.
    _button->setImageOpacity(alpha);
}

void ZafHighFidelityVideoOverlayButton::mousePressEvent(QMouseEvent *event)
{
    event->accept();
}

void ZafHighFidelityVideoOverlayButton::mouseMoveEvent(QMouseEvent *event)
{
    event->accept();
}

void ZafHighFidelityVideoOverlayButton::mouseReleaseEvent(QMouseEvent *event)
{
    event->accept();
}
