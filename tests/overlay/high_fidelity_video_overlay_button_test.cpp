// The high-fidelity overlay button: its children per style, a press taken away by hiding, the frosted look.
#include "overlay/overlay_image_button.h"
#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include "platform/ui/backdrop_view.h"
#include "tests/overlay/overlay_test_support.h"

#include <QCoreApplication>
#include <QLabel>
#include <gtest/gtest.h>

namespace zaf::test {
namespace {

using ui::BackdropView;
using HighFidelityButtonTest = ButtonOnSurface<ZafHighFidelityVideoOverlayButton>;

class HighFidelityButtonConstruction : public ::testing::TestWithParam<std::int64_t> {};

// The button keeps the glyph's size (its owner only moves it); style 0 stacks a backdrop, the glyph
// button and an invisible mask, other styles the glyph button alone.
TEST_P(HighFidelityButtonConstruction, FitsToTheGlyphAndStacksABackdropAndAMaskOnlyForStyleZero)
{
    const QSize glyphPoints = overlay::sizeInPoints(glyphMask()).toSize();
    ZafHighFidelityVideoOverlayButton button(GetParam());
    EXPECT_EQ(button._button->geometry(), QRect(QPoint(0, 0), glyphPoints));
    EXPECT_EQ(button.minimumSize(), glyphPoints);
    EXPECT_EQ(button.maximumSize(), glyphPoints);
    const QList<QWidget *> backToFront = button.findChildren<QWidget *>(Qt::FindDirectChildrenOnly);
    if (GetParam() != 0) {
        EXPECT_EQ(button._backdropView, nullptr);
        EXPECT_EQ(button.maskImageView(), nullptr);
        EXPECT_EQ(backToFront, QList<QWidget *>{button._button});
        return;
    }
    ASSERT_NE(button._backdropView, nullptr);
    ASSERT_NE(button.maskImageView(), nullptr);
    EXPECT_EQ(backToFront, (QList<QWidget *>{button._backdropView, button._button, button.maskImageView()}));
    EXPECT_EQ(button._backdropView->geometry(), button.rect());
    // The mask view shapes the background and the tint, the glyph button cuts the tint only.
    EXPECT_EQ(button._backdropView->maskViews(), (QList<QWidget *>{button.maskImageView(), button._button}));
    EXPECT_EQ(BackdropView::backdropMaskFlags(button.maskImageView()), 7);
    EXPECT_EQ(BackdropView::backdropMaskFlags(button._button), 3);
    EXPECT_EQ(button.maskImageView()->geometry(), QRect(QPoint(0, 0), overlay::sizeInPoints(backgroundMask()).toSize()));
    EXPECT_TRUE(button.maskImageView()->testAttribute(Qt::WA_TransparentForMouseEvents));
}

INSTANTIATE_TEST_SUITE_P(Styles, HighFidelityButtonConstruction, ::testing::Values<std::int64_t>(0, 1, 2, 3, 7, -1, INT64_MIN, INT64_MAX),
                         [](const auto &info) { return styleName(info.param); });

TEST_F(HighFidelityButtonTest, PressTakenAwayByHidingLeavesThePressedLookAndNoTap)
{
    pointer.press(centre());
    button->hide();
    pointer.release(centre());
    EXPECT_TRUE(looksPressed(button));
    EXPECT_EQ(target.calls, 0);

    button->show();
    pointer.tap(centre());
    EXPECT_EQ(target.calls, 1);
    EXPECT_FALSE(looksPressed(button));
}

// The button over a solid blue surface standing for the video, as the window shows it.
TEST(HighFidelityButtonLook, BackdropFrostsTheVideoInsideTheBackgroundShapeAndTheGlyphFollowsItsAlpha)
{
    const QColor video(0, 0, 200);
    TapSurface surface;
    QPalette palette = surface.palette();
    palette.setColor(QPalette::Window, video);
    surface.setPalette(palette);
    surface.setAutoFillBackground(true);
    auto *button = new ZafHighFidelityVideoOverlayButton(0, &surface);
    button->move(100, 60);
    surface.show();
    // The backdrop renders what lies behind it on the next turn of the event loop.
    for (int i = 0; i < 3; ++i) {
        surface.grab();
        QCoreApplication::processEvents();
    }
    ASSERT_FALSE(button->_backdropView->lastRenderedBackground().isNull());

    const QSize size = button->size();
    const QPoint corner(1, 1);                                      // outside the round background
    const QPoint background(size.width() / 10, size.height() / 2);  // inside it, left of the glyph
    const QPoint glyph(size.width() / 2, size.height() / 2);
    // The background mask is opaque around the round button and clear inside it.
    ASSERT_EQ(qAlpha(backgroundMask().pixel(corner)), 255);
    ASSERT_EQ(qAlpha(backgroundMask().pixel(background)), 0);
    ASSERT_EQ(qAlpha(glyphMask().pixel(background)), 0);
    ASSERT_EQ(qAlpha(glyphMask().pixel(glyph)), 255);

    auto shown = [&](QPoint inButton) { return surface.grab().toImage().pixelColor(button->mapTo(&surface, inButton)); };
    EXPECT_EQ(shown(corner), video);   // outside the background shape the video shows untouched
    // Inside it, a light frost; the invisible mask view's white shape is not drawn over it.
    const QColor frost = shown(background);
    EXPECT_GT(frost.red(), video.red() + 50);
    EXPECT_LT(frost.red(), 250);
    // The glyph cuts into the frost, deeper while pressed.
    const QColor glyphAtRest = shown(glyph);
    EXPECT_LT(glyphAtRest.red(), frost.red());
    Pointer pointer(&surface);
    pointer.press(centreInWindow(button));
    EXPECT_LT(shown(glyph).red(), glyphAtRest.red());
    pointer.release(centreInWindow(button));
    EXPECT_EQ(shown(glyph), glyphAtRest);
}

} // namespace
} // namespace zaf::test
