#include "overlay/flat_video_overlay_button.h"
#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include "platform/ui/screen.h"
#include "tests/overlay/overlay_test_support.h"

#include <QColor>
#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <thread>
#include <vector>

namespace zaf::test {
namespace {

// Placed first in the file so that, in a whole-program run, it is the first use of the images.
TEST(FlatButtonSharedImages, RacingFirstCallsRenderEachImageOnceAndReturnTheSameObject)
{
    constexpr int kThreads = 4;
    std::vector<const QImage *> normals(kThreads), highlighteds(kThreads);
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([&, i] {
            normals[i] = &ZafFlatVideoOverlayButton::_normalButtonImage();
            highlighteds[i] = &ZafFlatVideoOverlayButton::_highlightedButtonImage();
        });
    }
    for (std::thread &t : threads)
        t.join();
    for (int i = 0; i < kThreads; ++i) {
        EXPECT_EQ(normals[i], &ZafFlatVideoOverlayButton::_normalButtonImage());
        EXPECT_EQ(highlighteds[i], &ZafFlatVideoOverlayButton::_highlightedButtonImage());
    }
    EXPECT_EQ(ZafFlatVideoOverlayButton::sharedImageRenderCount(), 2);
}

TEST(FlatButtonSharedImages, ButtonsOfStylesZeroAndTwoShowTheVerySameImages)
{
    ZafFlatVideoOverlayButton a(0);
    ZafFlatVideoOverlayButton b(2);
    const QImage &normal = ZafFlatVideoOverlayButton::_normalButtonImage();
    const QImage &highlighted = ZafFlatVideoOverlayButton::_highlightedButtonImage();
    ASSERT_FALSE(normal.isNull());
    ASSERT_FALSE(highlighted.isNull());
    EXPECT_NE(normal.cacheKey(), highlighted.cacheKey());

    for (const ZafFlatVideoOverlayButton *button : {&a, &b}) {
        EXPECT_EQ(button->normalImage().cacheKey(), normal.cacheKey());
        EXPECT_EQ(button->normalImage().constBits(), normal.constBits());
        EXPECT_EQ(button->highlightedImage().cacheKey(), highlighted.cacheKey());
        EXPECT_EQ(button->highlightedImage().constBits(), highlighted.constBits());
    }
    // However many buttons exist, the drawing ran once per image.
    std::vector<std::unique_ptr<ZafFlatVideoOverlayButton>> more;
    for (int i = 0; i < 5; ++i)
        more.push_back(std::make_unique<ZafFlatVideoOverlayButton>(i));
    EXPECT_EQ(ZafFlatVideoOverlayButton::sharedImageRenderCount(), 2);
}

TEST(FlatButtonSharedImages, ImagesHaveTheBackgroundMaskSizeInPointsAtTheScreenScale)
{
    const double scale = ui::Screen::mainScreenScale();
    const QSizeF points = overlay::sizeInPoints(backgroundMask());
    ASSERT_FALSE(points.isEmpty());
    for (const QImage *image : {&ZafFlatVideoOverlayButton::_normalButtonImage(),
                                &ZafFlatVideoOverlayButton::_highlightedButtonImage()}) {
        EXPECT_EQ(image->devicePixelRatio(), scale);
        EXPECT_EQ(image->size(), QSize(std::ceil(points.width() * scale), std::ceil(points.height() * scale)));
        EXPECT_EQ(overlay::sizeInPoints(*image), points);
        EXPECT_TRUE(image->hasAlphaChannel());
    }
}

// The compositing rules, checked on every pixel against the two masks at the same pixel. Where a
// mask is partly transparent (anti-aliased edges) no rule is checked.
struct RenderCase {
    const char *name;
    double white;
    double backgroundAlpha;
    double glyphAlpha;
    const QImage *(*image)(); // the shared image for these values, or null to render a new one
};

const QImage *normalImage()
{
    return &ZafFlatVideoOverlayButton::_normalButtonImage();
}
const QImage *highlightedImage()
{
    return &ZafFlatVideoOverlayButton::_highlightedButtonImage();
}

class FlatButtonRendering : public ::testing::TestWithParam<RenderCase> {};

TEST_P(FlatButtonRendering, PixelsFollowTheFillCutOutAndGlyphRules)
{
    const RenderCase &c = GetParam();
    const QImage rendered =
        c.image ? *c.image()
                : ZafFlatVideoOverlayButton::_createOverlayImageWithBackgroundWhiteBackgroundAlphaGlyphAlpha(
                      c.white, c.backgroundAlpha, c.glyphAlpha);
    const QImage background = backgroundMask();
    const QImage glyph = glyphMask();
    ASSERT_EQ(rendered.size(), background.size());
    ASSERT_EQ(glyph.size(), background.size());

    const int fillAlpha = qRound(c.backgroundAlpha * 255);
    const int fillGray = qRound(c.white * 255);
    const int glyphAlpha = qRound(c.glyphAlpha * 255);
    int filled = 0, cutOut = 0, glyphPixels = 0;
    for (int y = 0; y < rendered.height(); ++y) {
        for (int x = 0; x < rendered.width(); ++x) {
            const int b = qAlpha(background.pixel(x, y));
            const int g = qAlpha(glyph.pixel(x, y));
            const QColor pixel = rendered.pixelColor(x, y);
            if (b == 0 && g == 0) {
                ++filled;
                ASSERT_NEAR(pixel.alpha(), fillAlpha, 2) << x << "," << y;
                if (fillAlpha > 0) {
                    ASSERT_NEAR(pixel.red(), fillGray, 2) << x << "," << y;
                    ASSERT_EQ(pixel.red(), pixel.green());
                    ASSERT_EQ(pixel.red(), pixel.blue());
                }
            } else if (b == 255 && g == 0) {
                ++cutOut;
                ASSERT_EQ(pixel.alpha(), 0) << x << "," << y;
            } else if (g == 255) {
                ++glyphPixels;
                ASSERT_NEAR(pixel.alpha(), glyphAlpha, 2) << x << "," << y;
                if (glyphAlpha > 20) { // the glyph mask's colour: white
                    ASSERT_GE(pixel.red(), 250) << x << "," << y;
                }
            }
        }
    }
    // Each rule was checked on a real area.
    EXPECT_GT(filled, 100);
    EXPECT_GT(cutOut, 100);
    EXPECT_GT(glyphPixels, 100);
}

INSTANTIATE_TEST_SUITE_P(
    SharedAndCustom, FlatButtonRendering,
    ::testing::Values(RenderCase{"Normal", ZafVideoOverlayFlatBackgroundWhite, ZafVideoOverlayFlatBackgroundAlpha,
                                 ZafVideoOverlayDefaultGlyphAlpha, normalImage},
                      RenderCase{"Highlighted", ZafVideoOverlayFlatBackgroundWhite,
                                 ZafVideoOverlayFlatBackgroundAlpha, ZafVideoOverlayHighlightedGlyphAlpha,
                                 highlightedImage},
                      RenderCase{"OpaqueBlackFillOpaqueGlyph", 0.0, 1.0, 1.0, nullptr},
                      RenderCase{"HalfWhiteFillInvisibleGlyph", 1.0, 0.5, 0.0, nullptr},
                      RenderCase{"NoFill", 0.5, 0.0, 0.5, nullptr}),
    [](const ::testing::TestParamInfo<RenderCase> &info) { return std::string(info.param.name); });

// A flat button on a surface standing for the video, shown, with a target for `playAction`.
class FlatButtonTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        button = new ZafFlatVideoOverlayButton(2, &surface);
        button->move(50, 40);
        button->setTargetAction(&target, "playAction");
        surface.show();
    }
    // What the button paints now (without the window's background), in the shared images' format.
    QImage painted() const
    {
        const QImage &normal = button->normalImage();
        QImage image(normal.size(), QImage::Format_ARGB32_Premultiplied);
        image.setDevicePixelRatio(normal.devicePixelRatio());
        image.fill(Qt::transparent);
        button->render(&image, QPoint(), QRegion(), QWidget::DrawChildren);
        return image;
    }

    TapSurface surface;
    ActionTarget target;
    ZafFlatVideoOverlayButton *button = nullptr;
    Pointer pointer{&surface};
};

