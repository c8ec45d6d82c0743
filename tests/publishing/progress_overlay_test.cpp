// The progress overlay over the publishing form.
#include "publishing/progress_overlay.h"

#include "platform/ui/activity_indicator.h"
#include "platform/ui/view_animation.h"

#include <QAbstractButton>
#include <QEventLoop>
#include <QLabel>
#include <QLocale>
#include <QProgressBar>
#include <QScopeGuard>
#include <QTimer>
#include <QWidget>

#include <gtest/gtest.h>

#include <memory>

using zaf::ui::ActivityIndicator;
using zaf::ui::superview;

namespace {

// Runs the event loop for `ms` milliseconds (by default past the 0.2 s fade, with room for a loaded
// machine), so timers and animations advance.
void waitMs(int ms = 300)
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
            count += child->objectName() == QLatin1String("progressOverlayDimming") ? 1 : 0;
        return count;
    }
    int indicators() const { return int(m_overlay->findChildren<ActivityIndicator *>(Qt::FindDirectChildrenOnly).size()); }

    std::unique_ptr<QWidget> m_host;
    ZafYouTubeActivityProgressOverlay *m_overlay = nullptr;
};

} // namespace

// Showing twice sets up one half-black dimming layer over the frame and fades in from 0; when the
// fade ends one spinning indicator sits centred above it, the progress bar under it.
TEST_F(ProgressOverlayTest, ShowingTwiceBuildsTheOverlayOnce)
{
    m_overlay->setShowingAnimated(true, true);
    m_overlay->setShowingAnimated(true, true);
    EXPECT_TRUE(m_overlay->isShowing());
    ASSERT_NE(m_overlay->dimmingView(), nullptr);
    EXPECT_EQ(dimmingLayers(), 1);
    EXPECT_EQ(m_overlay->dimmingView()->geometry(), QRect(0, 0, 320, 480));
    EXPECT_EQ(m_overlay->dimmingView()->palette().color(QPalette::Window).rgb(), qRgb(0, 0, 0));
    EXPECT_NEAR(m_overlay->dimmingView()->palette().color(QPalette::Window).alphaF(), 0.5, 0.01);
    EXPECT_DOUBLE_EQ(zaf::ui::alpha(m_overlay), 1.0);
    EXPECT_LT(zaf::ui::presentationAlpha(m_overlay), 0.5);
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);

    waitMs();
    EXPECT_DOUBLE_EQ(zaf::ui::presentationAlpha(m_overlay), 1.0);
    m_overlay->setShowingAnimated(true, false);
    waitMs();
    EXPECT_EQ(dimmingLayers(), 1);
    EXPECT_EQ(indicators(), 1);
    ActivityIndicator *indicator = m_overlay->activityIndicator();
    ASSERT_NE(indicator, nullptr);
    EXPECT_TRUE(indicator->isAnimating());
    EXPECT_TRUE(indicator->isVisible());
    EXPECT_GT(m_overlay->children().indexOf(indicator), m_overlay->children().indexOf(m_overlay->dimmingView()));
    EXPECT_NEAR(indicator->center().x(), 160.0, 0.5);
    EXPECT_NEAR(indicator->center().y(), 240.0, 0.5);
    ASSERT_NE(m_overlay->progressBar(), nullptr);
    EXPECT_GT(m_overlay->progressBar()->geometry().top(), indicator->geometry().bottom());
}

// The fade-in still brings the indicator on screen.
TEST_F(ProgressOverlayTest, StopActivityDuringFadeInDoesNothing)
{
    m_overlay->setShowingAnimated(true, true);
    m_overlay->stopActivity();
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    waitMs();
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
    EXPECT_EQ(superview(m_overlay->activityIndicator()), m_overlay);
    EXPECT_TRUE(m_overlay->activityIndicator()->isVisible());
}

// From set-up on, on top of it.
TEST_F(ProgressOverlayTest, ItsOwnCancelAsksForCancelling)
{
    m_overlay->setShowingAnimated(true, true);
    QAbstractButton *cancel = m_overlay->cancelButton();
    ASSERT_NE(cancel, nullptr);
    EXPECT_TRUE(cancel->isVisible()) << "reachable during the fade-in";
    waitMs();
    EXPECT_EQ(m_overlay->childAt(cancel->geometry().center()), cancel);
    int cancels = 0;
    QObject::connect(m_overlay, &ZafYouTubeActivityProgressOverlay::cancelRequested, [&cancels] { ++cancels; });
    cancel->click();
    EXPECT_EQ(cancels, 1);
}

