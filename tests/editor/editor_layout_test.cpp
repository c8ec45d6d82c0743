// Layout choice, toolbar frames, the timeline container, the size transitions and the overlay play
// button's place.
#include "tests/editor/editor_test_support.h"

#include "overlay/video_overlay_button.h"
#include "platform/ui/backdrop_view.h"
#include "platform/ui/view_animation.h"

namespace zaf::test {
namespace {

struct LayoutChoice {
    const char *name;
    int idiom;   // -1 cannot tell, 0 phone, 1 tablet
    QRectF rect;
    bool pad;
};

class EditorLayoutChoiceTest : public EditorTest, public testing::WithParamInterface<LayoutChoice> {};

// The pad layout is for a tablet, or for a landscape frame when the device is not known to be one.
TEST_P(EditorLayoutChoiceTest, PicksThePadLayoutForATabletOrALandscapeFrame)
{
    useCapabilities(scratch, QStringLiteral("{\"device-idiom\": %1}").arg(GetParam().idiom).toUtf8());
    auto editor = makeEditor(noMovie(), GetParam().rect);
    EXPECT_EQ(editor->isPadMode(), GetParam().pad);
    EXPECT_EQ(ui::superview(editor->bottomToolBar()) != nullptr, !GetParam().pad);
}

INSTANTIATE_TEST_SUITE_P(
    Frames, EditorLayoutChoiceTest,
    testing::Values(LayoutChoice{"PhoneLandscape", 0, QRectF(0, 0, 800, 400), true},
                    LayoutChoice{"PhonePortrait", 0, QRectF(0, 0, 400, 800), false},
                    LayoutChoice{"PhoneSquare", 0, QRectF(0, 0, 500, 500), false},
                    LayoutChoice{"UnknownLandscape", -1, QRectF(0, 0, 800, 400), true},
                    LayoutChoice{"UnknownSquare", -1, QRectF(0, 0, 500, 500), false},
                    LayoutChoice{"TabletLandscape", 1, QRectF(0, 0, 800, 400), true},
                    LayoutChoice{"TabletPortrait", 1, QRectF(0, 0, 400, 800), true},
                    LayoutChoice{"TabletSquare", 1, QRectF(0, 0, 500, 500), true}),
    [](const testing::TestParamInfo<LayoutChoice> &info) { return std::string(info.param.name); });

struct ToolbarHeights {
    const char *name;
    const char *capabilities;
    bool homeButton;
    int top, bottom;
};

class EditorToolbarHeightTest : public EditorTest, public testing::WithParamInterface<ToolbarHeights> {};

// The toolbars are short on a device with a home button and tall without one.
TEST_P(EditorToolbarHeightTest, ToolbarHeightsFollowTheHomeButton)
{
    useCapabilities(scratch, GetParam().capabilities);
    auto editor = makeEditor(noMovie());
    EXPECT_EQ(editor->hasHomeButton(), GetParam().homeButton);
    EXPECT_EQ(editor->topToolBar()->geometry(), QRect(0, 0, 400, GetParam().top));
    EXPECT_EQ(editor->bottomToolBar()->geometry(), QRect(0, 700 - GetParam().bottom, 400, GetParam().bottom));
}

INSTANTIATE_TEST_SUITE_P(
    HomeButton, EditorToolbarHeightTest,
    testing::Values(ToolbarHeights{"WithHomeButton", R"({"home-button-type": 1})", true, 60, 44},
                    ToolbarHeights{"WithoutHomeButton", R"({"home-button-type": 2})", false, 85, 64}),
    [](const testing::TestParamInfo<ToolbarHeights> &info) { return std::string(info.param.name); });

TEST_F(EditorTest, FixedSpaceIsAFractionOfTheViewsWidth)
{
    auto editor = makeEditor(noMovie());
    EXPECT_DOUBLE_EQ(editor->fixSpace()->width(), 0.005 * 400);
}

// Turning to landscape and back: the timeline sits above the bottom toolbar or on the bottom edge,
// and the items follow the layout while keeping the playing and trimming state.
TEST_F(EditorTest, RotationMovesTheTimelineAndRebuildsTheItemsForTheNewLayout)
{
    auto editor = makeEditor(noMovie());
    QWidget *container = editor->scrubberContainterView();
    EXPECT_EQ(container->geometry(), QRect(0, 700 - 44 - 38, 400, 38));
    editor->playAction();

    rotate(*editor, 900, 500);
    EXPECT_TRUE(editor->isPadMode());
    EXPECT_EQ(ui::superview(editor->bottomToolBar()), nullptr);
    EXPECT_EQ(container->geometry(), QRect(0, 500 - 38, 900, 38));
    EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words("cancel flex title flex play fix share fix save"));

    editor->movieScrubberDidBeginEditing(editor->mvTrimmer());
    rotate(*editor, 400, 700);
    EXPECT_FALSE(editor->isPadMode());
    EXPECT_EQ(ui::superview(editor->bottomToolBar()), editor->view());
    EXPECT_EQ(container->geometry(), QRect(0, 700 - 44 - 38, 400, 38));
    EXPECT_EQ(editor->bottomToolBar()->geometry(), QRect(0, 700 - 44, 400, 44));
    EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words("cancelTrim flex title flex trim"));
    EXPECT_EQ(itemNames(*editor, editor->bottomToolBar()), words("flex play flex"));
}

// On a desktop the editor's window is its screen: the button sits in the middle of the view,
// whatever the monitor's size, and stays there as the window is resized.
TEST_F(EditorTest, OverlayPlayButtonIsCentredInTheViewAndStaysCentredOnResize)
{
    auto editor = makeEditor(noMovie(), QRectF(0, 0, 1280, 720));
    editor->view()->show();
    QWidget *button = editor->videoOverlayPlayButton()->widget();
    EXPECT_EQ(button->parentWidget(), editor->view());
    auto expectCentred = [&](int width, int height) {
        EXPECT_NEAR(button->geometry().center().x(), width / 2, 1) << width << "x" << height;
        EXPECT_NEAR(button->geometry().center().y(), height / 2, 1) << width << "x" << height;
    };
    expectCentred(1280, 720);
    editor->view()->resize(1000, 500);
    expectCentred(1000, 500);
    rotate(*editor, 400, 700);
    expectCentred(400, 700);
    for (int i = 0; i < 20; ++i)
        editor->view()->resize(401 + i * 37, 301 + i * 23);
    editor->view()->resize(1280, 720);
    expectCentred(1280, 720);
}

TEST_F(EditorTest, ShortInitializerLeavesTheFrameAndTintUnset)
{
    ZafVideoEditorViewController plain(QStringLiteral("id"), QUrl::fromLocalFile(noMovie()), QStringLiteral("Recorder"));
    EXPECT_EQ(plain.view()->geometry(), QWidget().geometry());
    EXPECT_FALSE(plain.topToolBar()->tintColor().isValid());
}

TEST_F(EditorTest, TintGoesToTheTopToolbarOnly)
{
    auto tinted = makeEditor(noMovie(), QRectF(10, 20, 400, 700), QColor(0xff, 0x40, 0x00));
    EXPECT_EQ(tinted->view()->geometry(), QRect(10, 20, 400, 700));
    EXPECT_EQ(tinted->topToolBar()->tintColor(), QColor(0xff, 0x40, 0x00));
    EXPECT_FALSE(tinted->bottomToolBar()->tintColor().isValid());
}

} // namespace
} // namespace zaf::test