TEST_F(FlatButtonTest, PressShowsTheHighlightedImageOnlyWhileThePointerIsInside)
{
    const QImage &normal = ZafFlatVideoOverlayButton::_normalButtonImage();
    const QImage &highlighted = ZafFlatVideoOverlayButton::_highlightedButtonImage();
    EXPECT_EQ(painted(), normal);
    pointer.press(centreInWindow(button));
    EXPECT_EQ(painted(), highlighted);
    pointer.move(outsideInWindow(button));
    EXPECT_EQ(painted(), normal);
    pointer.move(centreInWindow(button));
    EXPECT_EQ(painted(), highlighted);
    pointer.release(centreInWindow(button));
    EXPECT_EQ(painted(), normal);
    EXPECT_EQ(target.calls, 1);

    // A press that ends outside is no tap.
    pointer.press(centreInWindow(button));
    pointer.move(outsideInWindow(button));
    pointer.release(outsideInWindow(button));
    EXPECT_EQ(painted(), normal);
    EXPECT_EQ(target.calls, 1);
    EXPECT_EQ(surface.releases, 0);
}

TEST_F(FlatButtonTest, TapCallsTheActionOnceWithTheButtonOnTheLastTargetSet)
{
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 1);
    EXPECT_EQ(target.lastSender, static_cast<QObject *>(button));
    EXPECT_EQ(surface.presses, 0);
    EXPECT_EQ(surface.releases, 0);

    ActionTarget second;
    button->setTargetAction(&second, "playAction");
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 1);
    EXPECT_EQ(second.calls, 1);
}

TEST_F(FlatButtonTest, TapDoesNothingWhenTheTargetIsGoneOrLacksTheAction)
{
    auto transient = std::make_unique<ActionTarget>();
    button->setTargetAction(transient.get(), "playAction");
    transient.reset();
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(button->target(), nullptr);

    button->setTargetAction(&target, "pauseAction");
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 0);
}

} // namespace
} // namespace zaf::test
