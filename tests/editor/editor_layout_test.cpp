// Layout choice, toolbar frames, the timeline container, size transitions, the overlay button, tint.
#include "tests/editor/editor_test_support.h"

#include "overlay/video_overlay_button.h"
#include "platform/ui/backdrop_view.h"
#include "platform/ui/view_animation.h"

namespace zaf::test {
namespace {

// The pad layout is for a tablet, or for a landscape frame when the device is not known to be one.
// The toolbars are short on a device with a home button and tall without one; the fixed space is a
// fraction of the view's width. (The home-button answer is read once per process: each test has its own.)
struct LayoutChoice {
    const char *name;
    const char *capabilities;
    QRectF rect;
    bool pad;
    int top = 60, bottom = 44;
};

class EditorLayoutChoiceTest : public EditorTest, public testing::WithParamInterface<LayoutChoice> {};

TEST_P(EditorLayoutChoiceTest, PicksTheLayoutAndTheToolbarFrames)
{
    const LayoutChoice &row = GetParam();
    ScopedCapabilities capabilities(row.capabilities);
    auto editor = makeEditor(noMovie(), row.rect);
    const QRect frame = row.rect.toRect();
    EXPECT_EQ(editor->isPadMode(), row.pad);
    EXPECT_EQ(ui::superview(editor->bottomToolBar()) != nullptr, !row.pad);
    EXPECT_EQ(editor->topToolBar()->geometry(), QRect(0, 0, frame.width(), row.top));
    if (!row.pad)
        EXPECT_EQ(editor->bottomToolBar()->geometry(), QRect(0, frame.height() - row.bottom, frame.width(), row.bottom));
    EXPECT_DOUBLE_EQ(editor->fixSpace()->width(), 0.005 * frame.width());
}

INSTANTIATE_TEST_SUITE_P(
    Frames, EditorLayoutChoiceTest,
    testing::Values(LayoutChoice{"PhoneLandscape", R"({"device-idiom": 0})", QRectF(0, 0, 800, 400), true},
                    LayoutChoice{"PhonePortrait", R"({"device-idiom": 0})", QRectF(0, 0, 400, 800), false},
                    LayoutChoice{"PhoneSquare", R"({"device-idiom": 0})", QRectF(0, 0, 500, 500), false},
                    LayoutChoice{"UnknownLandscape", R"({"device-idiom": -1})", QRectF(0, 0, 800, 400), true},
                    LayoutChoice{"UnknownSquare", R"({"device-idiom": -1})", QRectF(0, 0, 500, 500), false},
                    LayoutChoice{"TabletLandscape", R"({"device-idiom": 1})", QRectF(0, 0, 800, 400), true},
                    LayoutChoice{"TabletPortrait", R"({"device-idiom": 1})", QRectF(0, 0, 400, 800), true},
                    LayoutChoice{"TabletSquare", R"({"device-idiom": 1})", QRectF(0, 0, 500, 500), true},
                    LayoutChoice{"WithHomeButton", R"({"home-button-type": 1})", QRectF(0, 0, 400, 700), false},
                    LayoutChoice{"WithoutHomeButton", R"({"home-button-type": 2})", QRectF(0, 0, 400, 700), false, 85, 64}),
    caseName);

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

// The tint colours the top toolbar only; the short initializer sets no tint.
TEST_F(EditorTest, TintGoesToTheTopToolbarOnly)
{
    auto tinted = makeEditor(noMovie(), QRectF(10, 20, 400, 700), QColor(0xff, 0x40, 0x00));
    EXPECT_EQ(tinted->view()->geometry(), QRect(10, 20, 400, 700));
    EXPECT_EQ(tinted->topToolBar()->tintColor(), QColor(0xff, 0x40, 0x00));
    EXPECT_FALSE(tinted->bottomToolBar()->tintColor().isValid());
    ZafVideoEditorViewController plain(QStringLiteral("id"), QUrl::fromLocalFile(noMovie()), QStringLiteral("Recorder"));
    EXPECT_FALSE(plain.topToolBar()->tintColor().isValid());
}

} // namespace
} // namespace zaf::test
