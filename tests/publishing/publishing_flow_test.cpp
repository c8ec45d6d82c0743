// The YouTube action's publishing flow with the built plug-in and the loopback upload server.
#include "identity/framework_strings.h"
#include "platform/media/export_session.h"
#include "platform/text/object_format.h"
#include "platform/ui/view_controller.h"
#include "publishing/publishing_agent.h"
#include "publishing/youtube_activity.h"
#include "tests/publishing/agent_test_support.h"
#include "tests/publishing/upload_test_support.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/process_temp_directory.h"

#include <gtest/gtest.h>

#include <QAbstractButton>
#include <QFileInfo>
#include <QMessageBox>
#include <QPushButton>

#include <algorithm>
#include <memory>

namespace zaf::test {
namespace {

class FlowEnvironment : public ::testing::Environment {
public:
    void SetUp() override
    {
        usePrivateTempDirectoryForProcess();
        qputenv("ZAF_PUBLISHING_PLUGIN_PATH", ZAF_PUBLISHING_PLUGIN_PATH);
        qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", ZAF_SHIPPED_PHOTO_LIBRARY_BUNDLE);
    }
};
const auto *const g_environment = ::testing::AddGlobalTestEnvironment(new FlowEnvironment);

QString tableText(const char *key)
{
    const QString text = ZafLocalizedFrameworkString(QLatin1String(key)).value_or(QString());
    EXPECT_FALSE(text.isEmpty() || text == QLatin1String(key)) << "no table has " << key;
    return text;
}

template <typename Buttons>
QAbstractButton *buttonWithText(const Buttons &buttons, const QString &text)
{
    const auto it = std::find_if(buttons.begin(), buttons.end(), [&](QAbstractButton *b) { return b->text() == text; });
    return it == buttons.end() ? nullptr : *it;
}

// A visible Cancel button in `view` that nothing covers (the topmost widget at its centre), or null.
QAbstractButton *uncoveredCancel(QWidget *view)
{
    for (QAbstractButton *button : view->findChildren<QAbstractButton *>()) {
        if (!button->isVisible() || button->text().remove(QLatin1Char('&')) != QLatin1String("Cancel"))
            continue;
        QWidget *top = view->childAt(button->mapTo(view, button->rect().center()));
        if (top == button || button->isAncestorOf(top))
            return button;
    }
    return nullptr;
}

// An activity prepared with the editor's usual items for a fresh fixture movie, its form presented.
// At the end it waits for the copy's export and removes the copy: copies of one second share a name.
struct PreparedActivity {
    ScratchDir scratch;
    std::unique_ptr<ZafYouTubeActivity> activity = std::make_unique<ZafYouTubeActivity>();
    QList<bool> finishes;
    ui::ViewController *navigation = nullptr;
    QObject *form = nullptr;
    QString movie;       // the editor's movie, which the action copies
    QByteArray recorded; // its digest before the action

    PreparedActivity()
    {
        fixture::FixtureSpec spec;
        spec.seconds = 4;
        spec.audioTracks = 2;
        movie = makeFixtureMovie(scratch.path(), spec);
        EXPECT_FALSE(movie.isEmpty());
        recorded = fileDigest(movie);
        QObject::connect(activity.get(), &ui::ShareActivity::activityFinished,
                         [this](bool completed) { finishes << completed; });
        activity->prepareWithActivityItems({QStringLiteral("Watch my run"), QStringLiteral("https://store.example/app"),
                                            QUrl::fromLocalFile(movie)});
        navigation = activity->activityViewController();
        form = formOf(activity->publishingAgent().get());
    }
    ~PreparedActivity()
    {
        waitForExport();
        QFile::remove(copyPath());
    }

