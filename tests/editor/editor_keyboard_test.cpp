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
    void TearDown() override
    {
        host.reset();
        editor.reset();
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

TEST_F(EditorKeyboardTest, SpacePlaysAndPausesAndArrowsStepThePlayhead)
{
    press(Qt::Key_Space);
    EXPECT_GT(editor->mvPlayer()->rate(), 0);
    EXPECT_FALSE(editor->isIntroMode());
    press(Qt::Key_Space);
    EXPECT_EQ(editor->mvPlayer()->rate(), 0);

    editor->mvTrimmer()->setValue(1.0);
    press(Qt::Key_Right);
    EXPECT_NEAR(editor->mvTrimmer()->value(), 1.0 + 1.0 / 30, 1e-6);
    press(Qt::Key_Left, Qt::ShiftModifier);
    EXPECT_NEAR(editor->mvTrimmer()->value(), 1.0 / 30, 1e-6);
}

TEST_F(EditorKeyboardTest, IAndOSetTheRangeAtThePlayheadEscapeCancelsTheTrimThenFinishes)
{
    editor->mvTrimmer()->setValue(1.0);
    press(Qt::Key_I);
    EXPECT_TRUE(editor->isTrimming());
    EXPECT_TRUE(editor->mvTrimmer()->isEditing());
    EXPECT_DOUBLE_EQ(editor->editStartTime(), 1.0);
    EXPECT_TRUE(editor->hasEdit());

    editor->mvTrimmer()->setValue(2.5);
    press(Qt::Key_O);
    EXPECT_DOUBLE_EQ(editor->editEndTime(), 2.5);
    EXPECT_DOUBLE_EQ(editor->mvTrimmer()->editingStartValue(), 1.0);
    EXPECT_DOUBLE_EQ(editor->mvTrimmer()->editingEndValue(), 2.5);

    // An end before the start keeps the minimum length by moving the start.
    editor->mvTrimmer()->setValue(1.2);
    press(Qt::Key_O);
    EXPECT_LE(editor->mvTrimmer()->editingStartValue(), 0.2 + 1e-9);

    press(Qt::Key_Escape);
    EXPECT_FALSE(editor->isTrimming());
    EXPECT_FALSE(editor->mvTrimmer()->isEditing());
    EXPECT_TRUE(delegate.reports.isEmpty()) << "Escape during a trim cancels the trim, not the editor";

    press(Qt::Key_Escape);
    ASSERT_EQ(delegate.reports.size(), 1);
    EXPECT_TRUE(delegate.reports.first().isEmpty());
}

} // namespace
} // namespace zaf::test
