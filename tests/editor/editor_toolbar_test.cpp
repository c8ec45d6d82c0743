// The toolbar arrangements: every row of the play/pause, mode and layout tables.
#include "tests/editor/editor_test_support.h"

namespace zaf::test {
namespace {

const QRectF kPortrait(0, 0, 400, 700);   // small-screen layout on a phone
const QRectF kLandscape(0, 0, 900, 500);  // large-screen layout

struct Row {
    const char *operation;
    bool pad;
    bool trimming;
    bool introMode;
    bool hasEdit;
    const char *top;     // nullptr: not checked
    const char *bottom;  // nullptr: not checked
};

class EditorToolbarTable : public EditorTest, public ::testing::WithParamInterface<Row> {};

// "pause_pad_trimming_4": the operation, the flags that are set, and the row.
std::string rowName(const ::testing::TestParamInfo<Row> &info)
{
    std::string name = info.param.operation;
    name += info.param.pad ? "_pad" : "_phone";
    if (info.param.trimming)
        name += "_trimming";
    if (info.param.introMode)
        name += "_intro";
    if (info.param.hasEdit)
        name += "_edited";
    return name + "_" + std::to_string(info.index);
}

TEST_P(EditorToolbarTable, OperationSetsTheItemsOfTheTable)
{
    const Row row = GetParam();
    // The movie does not matter for the arrangements; a missing one keeps the test quick.
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), row.pad ? kLandscape : kPortrait);
    ASSERT_EQ(editor->isPadMode(), row.pad);
    editor->setTrimming(row.trimming);
    editor->setIntroMode(row.introMode);
    editor->setHasEdit(row.hasEdit);
    const QString op = QString::fromLatin1(row.operation);
    if (op == QLatin1String("play"))
        editor->playAction();
    else if (op == QLatin1String("pause"))
        editor->pauseAction();
    else if (op == QLatin1String("edit"))
        editor->editMode();
    else if (op == QLatin1String("preview"))
        editor->previewMode();
    else if (op == QLatin1String("phoneLayout"))
        editor->applyPhoneUILayout();
    else if (op == QLatin1String("padLayout"))
        editor->applyPadUILayout();
    if (row.top) {
        EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words(row.top));
    }
    if (row.bottom) {
        EXPECT_EQ(itemNames(*editor, editor->bottomToolBar()), words(row.bottom));
    }
}

INSTANTIATE_TEST_SUITE_P(
    PlayAndPause, EditorToolbarTable,
    ::testing::Values(
        Row{"play", false, false, false, false, nullptr, "share flex pause flex"},
        Row{"play", false, true, false, false, nullptr, "share flex pause flex"},
        Row{"play", true, true, false, false, "cancelTrim flex title flex pause fix share fix trim", nullptr},
        Row{"play", true, false, false, true, "cancel flex title flex pause fix share fix save", nullptr},
        Row{"pause", false, false, false, false, nullptr, "share flex play flex"},
        Row{"pause", false, true, false, false, nullptr, "share flex play flex"},
        Row{"pause", true, true, false, false, "cancelTrim flex title flex play fix share fix trim", nullptr},
        Row{"pause", true, false, false, true, "cancel flex title flex play fix share fix save", nullptr}),
    rowName);

INSTANTIATE_TEST_SUITE_P(
    Modes, EditorToolbarTable,
    ::testing::Values(
        Row{"edit", true, false, false, false, "cancelTrim flex title flex play fix trim", nullptr},
        Row{"edit", false, false, false, false, "cancelTrim flex title flex trim", "flex play flex"},
        Row{"preview", true, false, false, true, "done flex title flex play fix share fix save", nullptr},
        Row{"preview", true, false, false, false, "cancel flex title flex play fix share fix save", nullptr},
        Row{"preview", false, false, false, true, "done flex title flex save", "share flex play flex"},
        Row{"preview", false, false, false, false, "cancel flex title flex save", "share flex play flex"}),
    rowName);

INSTANTIATE_TEST_SUITE_P(
    Layouts, EditorToolbarTable,
    ::testing::Values(
        Row{"phoneLayout", false, true, true, false, "cancelTrim flex title flex trim", "flex play flex"},
        Row{"phoneLayout", false, false, true, false, "cancel flex title flex save", "share flex"},
        Row{"phoneLayout", false, false, false, true, "cancel flex title flex save", "share flex play flex"},
        Row{"padLayout", true, true, false, false, "cancelTrim flex title flex play fix trim", nullptr},
        Row{"padLayout", true, false, true, false, "cancel flex title flex share fix save", nullptr},
        Row{"padLayout", true, false, false, true, "cancel flex title flex play fix share fix save", nullptr}),
    rowName);

TEST_F(EditorTest, EditModeSetsHasEditAndPreviewThenShowsDone)
{
    auto editor = makeEditor(scratch.file(QStringLiteral("none.mp4")), kPortrait);
    EXPECT_FALSE(editor->hasEdit());
    editor->editMode();
    EXPECT_TRUE(editor->hasEdit());
    editor->previewMode();
    EXPECT_EQ(itemNames(*editor, editor->topToolBar()).first(), QStringLiteral("done"));
}

TEST_F(EditorTest, ConstructionShowsIntroItemsAndLeavesUndoOnNoToolbar)
{
    auto phone = makeEditor(scratch.file(QStringLiteral("none.mp4")), kPortrait);
    EXPECT_EQ(itemNames(*phone, phone->topToolBar()), words("cancel flex title flex save"));
    EXPECT_EQ(itemNames(*phone, phone->bottomToolBar()), words("share flex"));
    auto pad = makeEditor(scratch.file(QStringLiteral("none.mp4")), kLandscape);
    EXPECT_EQ(itemNames(*pad, pad->topToolBar()), words("cancel flex title flex share fix save"));
    for (auto *e : {phone.get(), pad.get()}) {
        EXPECT_FALSE(e->topToolBar()->items().contains(e->undoButton()));
        EXPECT_FALSE(e->bottomToolBar()->items().contains(e->undoButton()));
        EXPECT_TRUE(e->activityTypes().isEmpty());
    }
}

} // namespace
} // namespace zaf::test
