// The desktop keys, typed into a shown editor window.
#include "tests/editor/editor_test_support.h"

#include "platform/ui/window_host.h"

#include <QApplication>
#include <QTest>

namespace zaf::test {
namespace {

class EditorKeyboardTest : public EditorTest {
protected:
    void SetUp() override
    {
        EditorTest::SetUp();
        editor = ready(movie(4), QRectF(0, 0, 480, 640));
        editor->setDelegate(&delegate);
        host = std::make_unique<ui::WindowHost>(editor.get());
        host->resize(480, 640);
        host->show();
        QApplication::setActiveWindow(host.get());
        ASSERT_TRUE(QTest::qWaitForWindowActive(host.get()));
    }
    void press(int key, Qt::KeyboardModifiers modifiers = Qt::NoModifier)
    {
        QTest::keyClick(host.get(), Qt::Key(key), modifiers);
        spin(30);
    }

    RecordingDelegate delegate;
    std::unique_ptr<ZafVideoEditorViewController> editor;
    std::unique_ptr<ui::WindowHost> host;
};

TEST_F(EditorKeyboardTest, SpaceTogglesPlayback)
{
    press(Qt::Key_Space);
    EXPECT_GT(editor->mvPlayer()->rate(), 0);
    EXPECT_FALSE(editor->isIntroMode());
    press(Qt::Key_Space);
    EXPECT_EQ(editor->mvPlayer()->rate(), 0);
}

TEST_F(EditorKeyboardTest, ArrowKeysStepThePlayhead)
{
    editor->mvTrimmer()->setValue(1.0);
    press(Qt::Key_Right);
    EXPECT_NEAR(editor->mvTrimmer()->value(), 1.0 + 1.0 / 30, 1e-6);
    press(Qt::Key_Left, Qt::ShiftModifier);
    EXPECT_NEAR(editor->mvTrimmer()->value(), 1.0 / 30, 1e-6);
}

TEST_F(EditorKeyboardTest, IEntersEditingEscapeCancelsTheTrimThenFinishes)
{
    editor->mvTrimmer()->setValue(1.0);
    press(Qt::Key_I);
    EXPECT_TRUE(editor->isTrimming());
    EXPECT_TRUE(editor->mvTrimmer()->isEditing());
    EXPECT_TRUE(editor->hasEdit());

    press(Qt::Key_Escape);
    EXPECT_FALSE(editor->isTrimming());
    EXPECT_FALSE(editor->mvTrimmer()->isEditing());
    EXPECT_TRUE(delegate.reports.isEmpty()) << "Escape during a trim cancels the trim, not the editor";

    press(Qt::Key_Escape);
    ASSERT_EQ(delegate.reports.size(), 1);
    EXPECT_TRUE(delegate.reports.first().isEmpty());
}

// I and O on the 4 s movie (minimum trim length 1 s): each key is typed with the playhead at the
// given time. When a key moves both handles to keep the minimum length, the editor must hear of
// both, so what it exports is what the timeline shows.
struct TrimKeys {
    const char *name;
    QList<std::pair<double, Qt::Key>> presses;
    double start, end;
};

class EditorTrimKeysTest : public EditorKeyboardTest, public ::testing::WithParamInterface<TrimKeys> {};

TEST_P(EditorTrimKeysTest, TheEditorsRangeIsTheTimelinesRange)
{
    for (const auto &[playhead, key] : GetParam().presses) {
        editor->mvTrimmer()->setValue(playhead);
        press(key);
    }
    EXPECT_NEAR(editor->mvTrimmer()->editingStartValue(), GetParam().start, 1e-9);
    EXPECT_NEAR(editor->mvTrimmer()->editingEndValue(), GetParam().end, 1e-9);
    EXPECT_DOUBLE_EQ(editor->editStartTime(), editor->mvTrimmer()->editingStartValue());
    EXPECT_DOUBLE_EQ(editor->editEndTime(), editor->mvTrimmer()->editingEndValue());
}

INSTANTIATE_TEST_SUITE_P(Keys, EditorTrimKeysTest, ::testing::Values(
    TrimKeys{"InThenOut", {{1.0, Qt::Key_I}, {2.5, Qt::Key_O}}, 1.0, 2.5},
    TrimKeys{"OutBeforeTheStartPushesTheStartBack", {{1.0, Qt::Key_I}, {2.5, Qt::Key_O}, {1.2, Qt::Key_O}}, 0.2, 1.2},
    TrimKeys{"InPastTheEndPushesTheEndOn", {{1.0, Qt::Key_I}, {2.5, Qt::Key_O}, {2.0, Qt::Key_I}}, 2.0, 3.0}),
    caseName);

} // namespace
} // namespace zaf::test
