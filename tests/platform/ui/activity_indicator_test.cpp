#include "platform/ui/activity_indicator.h"

#include <QColor>
#include <QImage>
#include <QEventLoop>
#include <QTimer>
#include <QWidget>
#include <gtest/gtest.h>

using zaf::ui::ActivityIndicator;

namespace {

// Runs the event loop for `ms` milliseconds, so timers and animations advance.
void waitMs(int ms)
{
    QEventLoop loop;
    QTimer::singleShot(ms, &loop, &QEventLoop::quit);
    loop.exec();
}

int opaquePixels(const QImage &image)
{
    int count = 0;
    for (int y = 0; y < image.height(); ++y)
        for (int x = 0; x < image.width(); ++x)
            if (qAlpha(image.pixel(x, y)) > 0)
                ++count;
    return count;
}

} // namespace

TEST(ActivityIndicatorTest, LargeWhiteStyleIs37PointsWithWhiteArcs)
{
    ActivityIndicator indicator(ActivityIndicator::LargeWhite);
    EXPECT_EQ(indicator.style(), 0);
    EXPECT_EQ(indicator.size(), QSize(37, 37));
    EXPECT_EQ(indicator.sizeHint(), QSize(37, 37));
    EXPECT_EQ(ActivityIndicator::colorForStyle(0), QColor(Qt::white));
    EXPECT_EQ(ActivityIndicator::sizeForStyle(ActivityIndicator::Gray), QSize(20, 20));
}

TEST(ActivityIndicatorTest, UnknownStyleFallsBackToLargeWhite)
{
    ActivityIndicator indicator(42);
    EXPECT_EQ(indicator.style(), ActivityIndicator::LargeWhite);
    EXPECT_EQ(indicator.size(), QSize(37, 37));
}

TEST(ActivityIndicatorTest, SetCenterPlacesTheIndicatorAroundThePoint)
{
    QWidget parent;
    parent.resize(300, 200);
    auto *indicator = new ActivityIndicator(ActivityIndicator::LargeWhite, &parent);
    indicator->setCenter(QPointF(150, 100));
    EXPECT_EQ(indicator->size(), QSize(37, 37));
    EXPECT_NEAR(indicator->center().x(), 150.0, 0.5);
    EXPECT_NEAR(indicator->center().y(), 100.0, 0.5);

    auto *small = new ActivityIndicator(ActivityIndicator::White, &parent);
    small->setCenter(QPointF(40, 30));
    EXPECT_EQ(small->geometry(), QRect(30, 20, 20, 20));
}

TEST(ActivityIndicatorTest, StartAndStopAnimating)
{
    ActivityIndicator indicator;
    EXPECT_FALSE(indicator.isAnimating());
    indicator.startAnimating();
    EXPECT_TRUE(indicator.isAnimating());
    indicator.stopAnimating();
    EXPECT_FALSE(indicator.isAnimating());
}

TEST(ActivityIndicatorTest, RotationTimerRunsOnlyWhileVisibleAndAnimating)
{
    QWidget parent;
    parent.resize(100, 100);
    auto *indicator = new ActivityIndicator(ActivityIndicator::LargeWhite, &parent);
    indicator->startAnimating();
    // Not on screen yet: nothing turns.
    EXPECT_FALSE(indicator->isRotationTimerActive());

    parent.show();
    ASSERT_TRUE(indicator->isVisible());
    EXPECT_TRUE(indicator->isRotationTimerActive());
    const double before = indicator->rotation();
    waitMs(120);
    EXPECT_NE(indicator->rotation(), before);

    indicator->hide();
    EXPECT_FALSE(indicator->isRotationTimerActive());
    const double hiddenAt = indicator->rotation();
    waitMs(60);
    EXPECT_EQ(indicator->rotation(), hiddenAt);

    indicator->show();
    EXPECT_TRUE(indicator->isRotationTimerActive());
    indicator->stopAnimating();
    EXPECT_FALSE(indicator->isRotationTimerActive());
}

TEST(ActivityIndicatorTest, DrawsArcsOnlyWhileAnimating)
{
    ActivityIndicator indicator;
    QImage stopped(indicator.size(), QImage::Format_ARGB32_Premultiplied);
    stopped.fill(Qt::transparent);
    indicator.render(&stopped, QPoint(), QRegion(), QWidget::DrawChildren);
    EXPECT_EQ(opaquePixels(stopped), 0);

    indicator.startAnimating();
    QImage running(indicator.size(), QImage::Format_ARGB32_Premultiplied);
    running.fill(Qt::transparent);
    indicator.render(&running, QPoint(), QRegion(), QWidget::DrawChildren);
    EXPECT_GT(opaquePixels(running), 50);
    // The centre of the ring stays clear.
    EXPECT_EQ(qAlpha(running.pixel(18, 18)), 0);
    // The arcs are white.
    bool sawWhite = false;
    for (int y = 0; y < running.height() && !sawWhite; ++y)
        for (int x = 0; x < running.width(); ++x) {
            const QRgb p = running.pixel(x, y);
            if (qAlpha(p) == 255 && qRed(p) == 255 && qGreen(p) == 255 && qBlue(p) == 255) {
                sawWhite = true;
                break;
            }
        }
    EXPECT_TRUE(sawWhite);
}

TEST(ActivityIndicatorTest, DrawsAtHighDevicePixelRatio)
{
    ActivityIndicator indicator;
    indicator.startAnimating();
    QImage image(indicator.size() * 2, QImage::Format_ARGB32_Premultiplied);
    image.setDevicePixelRatio(2.0);
    image.fill(Qt::transparent);
    indicator.render(&image, QPoint(), QRegion(), QWidget::DrawChildren);
    // Every device pixel of the 74x74 picture is available to the ring, not just a quarter.
    int right = 0, bottom = 0;
    for (int y = 0; y < image.height(); ++y)
        for (int x = 0; x < image.width(); ++x)
            if (qAlpha(image.pixel(x, y)) > 0) {
                right = std::max(right, x);
                bottom = std::max(bottom, y);
            }
    EXPECT_GT(right, 60);
    EXPECT_GT(bottom, 60);
}
