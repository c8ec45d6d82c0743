// ShareSheet: which activities are listed and in what order, Cancel, an application activity with a
// view controller of its own, the popup anchored at a bar button item, and a platform activity run
// end to end from its button, on real widgets.
#include "platform/ui/bar_button_item.h"
#include "platform/ui/share_activity.h"
#include "platform/ui/share_sheet.h"
#include "platform/ui/view_controller.h"
#include "platform/ui/window_host.h"
#include "tests/support/temp_dir.h"

#include <QAbstractButton>
#include <QApplication>
#include <QClipboard>
#include <QDeadlineTimer>
#include <QMimeData>
#include <QPushButton>
#include <QVBoxLayout>
#include <gtest/gtest.h>

#include <functional>
#include <optional>

namespace zaf::ui {
namespace {

// Runs the event loop until the condition holds (at most two seconds).
bool waitUntil(const std::function<bool()> &condition)
{
    QDeadlineTimer deadline(2000);
    while (!condition()) {
        if (deadline.hasExpired())
            return false;
        QApplication::processEvents(QEventLoop::AllEvents, 20);
    }
    return true;
}

class CustomActivity : public ShareActivity {
public:
    CustomActivity(QString type, bool canPerform, ViewController *controller = nullptr)
        : m_type(std::move(type)), m_canPerform(canPerform), m_controller(controller)
    {
    }
    QString activityType() const override { return m_type; }
    QString activityTitle() const override { return QStringLiteral("Custom ") + m_type; }
    bool canPerformWithActivityItems(const QVariantList &) override { return m_canPerform; }
    void prepareWithActivityItems(const QVariantList &items) override
    {
        ShareActivity::prepareWithActivityItems(items);
        ++m_prepared;
    }
    ViewController *activityViewController() override { return m_controller; }
    void performActivity() override { ++m_performed; }

    int m_prepared = 0;
    int m_performed = 0;

private:
    QString m_type;
    bool m_canPerform;
    ViewController *m_controller;
};

struct Completion {
    int calls = 0;
    QString type;
    bool completed = false;
    std::optional<Error> error;
};

struct ShareSheetFixture : ::testing::Test {
    ViewController root;
    std::optional<WindowHost> host;
    test::ScratchDir scratch;
    QString movie;
    Completion completion;

