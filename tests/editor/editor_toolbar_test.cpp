// The toolbar items each operation sets, per layout, trimming, intro mode and whether there is an edit.
#include "tests/editor/editor_test_support.h"

namespace zaf::test {
namespace {

using E = ZafVideoEditorViewController;

struct ToolbarRow {
    const char *name;
    void (E::*run)();
    bool pad, trimming, introMode, hasEdit;
    const char *top, *bottom;   // nullptr: not checked
};

class EditorToolbarTest : public EditorTest, public testing::WithParamInterface<ToolbarRow> {};

// Each operation sets the toolbar items of its state and layout. The state is reached through the
// editor's own operations: an edit through edit mode, trimming through the timeline beginning to
// edit (which is itself an edit), the end of intro mode through playing. No operation leaves: the
// items a new editor starts with. Undo is on no toolbar in any state.
TEST_P(EditorToolbarTest, OperationSetsTheItemsOfItsStateAndLayout)
{
    const ToolbarRow &row = GetParam();
    auto editor = makeEditor(noMovie(), row.pad ? QRectF(0, 0, 900, 500) : QRectF(0, 0, 400, 700));
    ASSERT_EQ(editor->isPadMode(), row.pad);
    if (row.hasEdit)
        editor->editMode();
    if (row.trimming)
        editor->movieScrubberDidBeginEditing(editor->mvTrimmer());
    if (!row.introMode)
        editor->playAction();
    ASSERT_EQ(editor->isTrimming(), row.trimming);
    ASSERT_EQ(editor->isIntroMode(), row.introMode);
    ASSERT_EQ(editor->hasEdit(), row.hasEdit || row.trimming);
    if (row.run)
        ((*editor).*row.run)();
    if (row.top)
        EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words(row.top));
    if (row.bottom)
        EXPECT_EQ(itemNames(*editor, editor->bottomToolBar()), words(row.bottom));
    EXPECT_FALSE(itemNames(*editor, editor->topToolBar()).contains("undo"));
    EXPECT_FALSE(itemNames(*editor, editor->bottomToolBar()).contains("undo"));
}

INSTANTIATE_TEST_SUITE_P(
    States, EditorToolbarTest,
    testing::Values(
        ToolbarRow{"NewPhone", nullptr, false, false, true, false, "cancel flex title flex save", "share flex"},
        ToolbarRow{"NewPad", nullptr, true, false, true, false, "cancel flex title flex share fix save", nullptr},
        ToolbarRow{"PlayPhone", &E::playAction, false, false, false, false, nullptr, "share flex pause flex"},
        ToolbarRow{"PlayPhoneTrimming", &E::playAction, false, true, false, false, nullptr, "share flex pause flex"},
        ToolbarRow{"PlayPadTrimming", &E::playAction, true, true, false, false, "cancelTrim flex title flex pause fix share fix trim", nullptr},
        ToolbarRow{"PlayPadEdited", &E::playAction, true, false, false, true, "cancel flex title flex pause fix share fix save", nullptr},
        ToolbarRow{"PausePhone", &E::pauseAction, false, false, false, false, nullptr, "share flex play flex"},
        ToolbarRow{"PausePhoneTrimming", &E::pauseAction, false, true, false, false, nullptr, "share flex play flex"},
        ToolbarRow{"PausePadTrimming", &E::pauseAction, true, true, false, false, "cancelTrim flex title flex play fix share fix trim", nullptr},
        ToolbarRow{"PausePadEdited", &E::pauseAction, true, false, false, true, "cancel flex title flex play fix share fix save", nullptr},
        ToolbarRow{"EditPad", &E::editMode, true, false, false, false, "cancelTrim flex title flex play fix trim", nullptr},
        ToolbarRow{"EditPhone", &E::editMode, false, false, false, false, "cancelTrim flex title flex trim", "flex play flex"},
        ToolbarRow{"PreviewPadEdited", &E::previewMode, true, false, false, true, "done flex title flex play fix share fix save", nullptr},
        ToolbarRow{"PreviewPad", &E::previewMode, true, false, false, false, "cancel flex title flex play fix share fix save", nullptr},
        ToolbarRow{"PreviewPhoneEdited", &E::previewMode, false, false, false, true, "done flex title flex save", "share flex play flex"},
        ToolbarRow{"PreviewPhone", &E::previewMode, false, false, false, false, "cancel flex title flex save", "share flex play flex"},
        ToolbarRow{"PhoneLayoutTrimming", &E::applyPhoneUILayout, false, true, true, false, "cancelTrim flex title flex trim", "flex play flex"},
        ToolbarRow{"PhoneLayoutIntro", &E::applyPhoneUILayout, false, false, true, false, "cancel flex title flex save", "share flex"},
        ToolbarRow{"PhoneLayoutEdited", &E::applyPhoneUILayout, false, false, false, true, "cancel flex title flex save", "share flex play flex"},
        ToolbarRow{"PadLayoutTrimming", &E::applyPadUILayout, true, true, false, false, "cancelTrim flex title flex play fix trim", nullptr},
        ToolbarRow{"PadLayoutIntro", &E::applyPadUILayout, true, false, true, false, "cancel flex title flex share fix save", nullptr},
        ToolbarRow{"PadLayoutEdited", &E::applyPadUILayout, true, false, false, true, "cancel flex title flex play fix share fix save", nullptr}),
    caseName);

} // namespace
} // namespace zaf::test