    // Waits for the probe of the movie, then for the copy's export.
    bool waitForExport() const
    {
        return waitUntil([&] {
            const auto session = activity->exportSession();
            const media::ExportStatus status = session ? session->status() : media::ExportStatus::Unknown;
            return !activity->isProbingMovie() && session
                && (status == media::ExportStatus::Completed || status == media::ExportStatus::Failed
                    || status == media::ExportStatus::Cancelled);
        });
    }
    QString copyPath() const { return activity->movieURL().toLocalFile(); }
    QAbstractButton *publishButton() const
    {
        return buttonWithText(navigation->view()->findChildren<QPushButton *>(), QStringLiteral("Publish"));
    }
};

// The form of the editor's agent starts with the composed description and the activity's category
// "20", shown by its label in the category cell (its routine running for every form: the plug-in tests).
TEST(PublishingFlow, TheFormStartsWithTheDescriptionAndCategory20)
{
    PreparedActivity prepared;
    ASSERT_NE(prepared.form, nullptr);
    ASSERT_NE(prepared.activity->publishingAgent(), nullptr);
    EXPECT_EQ(prepared.activity->publishingAgent()->navigationController(), prepared.navigation);
    EXPECT_EQ(invokeForString(prepared.form, "description"), QStringLiteral("Watch my run https://store.example/app"));
    EXPECT_EQ(invokeForString(prepared.form, "categoryId"), QStringLiteral("20"));
    EXPECT_EQ(invokeForString(invokeForObject(prepared.form, kZafFormCategoryCellMethod), "categoryString"), QStringLiteral("Gaming"));
}

// Publish, pressed while the movie is still probed, waits for the copy under the overlay, uploads it
// with the form's normalised fields, reports progress to the total, shows the success alert with its
// View and Close buttons, removes the copy, and Close ends the action as completed. The editor's
// movie is left as it was. (Faults during the upload: the upload tests.)
TEST(PublishingFlow, PublishingTheCopySucceedsWithTheWholeCopy)
{
    UploadTestServer server(200, std::chrono::seconds(90));
    ASSERT_TRUE(server.listen());
    ScopedUploadEnvironment environment(server.baseUrl());

    PreparedActivity prepared;
    ZafPublishingAgent *agent = prepared.activity->publishingAgent().get();
    ASSERT_NE(agent, nullptr);
    QMetaObject::invokeMethod(prepared.form, "setTitle", Q_ARG(QString, QStringLiteral("Speedrun <final>")));
    QMetaObject::invokeMethod(prepared.form, "setPrivacyStatus", Q_ARG(QString, QStringLiteral("Unlisted")));
    QByteArray uploadedCopy; // read while the upload runs: the copy is removed at its end
    std::pair<qint64, qint64> lastProgress{-1, -1};
    QObject::connect(agent, &ZafPublishingAgent::uploadProgress, [&](qint64 sent, qint64 total) {
        lastProgress = {sent, total};
        QFile copy(prepared.copyPath());
        if (uploadedCopy.isEmpty() && copy.open(QIODevice::ReadOnly))
            uploadedCopy = copy.readAll();
    });
    QAbstractButton *publish = prepared.publishButton();
    ASSERT_NE(publish, nullptr);
    ASSERT_TRUE(prepared.activity->isProbingMovie()) << "its answer needs the event loop";
    publish->click();
    EXPECT_TRUE(prepared.activity->isWaitingForExport());
    ASSERT_NE(prepared.activity->progressOverlay(), nullptr);

    ASSERT_TRUE(waitUntil([&] { return prepared.activity->resultAlert() != nullptr; }));
    ASSERT_NE(prepared.activity->exportSession(), nullptr);
    EXPECT_EQ(prepared.activity->exportSession()->status(), media::ExportStatus::Completed);
    ASSERT_NE(prepared.activity->progressOverlay(), nullptr);
    EXPECT_EQ(prepared.activity->progressOverlay()->parentWidget(), prepared.navigation->view());

    QMessageBox *alert = prepared.activity->resultAlert();
    EXPECT_EQ(alert->text(), tableText("PUBLISHED_VIDEO"));
    const QString viewTitle = text::formatWithObjects(tableText("VIEW_BUTTON_TITLE_FORMAT"), {QStringLiteral("YouTube")});
    EXPECT_TRUE(viewTitle.contains(QLatin1String("YouTube")));
    EXPECT_EQ(alert->buttons().size(), 2);
    EXPECT_NE(buttonWithText(alert->buttons(), viewTitle), nullptr);

    const QString watchPrefix = QStringLiteral("https://www.youtube.com/watch?v=");
    ASSERT_TRUE(agent->mediaURL().startsWith(watchPrefix));
    ASSERT_FALSE(uploadedCopy.isEmpty());
    EXPECT_EQ(server.videoBytes(agent->mediaURL().mid(watchPrefix.size())), uploadedCopy);
    EXPECT_EQ(lastProgress, std::make_pair(qint64(uploadedCopy.size()), qint64(uploadedCopy.size())));
    ASSERT_EQ(server.initiationBodies().size(), 1);
    const QByteArray body = server.initiationBodies().first();
    for (const char *field : {"\"categoryId\":\"20\"", "\"privacyStatus\":\"unlisted\"", "\"title\":\"Speedrun final\""})
        EXPECT_TRUE(body.contains(field)) << body.toStdString();

    EXPECT_TRUE(waitUntil([&] { return !QFileInfo::exists(prepared.copyPath()); }));
    EXPECT_EQ(fileDigest(prepared.movie), prepared.recorded);
    EXPECT_TRUE(prepared.finishes.isEmpty());
    QAbstractButton *close = buttonWithText(alert->buttons(), tableText("CLOSE"));
    ASSERT_NE(close, nullptr);
    close->click();
    EXPECT_EQ(prepared.finishes, QList<bool>{true});
}

// Publishing refused by the service (a 400 for category "20") ends with the failure alert (Close
// only) and removes the copy; Close ends the action as not completed. (Any error of the agent, a
// sign-in past its limit too, ends publishing alike: the plug-in tests.)
TEST(PublishingFlow, FailedPublishingEndsWithTheFailureAlert)
{
    UploadTestServer server(50, std::chrono::seconds(90));
    ASSERT_TRUE(server.listen());
    server.setAcceptedCategories({QStringLiteral("22")});
    ScopedUploadEnvironment environment(server.baseUrl());

    PreparedActivity prepared;
    ASSERT_TRUE(prepared.waitForExport());
    prepared.publishButton()->click();
    ASSERT_TRUE(waitUntil([&] { return prepared.activity->resultAlert() != nullptr; }, 10000));
    QMessageBox *alert = prepared.activity->resultAlert();
    EXPECT_EQ(alert->text(), tableText("FAILED_PUBLISH_VIDEO"));
    ASSERT_EQ(alert->buttons().size(), 1);
    EXPECT_EQ(alert->buttons().first()->text(), tableText("CLOSE"));
    EXPECT_EQ(server.count(QStringLiteral("PUT")), 0);
    EXPECT_TRUE(waitUntil([&] { return !QFileInfo::exists(prepared.copyPath()); }));
    alert->buttons().first()->click();
    EXPECT_EQ(prepared.finishes, QList<bool>{false});
}

// The overlay covers the form and its Cancel, yet a Cancel stays on top while the upload runs: it
// ends the action as not completed, without an alert, and removes the copy, as the form's Cancel
// does (which reaches the activity: the plug-in tests, also for a Cancel during the sign-in).
TEST(PublishingFlow, ACancelStaysReachableOverTheOverlay)
{
    UploadTestServer server(50, std::chrono::seconds(90));
    ASSERT_TRUE(server.listen());
    server.setResponseDelay(std::chrono::seconds(60)); // the upload is still running at the Cancel
    ScopedUploadEnvironment environment(server.baseUrl());

    PreparedActivity prepared;
    ASSERT_TRUE(prepared.waitForExport());
    QWidget *view = prepared.navigation->view();
    view->resize(420, 640);
    view->show();
    prepared.publishButton()->click();
    ASSERT_TRUE(waitUntil([&] { return !server.requests().isEmpty(); }, 10000));
    ASSERT_NE(prepared.activity->progressOverlay(), nullptr);
    waitUntil([] { return false; }, 300); // the overlay's fade-in is over

    QAbstractButton *cancel = uncoveredCancel(view);
    ASSERT_NE(cancel, nullptr) << "every Cancel is under the overlay";
    cancel->click();
    EXPECT_EQ(prepared.finishes, QList<bool>{false});
    EXPECT_TRUE(waitUntil([&] { return !QFileInfo::exists(prepared.copyPath()); }));
    waitUntil([] { return false; }, 200);
    EXPECT_EQ(prepared.activity->resultAlert(), nullptr);
    EXPECT_EQ(prepared.finishes, QList<bool>{false});
    view->hide();
}

} // namespace
} // namespace zaf::test