// The indicator and the Cancel go off the screen; the dimming, the progress and the overlay stay.
TEST_F(ProgressOverlayTest, StopActivityLeavesTheDimmingWithTheProgress)
{
    m_overlay->setShowingAnimated(true, true);
    waitMs();
    ActivityIndicator *indicator = m_overlay->activityIndicator();
    ASSERT_NE(indicator, nullptr);
    m_overlay->stopActivity();
    EXPECT_EQ(m_overlay->activityIndicator(), indicator);
    EXPECT_EQ(superview(indicator), nullptr);
    EXPECT_FALSE(indicator->isRotationTimerActive());
    EXPECT_TRUE(m_overlay->dimmingView()->isVisible());
    EXPECT_TRUE(m_overlay->progressBar()->isVisible());
    EXPECT_TRUE(m_overlay->isShowing());
    EXPECT_FALSE(m_overlay->cancelButton()->isVisible());
}

// Not animated, the fade still runs: the indicator is placed by the bounds at its end and stays
// there; the dimming keeps the bounds of the set-up.
TEST_F(ProgressOverlayTest, IndicatorIsPlacedOnceWhenTheFadeInEnds)
{
    m_overlay->setShowingAnimated(true, false);
    m_overlay->resize(600, 600);
    EXPECT_EQ(m_overlay->activityIndicator(), nullptr);
    waitMs();
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
    EXPECT_NEAR(m_overlay->activityIndicator()->center().x(), 300.0, 0.5);
    EXPECT_EQ(m_overlay->dimmingView()->size(), QSize(320, 480));
    m_overlay->resize(100, 100);
    EXPECT_NEAR(m_overlay->activityIndicator()->center().x(), 300.0, 0.5);
}

// Hiding takes the indicator away at once and removes the overlay from its parent after the fade;
// hiding during the fade-in (animated) leaves the indicator it still makes off the screen.
class ProgressOverlayHidingTest : public ProgressOverlayTest, public ::testing::WithParamInterface<int> {};

TEST_P(ProgressOverlayHidingTest, RemovesTheOverlayAfterItsFade)
{
    const int shownMs = GetParam();
    m_overlay->setShowingAnimated(true, true);
    waitMs(shownMs);
    m_overlay->setShowingAnimated(false, shownMs < 300);
    EXPECT_FALSE(m_overlay->isShowing());
    ASSERT_NE(m_overlay->activityIndicator(), nullptr);
    EXPECT_EQ(superview(m_overlay->activityIndicator()), nullptr);
    EXPECT_EQ(superview(m_overlay), m_host.get());
    EXPECT_DOUBLE_EQ(zaf::ui::alpha(m_overlay), 0.0);
    waitMs();
    EXPECT_EQ(superview(m_overlay), nullptr);
    EXPECT_FALSE(m_overlay->isVisible());
    EXPECT_EQ(indicators(), 1);
}

INSTANTIATE_TEST_SUITE_P(ShownFor, ProgressOverlayHidingTest, ::testing::Values(300, 50),
                         [](const auto &info) { return info.param < 300 ? "DuringTheFadeIn" : "AfterTheFadeIn"; });

// Progress set before the display exists is kept; the bar follows the progress and is busy when
// the total is unknown.
TEST_F(ProgressOverlayTest, ProgressDisplayFollowsSetProgress)
{
    m_overlay->setProgress(0.25);
    EXPECT_EQ(m_overlay->progressLabel(), nullptr);
    m_overlay->setShowingAnimated(true, true);
    waitMs();
    QLabel *label = m_overlay->progressLabel();
    QProgressBar *bar = m_overlay->progressBar();
    ASSERT_NE(label, nullptr);
    EXPECT_EQ(label->text(), ZafYouTubeActivityProgressOverlay::progressText(0.25));
    EXPECT_EQ(bar->value(), bar->maximum() / 4);
    m_overlay->setProgress(0.5);
    EXPECT_EQ(bar->value(), bar->maximum() / 2);
    m_overlay->setProgress(1.7);
    EXPECT_DOUBLE_EQ(m_overlay->progress(), 1.0);
    m_overlay->setProgress(-1.0);
    EXPECT_TRUE(label->text().isEmpty());
    EXPECT_EQ(bar->maximum(), 0);
}

// Empty when the total is unknown.
class ProgressTextTest : public ::testing::TestWithParam<std::pair<double, const char *>> {};

TEST_P(ProgressTextTest, RoundsDownWithinZeroToAHundred)
{
    const QLocale previous;
    QLocale::setDefault(QLocale(QLocale::English, QLocale::UnitedStates));
    const auto restore = qScopeGuard([&] { QLocale::setDefault(previous); });
    EXPECT_EQ(ZafYouTubeActivityProgressOverlay::progressText(GetParam().first), QString::fromLatin1(GetParam().second));
}

INSTANTIATE_TEST_SUITE_P(Fractions, ProgressTextTest, ::testing::Values(
    std::pair{0.25, "25%"}, std::pair{0.29, "29%"}, std::pair{0.999, "99%"}, std::pair{1.7, "100%"}, std::pair{-1.0, ""}));
