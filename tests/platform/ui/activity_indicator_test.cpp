// ActivityIndicator: size per style, placing by centre, the rotation timer, the ring drawn while animating.
#include "platform/ui/activity_indicator.h"

#include <QColor>
#include <QImage>
#include <QtCore/qtestsupport_core.h>
#include <gtest/gtest.h>

#include <algorithm>

namespace zaf::ui {
namespace {

// What the indicator draws at `ratio`, and the extent of its non-transparent device pixels.
struct Drawing {
    QImage image;
    int inked = 0, right = 0, bottom = 0;
    bool sawWhite = false;
};

Drawing draw(ActivityIndicator &indicator, qreal ratio = 1.0)
{
    Drawing d{QImage(indicator.size() * ratio, QImage::Format_ARGB32_Premultiplied)};
    d.image.setDevicePixelRatio(ratio);
    d.image.fill(Qt::transparent);
    indicator.render(&d.image, QPoint(), QRegion(), QWidget::DrawChildren);
    for (int y = 0; y < d.image.height(); ++y) {
        for (int x = 0; x < d.image.width(); ++x) {
            const QRgb p = d.image.pixel(x, y);
            if (qAlpha(p) > 0)
                ++d.inked, d.right = std::max(d.right, x), d.bottom = std::max(d.bottom, y);
            d.sawWhite = d.sawWhite || p == qRgba(255, 255, 255, 255);
        }
    }
    return d;
}

TEST(ActivityIndicatorTest, StyleGivesTheSizeAndSetCenterPlacesItAroundThePoint)
{
    QWidget parent;
    auto *large = new ActivityIndicator(ActivityIndicator::LargeWhite, &parent);
    large->setCenter(QPointF(150, 100));
    EXPECT_EQ(large->size(), QSize(37, 37));
    EXPECT_NEAR(large->center().x(), 150.0, 0.5);
    EXPECT_NEAR(large->center().y(), 100.0, 0.5);
    auto *small = new ActivityIndicator(ActivityIndicator::White, &parent);
    small->setCenter(QPointF(40, 30));
    EXPECT_EQ(small->geometry(), QRect(30, 20, 20, 20));

    ActivityIndicator unknown(42);   // falls back to the large white style
    EXPECT_EQ(unknown.style(), ActivityIndicator::LargeWhite);
    EXPECT_EQ(unknown.size(), QSize(37, 37));
}

TEST(ActivityIndicatorTest, RotationTimerRunsOnlyWhileVisibleAndAnimating)
{
    QWidget parent;
    auto *indicator = new ActivityIndicator(ActivityIndicator::LargeWhite, &parent);
    EXPECT_FALSE(indicator->isAnimating());
    indicator->startAnimating();
    EXPECT_TRUE(indicator->isAnimating());
    EXPECT_FALSE(indicator->isRotationTimerActive());   // not on screen yet: nothing turns

    parent.show();
    EXPECT_TRUE(indicator->isRotationTimerActive());
    const double before = indicator->rotation();
    QTest::qWait(120);
    EXPECT_NE(indicator->rotation(), before);

    indicator->hide();
    EXPECT_FALSE(indicator->isRotationTimerActive());
    const double hiddenAt = indicator->rotation();
    QTest::qWait(60);
    EXPECT_EQ(indicator->rotation(), hiddenAt);

    indicator->show();
    EXPECT_TRUE(indicator->isRotationTimerActive());
    indicator->stopAnimating();
    EXPECT_FALSE(indicator->isAnimating());
    EXPECT_FALSE(indicator->isRotationTimerActive());
}

TEST(ActivityIndicatorTest, DrawsAWhiteRingOnlyWhileAnimatingOverTheWholeAreaAtAnyPixelRatio)
{
    ActivityIndicator indicator;
    EXPECT_EQ(draw(indicator).inked, 0);
    indicator.startAnimating();
    const Drawing running = draw(indicator);
    EXPECT_GT(running.inked, 50);
    EXPECT_EQ(qAlpha(running.image.pixel(18, 18)), 0);   // the centre of the ring stays clear
    EXPECT_TRUE(running.sawWhite);
    // At ratio 2 every device pixel of the 74x74 picture is available to the ring, not a quarter.
    const Drawing sharp = draw(indicator, 2.0);
    EXPECT_GT(sharp.right, 60);
    EXPECT_GT(sharp.bottom, 60);
}

} // namespace
} // namespace zaf::ui
