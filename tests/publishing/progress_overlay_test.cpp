#include "publishing/progress_overlay.h"

#include "platform/ui/activity_indicator.h"
#include "platform/ui/view_animation.h"

#include <QElapsedTimer>
#include <QLabel>
#include <QProgressBar>
#include <QEventLoop>
#include <QTimer>
#include <QWidget>
#include <gtest/gtest.h>

#include <memory>

using zaf::ui::ActivityIndicator;

namespace {

// Runs the event loop for `ms` milliseconds, so timers and animations advance.
void waitMs(int ms)
{
    QEventLoop loop;
    QTimer::singleShot(ms, &loop, &QEventLoop::quit);
    loop.exec();
}

class ProgressOverlayTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_host = std::make_unique<QWidget>();
        m_host->resize(320, 480);
        m_overlay = new ZafYouTubeActivityProgressOverlay(m_host->rect(), m_host.get());
        zaf::ui::addSubview(m_host.get(), m_overlay);
        m_host->show();
    }

    int dimmingLayers() const
    {
        int count = 0;
        for (QWidget *child : m_overlay->findChildren<QWidget *>(Qt::FindDirectChildrenOnly))
            if (child->objectName() == QLatin1String("progressOverlayDimming"))
                ++count;
        return count;
    }

    int indicators() const
    {
        return int(m_overlay->findChildren<ActivityIndicator *>(Qt::FindDirectChildrenOnly).size());
    }

    // Past the 0.2 s fade, with room for a loaded machine.
    static void waitPastFade() { waitMs(300); }

    std::unique_ptr<QWidget> m_host;
    ZafYouTubeActivityProgressOverlay *m_overlay = nullptr;
};

} // namespace

TEST_F(ProgressOverlayTest, StartsHiddenWithoutIndicator)
{
    EXPECT_FALSE(m_overlay->isShowing());
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    EXPECT_EQ(m_overlay->dimmingView(), nullptr);
    EXPECT_EQ(m_overlay->geometry(), m_host->rect());
}

TEST_F(ProgressOverlayTest, SetupDimsWithHalfBlackAndFadesIn)
{
    m_overlay->setShowingAnimated(true, true);
    EXPECT_TRUE(m_overlay->isShowing());
    QWidget *dimming = m_overlay->dimmingView();
    ASSERT_NE(dimming, nullptr);
    EXPECT_EQ(dimming->geometry(), QRect(0, 0, 320, 480));
    EXPECT_TRUE(dimming->autoFillBackground());
    const QColor colour = dimming->palette().color(QPalette::Window);
    EXPECT_EQ(colour.red(), 0);
    EXPECT_EQ(colour.green(), 0);
    EXPECT_EQ(colour.blue(), 0);
    EXPECT_NEAR(colour.alphaF(), 0.5, 0.01);
    // The target alpha is 1; what is shown starts at 0.
    EXPECT_DOUBLE_EQ(zaf::ui::alpha(m_overlay), 1.0);
    EXPECT_LT(zaf::ui::presentationAlpha(m_overlay), 0.5);
    waitPastFade();
    EXPECT_DOUBLE_EQ(zaf::ui::presentationAlpha(m_overlay), 1.0);
}

TEST_F(ProgressOverlayTest, ShowingTwiceMakesOneDimmingLayerAndOneIndicator)
{
    m_overlay->setShowingAnimated(true, true);
    m_overlay->setShowingAnimated(true, true);
    EXPECT_EQ(dimmingLayers(), 1);
    waitPastFade();
    m_overlay->setShowingAnimated(true, false);
    waitPastFade();
    EXPECT_EQ(dimmingLayers(), 1);
    EXPECT_EQ(indicators(), 1);
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
}

