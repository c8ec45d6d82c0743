// The flat overlay button's two shared images: rendered once, shown by every button, composited from the masks.
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

using Flat = ZafFlatVideoOverlayButton;

// Placed first in the file so that, in a whole-program run, it is the first use of the images.
TEST(FlatButtonSharedImages, RacingFirstCallsRenderEachImageOnceAndReturnTheSameObject)
{
    constexpr int kThreads = 4;
    std::vector<const QImage *> normals(kThreads), highlighteds(kThreads);
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i)
        threads.emplace_back([&, i] { normals[i] = &Flat::_normalButtonImage(), highlighteds[i] = &Flat::_highlightedButtonImage(); });
    for (std::thread &t : threads)
        t.join();
    for (int i = 0; i < kThreads; ++i) {
        EXPECT_EQ(normals[i], &Flat::_normalButtonImage());
        EXPECT_EQ(highlighteds[i], &Flat::_highlightedButtonImage());
    }
    EXPECT_EQ(Flat::sharedImageRenderCount(), 2);
}

TEST(FlatButtonSharedImages, EveryButtonShowsTheVerySameImages)
{
    const QImage &normal = Flat::_normalButtonImage();
    const QImage &highlighted = Flat::_highlightedButtonImage();
    EXPECT_NE(normal.cacheKey(), highlighted.cacheKey());
    std::vector<std::unique_ptr<Flat>> buttons;
    for (const int style : {0, 2, 1, 5})
        buttons.push_back(std::make_unique<Flat>(style));
    for (const auto &button : buttons) {
        EXPECT_EQ(button->normalImage().constBits(), normal.constBits());
        EXPECT_EQ(button->highlightedImage().constBits(), highlighted.constBits());
    }
    EXPECT_EQ(Flat::sharedImageRenderCount(), 2); // however many buttons exist
}

// The compositing rules, checked on every pixel against the two masks at the same pixel: outside
// both masks the gray fill, inside the background mask a hole, inside the glyph the white glyph at
// its alpha. Where a mask is partly transparent (anti-aliased edges) no rule is checked. The image has
// the mask's size at the screen's scale.
struct Composite {
    const char *name;
    double white, backgroundAlpha, glyphAlpha;
    const QImage &(*shared)(); // the shared image for these values, or null to render a new one
};
void PrintTo(const Composite &c, std::ostream *os) { *os << c.name; }

class FlatButtonComposite : public ::testing::TestWithParam<Composite> {};

TEST_P(FlatButtonComposite, PixelsFollowTheFillCutOutAndGlyphRules)
{
    const Composite &c = GetParam();
    const QImage background = backgroundMask();
    const QImage glyph = glyphMask();
    ASSERT_EQ(glyph.size(), background.size());
    const QImage rendered = c.shared ? c.shared() : Flat::_createOverlayImageWithBackgroundWhiteBackgroundAlphaGlyphAlpha(c.white, c.backgroundAlpha, c.glyphAlpha);
    ASSERT_EQ(rendered.size(), background.size());
    EXPECT_EQ(rendered.devicePixelRatio(), ui::Screen::mainScreenScale());
    EXPECT_TRUE(rendered.hasAlphaChannel());
    const int fillAlpha = qRound(c.backgroundAlpha * 255);
    const int fillGray = qRound(c.white * 255);
    const int glyphAlpha = qRound(c.glyphAlpha * 255);
    int filled = 0, cutOut = 0, glyphPixels = 0, wrong = 0;
    for (int y = 0; y < rendered.height(); ++y) {
        for (int x = 0; x < rendered.width(); ++x) {
            const int b = qAlpha(background.pixel(x, y));
            const int g = qAlpha(glyph.pixel(x, y));
            const QColor p = rendered.pixelColor(x, y);
            if (b == 0 && g == 0) { // the gray fill
                ++filled;
                wrong += std::abs(p.alpha() - fillAlpha) > 2
                    || (fillAlpha > 0 && (std::abs(p.red() - fillGray) > 2 || p.red() != p.green() || p.red() != p.blue()));
            } else if (b == 255 && g == 0) { // the hole
                ++cutOut;
                wrong += p.alpha() != 0;
            } else if (g == 255) { // the white glyph
                ++glyphPixels;
                wrong += std::abs(p.alpha() - glyphAlpha) > 2 || (glyphAlpha > 20 && p.red() < 250);
            }
        }
    }
    EXPECT_EQ(wrong, 0);
    // Each rule was checked on a real area.
    EXPECT_GT(filled, 100);
    EXPECT_GT(cutOut, 100);
    EXPECT_GT(glyphPixels, 100);
}

INSTANTIATE_TEST_SUITE_P(
    Images, FlatButtonComposite,
    ::testing::Values(Composite{"Normal", ZafVideoOverlayFlatBackgroundWhite, ZafVideoOverlayFlatBackgroundAlpha, ZafVideoOverlayDefaultGlyphAlpha,
                                &Flat::_normalButtonImage},
                      Composite{"Highlighted", ZafVideoOverlayFlatBackgroundWhite, ZafVideoOverlayFlatBackgroundAlpha,
                                ZafVideoOverlayHighlightedGlyphAlpha, &Flat::_highlightedButtonImage},
                      Composite{"OpaqueBlackFillOpaqueGlyph", 0.0, 1.0, 1.0, nullptr},
                      Composite{"HalfWhiteFillInvisibleGlyph", 1.0, 0.5, 0.0, nullptr}, Composite{"NoFill", 0.5, 0.0, 0.5, nullptr}),
    [](const auto &info) { return std::string(info.param.name); });

} // namespace
} // namespace zaf::test
