// Layout choice, toolbar frames, the timeline container and the size transitions.
#include "tests/editor/editor_test_support.h"

#include "overlay/video_overlay_button.h"
#include "platform/ui/backdrop_view.h"
#include "platform/ui/screen.h"
#include "platform/ui/transition_coordinator.h"
#include "platform/ui/view_animation.h"

#include <QWidget>

namespace zaf::test {
namespace {

struct ChoiceRow {
    int idiom; // -1 cannot tell, 0 phone, 1 tablet
    QRectF rect;
    bool pad;
};

class EditorLayoutChoice : public EditorTest, public ::testing::WithParamInterface<ChoiceRow> {};

// "tablet_800x400"
std::string choiceName(const ::testing::TestParamInfo<ChoiceRow> &info)
{
    static const char *const idioms[] = {"unknown", "phone", "tablet"};
    return std::string(idioms[info.param.idiom + 1]) + "_" + std::to_string(int(info.param.rect.width())) + "x"
        + std::to_string(int(info.param.rect.height()));
}

TEST_P(EditorLayoutChoice, PicksTheLayoutByIdiomAndShape)
{
    const ChoiceRow row = GetParam();
    useCapabilities(scratch, QStringLiteral("{\"device-idiom\": %1}").arg(row.idiom).toUtf8());
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), row.rect);
    EXPECT_EQ(editor->isPadMode(), row.pad);
    EXPECT_EQ(ui::superview(editor->bottomToolBar()) != nullptr, !row.pad);
}

INSTANTIATE_TEST_SUITE_P(Shapes, EditorLayoutChoice,
                         ::testing::Values(ChoiceRow{0, QRectF(0, 0, 800, 400), true},
                                           ChoiceRow{0, QRectF(0, 0, 400, 800), false},
                                           ChoiceRow{0, QRectF(0, 0, 500, 500), false},
                                           ChoiceRow{-1, QRectF(0, 0, 800, 400), true},
                                           ChoiceRow{-1, QRectF(0, 0, 500, 500), false},
                                           ChoiceRow{1, QRectF(0, 0, 800, 400), true},
                                           ChoiceRow{1, QRectF(0, 0, 400, 800), true},
                                           ChoiceRow{1, QRectF(0, 0, 500, 500), true}),
                         choiceName);

TEST_F(EditorTest, ToolbarsAreTallWithoutAHomeButton)
{
    useCapabilities(scratch, R"({"home-button-type": 2})");
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(0, 0, 400, 700));
    EXPECT_FALSE(editor->hasHomeButton());
    EXPECT_EQ(editor->topToolBar()->geometry(), QRect(0, 0, 400, 85));
    EXPECT_EQ(editor->bottomToolBar()->geometry(), QRect(0, 700 - 64, 400, 64));
}

TEST_F(EditorTest, ToolbarsAreShortWithAHomeButtonAndFixedSpaceFollowsTheWidth)
{
    useCapabilities(scratch, R"({"home-button-type": 1})");
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(0, 0, 400, 700));
    EXPECT_TRUE(editor->hasHomeButton());
    EXPECT_EQ(editor->topToolBar()->geometry(), QRect(0, 0, 400, 60));
    EXPECT_EQ(editor->bottomToolBar()->geometry(), QRect(0, 700 - 44, 400, 44));
    EXPECT_DOUBLE_EQ(editor->fixSpace()->width(), 0.005 * 400);
}

TEST_F(EditorTest, TimelineSitsAboveTheBottomToolbarOrOnTheBottomEdge)
{
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(0, 0, 400, 700));
    QWidget *container = editor->scrubberContainterView();
    EXPECT_EQ(container->geometry(), QRect(0, 700 - 44 - 38, 400, 38));

    ui::TransitionCoordinator toLandscape(QSizeF(900, 500));
    editor->view()->resize(900, 500);
    editor->viewWillTransitionToSize(QSizeF(900, 500), toLandscape);
    toLandscape.complete();
    EXPECT_TRUE(editor->isPadMode());
    EXPECT_EQ(ui::superview(editor->bottomToolBar()), nullptr);
    EXPECT_EQ(container->geometry(), QRect(0, 500 - 38, 900, 38));

    ui::TransitionCoordinator back(QSizeF(400, 700));
    editor->view()->resize(400, 700);
    editor->viewWillTransitionToSize(QSizeF(400, 700), back);
    back.complete();
    EXPECT_FALSE(editor->isPadMode());
    EXPECT_EQ(ui::superview(editor->bottomToolBar()), editor->view());
    EXPECT_EQ(container->geometry(), QRect(0, 700 - 44 - 38, 400, 38));
    EXPECT_EQ(editor->bottomToolBar()->geometry(), QRect(0, 700 - 44, 400, 44));
}

TEST_F(EditorTest, RotationKeepsTrimItemsAndShowsPlayWhilePlaying)
{
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(0, 0, 400, 700));
    editor->setIntroMode(false);
    editor->playAction();
    ui::TransitionCoordinator c(QSizeF(900, 500));
    editor->view()->resize(900, 500);
    editor->viewWillTransitionToSize(QSizeF(900, 500), c);
    EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words("cancel flex title flex play fix share fix save"));

    editor->setTrimming(true);
    ui::TransitionCoordinator c2(QSizeF(400, 700));
    editor->view()->resize(400, 700);
    editor->viewWillTransitionToSize(QSizeF(400, 700), c2);
    EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words("cancelTrim flex title flex trim"));
    EXPECT_EQ(itemNames(*editor, editor->bottomToolBar()), words("flex play flex"));
}

TEST_F(EditorTest, OverlayPlayButtonIsCentredOnTheScreenNotTheView)
{
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(0, 0, 300, 200));
    const QRectF screen = ui::Screen::mainScreenBounds();
    QWidget *button = editor->videoOverlayPlayButton()->widget();
    EXPECT_EQ(button->pos(), QPointF(screen.width() * 0.5 - button->width() * 0.5,
                                     screen.height() * 0.5 - button->height() * 0.5)
                                 .toPoint());
    EXPECT_EQ(button->parentWidget(), editor->view());
}

TEST_F(EditorTest, ShortInitializerLeavesTheFrameAndTintGoesToTheTopToolbarOnly)
{
    ZafVideoEditorViewController plain(QStringLiteral("id"), QUrl::fromLocalFile(scratch.file(QStringLiteral("none.mp4"))),
                                       QStringLiteral("Recorder"));
    const QRect defaultFrame = QWidget().geometry();
    EXPECT_EQ(plain.view()->geometry(), defaultFrame);
    EXPECT_FALSE(plain.topToolBar()->tintColor().isValid());

    auto tinted = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(10, 20, 400, 700), QColor(0xff, 0x40, 0x00));
    EXPECT_EQ(tinted->view()->geometry(), QRect(10, 20, 400, 700));
    EXPECT_EQ(tinted->topToolBar()->tintColor(), QColor(0xff, 0x40, 0x00));
    EXPECT_FALSE(tinted->bottomToolBar()->tintColor().isValid());
}

} // namespace
} // namespace zaf::test