TEST_F(ProgressOverlayTest, IndicatorAppearsWhenFadeInEnds)
{
    m_overlay->setShowingAnimated(true, true);
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    waitPastFade();
    ActivityIndicator *indicator = m_overlay->activityIndicator();
    ASSERT_NE(indicator, nullptr);
    EXPECT_EQ(indicator->style(), ActivityIndicator::LargeWhite);
    EXPECT_TRUE(indicator->isAnimating());
    EXPECT_EQ(zaf::ui::superview(indicator), m_overlay);
    EXPECT_TRUE(indicator->isVisible());
    // Above the dimming layer.
    const QObjectList &children = m_overlay->children();
    EXPECT_GT(children.indexOf(indicator), children.indexOf(m_overlay->dimmingView()));
}

TEST_F(ProgressOverlayTest, NotAnimatedStillTakesTheWholeFade)
{
    QElapsedTimer clock;
    clock.start();
    m_overlay->setShowingAnimated(true, false);
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    waitMs(100);
    if (clock.elapsed() < 180) {
        EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    }
    waitMs(150);
    EXPECT_NE(m_overlay->activityIndicator(), nullptr);
}

TEST_F(ProgressOverlayTest, StopActivityDuringFadeInDoesNothing)
{
    m_overlay->setShowingAnimated(true, true);
    m_overlay->stopActivity();
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    waitPastFade();
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
    EXPECT_EQ(zaf::ui::superview(m_overlay->activityIndicator()), m_overlay);
    EXPECT_TRUE(m_overlay->activityIndicator()->isVisible());
}

TEST_F(ProgressOverlayTest, StopActivityRemovesOnlyTheIndicator)
{
    m_overlay->setShowingAnimated(true, true);
    m_overlay->setProgress(0.3);
    waitPastFade();
    ActivityIndicator *indicator = m_overlay->activityIndicator();
    ASSERT_NE(indicator, nullptr);
    m_overlay->stopActivity();
    // The property keeps the indicator; it is just off the screen.
    EXPECT_EQ(m_overlay->activityIndicator(), indicator);
    EXPECT_EQ(zaf::ui::superview(indicator), nullptr);
    EXPECT_FALSE(indicator->isVisible());
    EXPECT_FALSE(indicator->isRotationTimerActive());
    // Dimming and progress stay, and so does the overlay.
    EXPECT_TRUE(m_overlay->dimmingView()->isVisible());
    ASSERT_NE(m_overlay->progressLabel(), nullptr);
    EXPECT_TRUE(m_overlay->progressLabel()->isVisible());
    EXPECT_TRUE(m_overlay->progressBar()->isVisible());
    EXPECT_EQ(zaf::ui::superview(m_overlay), m_host.get());
    EXPECT_TRUE(m_overlay->isShowing());
}

TEST_F(ProgressOverlayTest, IndicatorIsCentred)
{
    m_overlay->setShowingAnimated(true, true);
    waitPastFade();
    ActivityIndicator *indicator = m_overlay->activityIndicator();
    ASSERT_NE(indicator, nullptr);
    EXPECT_EQ(indicator->size(), QSize(37, 37));
    EXPECT_NEAR(indicator->center().x(), 160.0, 0.5);
    EXPECT_NEAR(indicator->center().y(), 240.0, 0.5);
    // The progress display lies under it, on the same vertical line.
    QProgressBar *bar = m_overlay->progressBar();
    ASSERT_NE(bar, nullptr);
    EXPECT_GT(bar->geometry().top(), indicator->geometry().bottom());
    EXPECT_NEAR(bar->geometry().center().x(), 160.0, 1.0);
    EXPECT_GT(m_overlay->progressLabel()->geometry().top(), bar->geometry().bottom());
}

TEST_F(ProgressOverlayTest, CentreIsTakenOnceAtSetUp)
{
    m_overlay->setShowingAnimated(true, true);
    m_overlay->resize(600, 600);
    waitPastFade();
    // The fade-in completion reads the bounds as they are when it runs.
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
    EXPECT_NEAR(m_overlay->activityIndicator()->center().x(), 300.0, 0.5);
    // The dimming keeps the bounds of the set-up.
    EXPECT_EQ(m_overlay->dimmingView()->size(), QSize(320, 480));
    m_overlay->resize(100, 100);
    EXPECT_NEAR(m_overlay->activityIndicator()->center().x(), 300.0, 0.5);
}