    void SetUp() override
    {
        root.view()->resize(480, 320);
        host.emplace(&root);
        host->show();
        movie = scratch.write(QStringLiteral("movie.mov"), 64);
    }
    void TearDown() override
    {
        if (root.presentedViewController())
            root.dismissViewController(false);
        QApplication::processEvents();
    }
    QVariantList items() const { return {QStringLiteral("Look at this"), QUrl::fromLocalFile(movie)}; }
    void watch(ShareSheet &sheet)
    {
        sheet.setCompletionWithItemsHandler([this](const QString &type, bool completed, const QVariantList &returned,
                                                   const std::optional<Error> &error) {
            ++completion.calls;
            completion.type = type;
            completion.completed = completed;
            completion.error = error;
            EXPECT_TRUE(returned.isEmpty());
        });
    }
};

TEST_F(ShareSheetFixture, ListsActivitiesInTheGivenOrderWithoutExcludedOnes)
{
    CustomActivity custom(QStringLiteral("org.example.Custom"), true);
    CustomActivity unable(QStringLiteral("org.example.Unable"), false);
    ShareSheet sheet(items(), {&custom, &unable});
    sheet.setExcludedActivityTypes({QString::fromLatin1(kActivityTypeMail)});
    sheet.setActivityTypeOrder({QStringLiteral("org.example.Custom"), QString::fromLatin1(kActivityTypeMessage),
                                QString::fromLatin1(kActivityTypeOpenWith), QString::fromLatin1(kActivityTypeCopyToPasteboard)});

    const QStringList expected{QStringLiteral("org.example.Custom"), QString::fromLatin1(kActivityTypeOpenWith),
                               QString::fromLatin1(kActivityTypeCopyToPasteboard),
                               QString::fromLatin1(kActivityTypeSaveToPhotoLibrary),
                               QString::fromLatin1(kActivityTypeSaveToFolder)};
    EXPECT_EQ(sheet.visibleActivityTypes(), expected);
    QAbstractButton *button = sheet.buttonForActivityType(QStringLiteral("org.example.Custom"));
    ASSERT_NE(button, nullptr);
    EXPECT_EQ(button->text(), QStringLiteral("Custom org.example.Custom"));
    EXPECT_EQ(sheet.buttonForActivityType(QString::fromLatin1(kActivityTypeMail)), nullptr);
    EXPECT_EQ(sheet.buttonForActivityType(QStringLiteral("org.example.Unable")), nullptr);
    ASSERT_NE(sheet.cancelButton(), nullptr);

    // Changing the lists afterwards updates the buttons; no order means the default order.
    sheet.setActivityTypeOrder({});
    sheet.setExcludedActivityTypes({QString::fromLatin1(kActivityTypeSaveToFolder)});
    EXPECT_EQ(sheet.visibleActivityTypes().first(), QString::fromLatin1(kActivityTypeMail));
    EXPECT_EQ(sheet.visibleActivityTypes().last(), QStringLiteral("org.example.Custom"));
    EXPECT_EQ(sheet.buttonForActivityType(QString::fromLatin1(kActivityTypeSaveToFolder)), nullptr);
    EXPECT_NE(sheet.buttonForActivityType(QString::fromLatin1(kActivityTypeMail)), nullptr);
}

TEST_F(ShareSheetFixture, TextOnlyItemsOfferNoFileActivities)
{
    ShareSheet sheet({QStringLiteral("just text")}, {});
    EXPECT_EQ(sheet.visibleActivityTypes(),
              (QStringList{QString::fromLatin1(kActivityTypeMail), QString::fromLatin1(kActivityTypeCopyToPasteboard)}));
}

TEST_F(ShareSheetFixture, CancelCompletesOnceWithNoType)
{
    CustomActivity custom(QStringLiteral("org.example.Custom"), true);
    ShareSheet sheet(items(), {&custom});
    watch(sheet);
    bool presented = false;
    root.presentViewController(&sheet, true, [&] { presented = true; });
    ASSERT_EQ(root.presentedViewController(), &sheet);
    ASSERT_TRUE(waitUntil([&] { return presented; }));

    sheet.cancelButton()->click();
    EXPECT_EQ(root.presentedViewController(), nullptr);
    ASSERT_TRUE(waitUntil([&] { return completion.calls > 0; }));
    sheet.cancel();   // a second cancel does nothing
    QApplication::processEvents();
    EXPECT_EQ(completion.calls, 1);
    EXPECT_EQ(completion.type, QString());
    EXPECT_FALSE(completion.completed);
    EXPECT_FALSE(completion.error.has_value());
    EXPECT_EQ(custom.m_prepared, 0);
}

TEST_F(ShareSheetFixture, ClosingTheWindowCountsAsCancel)
{
    ShareSheet sheet(items(), {});
    watch(sheet);
    root.presentViewController(&sheet, false);
    root.presentationWindow()->close();
    ASSERT_TRUE(waitUntil([&] { return completion.calls > 0; }));
    QApplication::processEvents();
    EXPECT_EQ(completion.calls, 1);
    EXPECT_EQ(completion.type, QString());
    EXPECT_FALSE(completion.completed);
}

TEST_F(ShareSheetFixture, ApplicationActivityControllerIsPresentedThenFinishes)
{
    ViewController form;
    form.view()->resize(300, 200);
    CustomActivity custom(QStringLiteral("org.example.Publish"), true, &form);
    ShareSheet sheet(items(), {&custom});
    watch(sheet);
    root.presentViewController(&sheet, true);

    sheet.buttonForActivityType(QStringLiteral("org.example.Publish"))->click();
    ASSERT_TRUE(waitUntil([&] { return root.presentedViewController() == &form; }));
    EXPECT_EQ(custom.m_prepared, 1);
    EXPECT_EQ(custom.m_performed, 0);
    EXPECT_EQ(custom.activityItems(), items());
    EXPECT_EQ(completion.calls, 0);

    custom.activityDidFinish(true);
    EXPECT_EQ(root.presentedViewController(), nullptr);
    ASSERT_TRUE(waitUntil([&] { return completion.calls > 0; }));
    custom.activityDidFinish(false);   // ignored: the activity has ended
    QApplication::processEvents();
    EXPECT_EQ(completion.calls, 1);
    EXPECT_EQ(completion.type, QStringLiteral("org.example.Publish"));
    EXPECT_TRUE(completion.completed);
    EXPECT_FALSE(completion.error.has_value());
}

TEST_F(ShareSheetFixture, ActivityWithoutControllerIsPerformedAndReportsItsError)
{
    CustomActivity custom(QStringLiteral("org.example.Quick"), true);
    ShareSheet sheet(items(), {&custom});
    watch(sheet);
    root.presentViewController(&sheet, false);
    sheet.chooseActivity(&custom);
    EXPECT_EQ(root.presentedViewController(), nullptr);
    ASSERT_TRUE(waitUntil([&] { return custom.m_performed == 1; }));
    custom.setActivityError(Error{QStringLiteral("org.example"), 7, QStringLiteral("refused")});
    custom.activityDidFinish(false);
    ASSERT_TRUE(waitUntil([&] { return completion.calls > 0; }));
    EXPECT_EQ(completion.type, QStringLiteral("org.example.Quick"));
    EXPECT_FALSE(completion.completed);
    ASSERT_TRUE(completion.error.has_value());
    EXPECT_EQ(completion.error->code, 7);
}

TEST_F(ShareSheetFixture, ActivityDestroyedBeforeFinishingEndsTheRun)
{
    ViewController form;
    auto *custom = new CustomActivity(QStringLiteral("org.example.Fragile"), true, &form);
    ShareSheet sheet(items(), {custom});
    watch(sheet);
    root.presentViewController(&sheet, false);
    sheet.chooseActivity(custom);
    ASSERT_TRUE(waitUntil([&] { return root.presentedViewController() == &form; }));
    delete custom;
    EXPECT_EQ(root.presentedViewController(), nullptr);
    ASSERT_TRUE(waitUntil([&] { return completion.calls > 0; }));
    EXPECT_EQ(completion.type, QStringLiteral("org.example.Fragile"));
    EXPECT_FALSE(completion.completed);
    EXPECT_TRUE(completion.error.has_value());
}

TEST_F(ShareSheetFixture, PopoverIsAnchoredAtTheSourceItem)
{
    auto *anchor = new QPushButton(QStringLiteral("Share"), root.view());
    anchor->setGeometry(200, 20, 60, 30);
    anchor->show();
    BarButtonItem item(anchor);
    ShareSheet sheet(items(), {});
    sheet.setPopoverSourceItem(&item);
    root.presentViewController(&sheet, false);
    QWidget *window = root.presentationWindow();
    ASSERT_NE(window, nullptr);
    EXPECT_TRUE(window->windowFlags().testFlag(Qt::Popup));
    EXPECT_TRUE(window->isVisible());
    const QRect anchorRect(anchor->mapToGlobal(QPoint(0, 0)), anchor->size());
    const QRect popup = window->frameGeometry();
    // Right below or right above the anchor, overlapping it horizontally.
    const bool below = popup.top() >= anchorRect.bottom() && popup.top() - anchorRect.bottom() <= 8;
    const bool above = popup.bottom() <= anchorRect.top() && anchorRect.top() - popup.bottom() <= 8;
    EXPECT_TRUE(below || above) << popup.top() << " " << popup.bottom() << " " << anchorRect.top();
    EXPECT_TRUE(popup.left() <= anchorRect.right() && popup.right() >= anchorRect.left());

    // Without a source item the sheet stays a centred dialog.
    root.dismissViewController(false);
    ShareSheet plain(items(), {});
    root.presentViewController(&plain, false);
    EXPECT_FALSE(root.presentationWindow()->windowFlags().testFlag(Qt::Popup));
}

TEST_F(ShareSheetFixture, CopyButtonPutsTheFileOnTheClipboard)
{
    ShareSheet sheet(items(), {});
    watch(sheet);
    root.presentViewController(&sheet, false);
    QApplication::clipboard()->clear();
    sheet.buttonForActivityType(QString::fromLatin1(kActivityTypeCopyToPasteboard))->click();
    ASSERT_TRUE(waitUntil([&] { return completion.calls > 0; }));
    EXPECT_EQ(completion.type, QString::fromLatin1(kActivityTypeCopyToPasteboard));
    EXPECT_TRUE(completion.completed);
    const QMimeData *data = QApplication::clipboard()->mimeData();
    ASSERT_NE(data, nullptr);
    EXPECT_EQ(data->urls(), QList<QUrl>{QUrl::fromLocalFile(movie)});
    EXPECT_TRUE(data->hasFormat(QStringLiteral("text/uri-list")));
    EXPECT_EQ(data->text(), QStringLiteral("Look at this\n") + QUrl::fromLocalFile(movie).toString());
}

} // namespace
} // namespace zaf::ui
