// The toolbar items each operation sets, per layout, trimming, intro mode and whether there is an
// edit.
#include "tests/editor/editor_test_support.h"

namespace zaf::test {
namespace {

using E = ZafVideoEditorViewController;

TEST_F(EditorTest, EachOperationSetsTheToolbarItemsOfItsStateAndLayout)
{
    const struct {
        const char *operation;
        void (E::*run)();
        bool pad, trimming, introMode, hasEdit;
        const char *top;      // nullptr: not checked
        const char *bottom;   // nullptr: not checked
    } rows[] = {
        {"play", &E::playAction, false, false, false, false, nullptr, "share flex pause flex"},
        {"play", &E::playAction, false, true, false, false, nullptr, "share flex pause flex"},
        {"play", &E::playAction, true, true, false, false, "cancelTrim flex title flex pause fix share fix trim", nullptr},
        {"play", &E::playAction, true, false, false, true, "cancel flex title flex pause fix share fix save", nullptr},
        {"pause", &E::pauseAction, false, false, false, false, nullptr, "share flex play flex"},
        {"pause", &E::pauseAction, false, true, false, false, nullptr, "share flex play flex"},
        {"pause", &E::pauseAction, true, true, false, false, "cancelTrim flex title flex play fix share fix trim", nullptr},
        {"pause", &E::pauseAction, true, false, false, true, "cancel flex title flex play fix share fix save", nullptr},
        {"edit", &E::editMode, true, false, false, false, "cancelTrim flex title flex play fix trim", nullptr},
        {"edit", &E::editMode, false, false, false, false, "cancelTrim flex title flex trim", "flex play flex"},
        {"preview", &E::previewMode, true, false, false, true, "done flex title flex play fix share fix save", nullptr},
        {"preview", &E::previewMode, true, false, false, false, "cancel flex title flex play fix share fix save", nullptr},
        {"preview", &E::previewMode, false, false, false, true, "done flex title flex save", "share flex play flex"},
        {"preview", &E::previewMode, false, false, false, false, "cancel flex title flex save", "share flex play flex"},
        {"phone layout", &E::applyPhoneUILayout, false, true, true, false, "cancelTrim flex title flex trim", "flex play flex"},
        {"phone layout", &E::applyPhoneUILayout, false, false, true, false, "cancel flex title flex save", "share flex"},
        {"phone layout", &E::applyPhoneUILayout, false, false, false, true, "cancel flex title flex save", "share flex play flex"},
        {"pad layout", &E::applyPadUILayout, true, true, false, false, "cancelTrim flex title flex play fix trim", nullptr},
        {"pad layout", &E::applyPadUILayout, true, false, true, false, "cancel flex title flex share fix save", nullptr},
        {"pad layout", &E::applyPadUILayout, true, false, false, true, "cancel flex title flex play fix share fix save", nullptr},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(testing::Message() << row.operation << (row.pad ? " pad" : " phone") << (row.trimming ? " trimming" : "")
                                        << (row.introMode ? " intro" : "") << (row.hasEdit ? " edited" : ""));
        auto editor = makeEditor(noMovie(), row.pad ? QRectF(0, 0, 900, 500) : QRectF(0, 0, 400, 700));
        ASSERT_EQ(editor->isPadMode(), row.pad);
        editor->setTrimming(row.trimming);
        editor->setIntroMode(row.introMode);
        editor->setHasEdit(row.hasEdit);
        ((*editor).*row.run)();
        if (row.top) {
            EXPECT_EQ(itemNames(*editor, editor->topToolBar()), words(row.top));
        }
        if (row.bottom) {
            EXPECT_EQ(itemNames(*editor, editor->bottomToolBar()), words(row.bottom));
        }
    }
}

TEST_F(EditorTest, StartsWithTheIntroItemsUndoNowhereAndEditModeMakesAnEditThatPreviewShowsAsDone)
{
    auto phone = makeEditor(noMovie());
    EXPECT_EQ(itemNames(*phone, phone->topToolBar()), words("cancel flex title flex save"));
    EXPECT_EQ(itemNames(*phone, phone->bottomToolBar()), words("share flex"));
    auto pad = makeEditor(noMovie(), QRectF(0, 0, 900, 500));
    EXPECT_EQ(itemNames(*pad, pad->topToolBar()), words("cancel flex title flex share fix save"));
    for (auto *e : {phone.get(), pad.get()}) {
        EXPECT_FALSE(e->topToolBar()->items().contains(e->undoButton()));
        EXPECT_FALSE(e->bottomToolBar()->items().contains(e->undoButton()));
        EXPECT_TRUE(e->activityTypes().isEmpty());
    }

    EXPECT_FALSE(phone->hasEdit());
    phone->editMode();
    EXPECT_TRUE(phone->hasEdit());
    phone->previewMode();
    EXPECT_EQ(itemNames(*phone, phone->topToolBar()).first(), QStringLiteral("done"));
}

} // namespace
} // namespace zaf::test