TEST_F(ProgressOverlayTest, TearDownRemovesOverlayFromParentAfterFade)
{
    m_overlay->setShowingAnimated(true, true);
    waitPastFade();
    ActivityIndicator *indicator = m_overlay->activityIndicator();
    ASSERT_NE(indicator, nullptr);

    m_overlay->setShowingAnimated(false, false);
    EXPECT_FALSE(m_overlay->isShowing());
    // The indicator goes at once; the overlay stays until its fade-out ends.
    EXPECT_EQ(zaf::ui::superview(indicator), nullptr);
    EXPECT_EQ(m_overlay->activityIndicator(), indicator);
    EXPECT_EQ(zaf::ui::superview(m_overlay), m_host.get());
    EXPECT_DOUBLE_EQ(zaf::ui::alpha(m_overlay), 0.0);
    waitPastFade();
    EXPECT_EQ(zaf::ui::superview(m_overlay), nullptr);
    EXPECT_FALSE(m_overlay->isVisible());
}

TEST_F(ProgressOverlayTest, TearDownDuringFadeInLeavesNoIndicatorOnScreen)
{
    m_overlay->setShowingAnimated(true, true);
    waitMs(50);
    m_overlay->setShowingAnimated(false, true);
    // The cut-short fade-in still made its indicator, but hiding keeps it off the screen.
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
    EXPECT_EQ(zaf::ui::superview(m_overlay->activityIndicator()), nullptr);
    EXPECT_EQ(zaf::ui::superview(m_overlay), m_host.get());
    waitPastFade();
    EXPECT_EQ(zaf::ui::superview(m_overlay), nullptr);
    EXPECT_EQ(indicators(), 1);
}

TEST_F(ProgressOverlayTest, ProgressTextFollowsSetProgress)
{
    m_overlay->setProgress(0.25);   // before the display exists: kept
    EXPECT_EQ(m_overlay->progressLabel(), nullptr);
    m_overlay->setShowingAnimated(true, true);
    waitPastFade();
    QLabel *label = m_overlay->progressLabel();
    QProgressBar *bar = m_overlay->progressBar();
    ASSERT_NE(label, nullptr);
    ASSERT_NE(bar, nullptr);
    EXPECT_EQ(label->text(), QStringLiteral("25 %"));
    EXPECT_EQ(bar->maximum(), 1000);
    EXPECT_EQ(bar->value(), 250);

    m_overlay->setProgress(0.5);
    EXPECT_EQ(label->text(), QStringLiteral("50 %"));
    EXPECT_EQ(bar->value(), 500);

    m_overlay->setProgress(1.7);
    EXPECT_EQ(label->text(), QStringLiteral("100 %"));
    EXPECT_DOUBLE_EQ(m_overlay->progress(), 1.0);

    m_overlay->setProgress(-1.0);
    EXPECT_TRUE(label->text().isEmpty());
    EXPECT_EQ(bar->maximum(), 0);   // busy bar for an unknown total
}

TEST(ProgressOverlayTextTest, PercentagesRoundDown)
{
    EXPECT_EQ(ZafYouTubeActivityProgressOverlay::progressText(0.0), QStringLiteral("0 %"));
    EXPECT_EQ(ZafYouTubeActivityProgressOverlay::progressText(0.999), QStringLiteral("99 %"));
    EXPECT_EQ(ZafYouTubeActivityProgressOverlay::progressText(0.29), QStringLiteral("29 %"));
    EXPECT_EQ(ZafYouTubeActivityProgressOverlay::progressText(1.0), QStringLiteral("100 %"));
    EXPECT_TRUE(ZafYouTubeActivityProgressOverlay::progressText(-0.5).isEmpty());
}
