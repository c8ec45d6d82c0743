// BackdropView: a blurred, tinted copy of what lies behind it, shaped by its mask views.
#include "platform/ui/backdrop_view.h"

#include <QApplication>
#include <QtCore/qtestsupport_core.h>
#include <gtest/gtest.h>

namespace zaf::ui {
namespace {

void recolour(QWidget *widget, const QColor &colour)
{
    QPalette palette = widget->palette();
    palette.setColor(QPalette::Window, colour);
    widget->setPalette(palette);
}

QWidget *solid(QWidget *parent, const QRect &frame, const QColor &colour)
{
    auto *widget = new QWidget(parent);
    widget->setGeometry(frame);
    widget->setAutoFillBackground(true);
    recolour(widget, colour);
    widget->show();
    return widget;
}

// The average colour of a column band of an image (x from `from` to `to` as fractions of the width).
QColor average(const QImage &source, double from, double to)
{
    const QImage image = source.convertToFormat(QImage::Format_ARGB32);
    long r = 0, g = 0, b = 0, a = 0, n = 0;
    for (int y = 0; y < image.height(); ++y) {
        for (int x = int(from * image.width()); x < int(to * image.width()); ++x) {
            const QRgb p = image.pixel(x, y);
            r += qRed(p), g += qGreen(p), b += qBlue(p), a += qAlpha(p), ++n;
        }
    }
    return n ? QColor(int(r / n), int(g / n), int(b / n), int(a / n)) : QColor();
}

struct BackdropFixture : ::testing::Test {
    QWidget window;
    QWidget *left = solid(&window, QRect(0, 0, 150, 200), QColor(230, 0, 0));
    QWidget *right = solid(&window, QRect(150, 0, 150, 200), QColor(0, 0, 230));
    BackdropView *backdrop = new BackdropView(2010, &window);

    void SetUp() override
    {
        window.resize(300, 200);
        backdrop->setGeometry(0, 100, 300, 38);
        window.show();
        QApplication::processEvents();
    }
};

TEST_F(BackdropFixture, RendersABlurredCopyOfWhatLiesBehindOnRefreshAndOnItsOwnWhileShown)
{
    backdrop->refresh();
    QImage picture = backdrop->lastRenderedBackground();
    ASSERT_FALSE(picture.isNull());
    EXPECT_LT(picture.width(), 300);   // rendered at reduced size
    const QColor leftPart = average(picture, 0.05, 0.3);
    const QColor rightPart = average(picture, 0.7, 0.95);
    EXPECT_GT(leftPart.red(), 180);
    EXPECT_LT(leftPart.blue(), 40);
    EXPECT_GT(rightPart.blue(), 180);
    EXPECT_LT(rightPart.red(), 40);
    // Blurred: across the sharp edge the colours blend.
    const QColor seam = average(picture, 0.49, 0.51);
    EXPECT_GT(seam.red(), 50);
    EXPECT_GT(seam.blue(), 50);

    recolour(left, QColor(0, 200, 0));
    backdrop->refresh();
    EXPECT_GT(average(backdrop->lastRenderedBackground(), 0.05, 0.3).green(), 150);
    EXPECT_LT(average(backdrop->lastRenderedBackground(), 0.05, 0.3).red(), 40);

    // Without a refresh call, the refresh timer (about 15 times a second) picks up a change.
    recolour(right, QColor(0, 220, 0));
    for (int i = 0; i < 50 && average(backdrop->lastRenderedBackground(), 0.7, 0.95).green() < 150; ++i)
        QTest::qWait(20);
    EXPECT_GT(average(backdrop->lastRenderedBackground(), 0.7, 0.95).green(), 150);
}

TEST_F(BackdropFixture, LeavesOutItsChildrenAndWhatIsStackedAbove)
{
    solid(backdrop, QRect(0, 0, 300, 38), Qt::black);              // its own content
    solid(&window, QRect(150, 80, 150, 80), QColor(240, 240, 0));   // in front of it
    backdrop->refresh();
    const QImage picture = backdrop->lastRenderedBackground();
    EXPECT_GT(average(picture, 0.05, 0.3).red(), 180);
    const QColor rightPart = average(picture, 0.7, 0.95);
    EXPECT_GT(rightPart.blue(), 180);
    EXPECT_LT(rightPart.green(), 40);
}

TEST_F(BackdropFixture, TintsLightAndMasksShapeWhereItShows)
{
    backdrop->refresh();
    const QImage plain = backdrop->grab().toImage();
    // The light tint: the blue half shows lighter than the blue behind it, and fully opaque.
    const QColor tinted = average(plain, 0.7, 0.95);
    EXPECT_GT(tinted.red(), 60);
    EXPECT_GT(tinted.blue(), 180);
    EXPECT_EQ(tinted.alpha(), 255);

    // A background mask over the left half cuts the backdrop away there; the rest still shows,
    // tinted. A glyph on the right cuts the tint: the blue shows untinted there.
    QWidget *shape = solid(backdrop, QRect(0, 0, 150, 38), Qt::white);
    BackdropView::setBackdropMaskFlags(shape, 1 | 2 | 4);
    backdrop->addMaskView(shape);
    QWidget *glyph = solid(backdrop, QRect(225, 0, 75, 38), Qt::white);
    BackdropView::setBackdropMaskFlags(glyph, 1 | 2);
    backdrop->addMaskView(glyph);

    const QImage shaped = backdrop->grab().toImage();
    EXPECT_EQ(average(shaped, 0.05, 0.4).alpha(), 0);
    const QColor middle = average(shaped, 0.55, 0.7);
    EXPECT_EQ(middle.alpha(), 255);   // the mask views themselves (white) are not drawn
    EXPECT_GT(middle.red(), 60);
    EXPECT_LT(average(shaped, 0.8, 0.95).red(), 30);

    // Without the background mask the glyph area shows the blue untinted, the rest tinted.
    BackdropView::setBackdropMaskFlags(shape, 0);
    const QImage cut = backdrop->grab().toImage();
    EXPECT_LT(average(cut, 0.8, 0.95).red(), 30);
    EXPECT_GT(average(cut, 0.55, 0.7).red(), 60);
}

} // namespace
} // namespace zaf::ui
